#include "storage/nand_info.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdio>

#include "storage/exporters.h"
#include "storage/nand_key_map.h"

namespace quorlet {
namespace {

// Exports before this version hold the first counters only.
constexpr std::uint32_t kFirstFullVersion = 0x20002;
constexpr std::uint64_t kStartOf2000 = 946684800;  // seconds since 1970
constexpr std::uint64_t kSecondsPerWeek = 604800;
constexpr std::uint64_t kNotSeen = 0xFFFFFFFF;  // of a partition start

// What becomes of a counter.
enum class Rule : std::uint8_t {
  kRename,  // stored under its key, if it has one
  kRenameRounded,
  kUserStart,
  kIntermediateStart,
  kMaintenanceRequests,
  kFailedRead,
  kFailedProg,
  kFailedErase,
};

// By slot.
constexpr auto kRules = [] {
  std::array<Rule, kStatisticsSlots> rules{};
  rules[StatisticsSlotOf("maxMemLowDuration")] = Rule::kRenameRounded;
  rules[StatisticsSlotOf("maxMemChokeDuration")] = Rule::kRenameRounded;
  rules[StatisticsSlotOf("userPartitionStart")] = Rule::kUserStart;
  rules[StatisticsSlotOf("intermediatePartitionStart")] = Rule::kIntermediateStart;
  rules[StatisticsSlotOf("numBootBlockRefreshSuccess0")] = Rule::kMaintenanceRequests;
  rules[StatisticsSlotOf("numBootBlockRefreshFail0")] = Rule::kMaintenanceRequests;
  for (std::size_t i = 0; i < 3; ++i) {
    rules[StatisticsSlotOf("mspBootBlockReadFail0") + i] = Rule::kFailedRead;
    rules[StatisticsSlotOf("mspBootBlockProgFail0") + i] = Rule::kFailedProg;
    rules[StatisticsSlotOf("mspBootBlockEraseFail0") + i] = Rule::kFailedErase;
  }
  return rules;
}();

// The low 32 bits, with three significant digits.
constexpr std::uint32_t RoundedPeak(std::uint64_t value) {
  const auto number = static_cast<std::uint32_t>(value);
  std::uint32_t unit = 1;
  while (number / unit >= 1000) unit *= 10;
  const bool isUp = unit > 1 && number % unit >= unit / 2;
  return (number / unit + (isUp ? 1 : 0)) * unit;
}

std::uint64_t WeeksSince2000(std::uint64_t time) {
  return time > kStartOf2000 ? (time - kStartOf2000) / kSecondsPerWeek : 0;
}

class DictionaryBuilder {
 public:
  explicit DictionaryBuilder(Platform& platform) : platform_(platform) {}

  void addVersions(const FSPParseContext& context) {
    set32(kNANDInfoExportVersionKey, context.exportVersion);
    set32(kNANDInfoDriverVersionKey, context.driverVersion);
    bool found = false;
    const bool isDemo =
        platform_.preferences.GetPreferenceBool("StoreDemoMode", "nuvex.demo-settings", found);
    set64(kNANDInfoDemoModeKey, isDemo ? 1 : 0);
  }

  void addTraffic(const FSPParseContext& context) {
    set32(kNANDInfoNumVirtualBlocksKey, context.numVirtualBlocks);
    set32(kNANDInfoPagesPerVirtualBlockKey, context.pagesPerVirtualBlock);
    set32(kNANDInfoBytesPerPageKey, context.bytesPerPage);
    set64(kNANDInfoNumLogicalReadsKey, context.hostReads);
    set64(kNANDInfoNumLogicalWritesKey, context.hostWrites);
    set64(kNANDInfoNumFreeVirtualBlocksKey, context.numFreeVirtualBlocks);
    set64(kNANDInfoNumWearLevelOpsKey, context.wearLevMoves);
    set64(kNANDInfoNumPhysicalReadsKey, context.nandReads);
    set64(kNANDInfoNumPhysicalWritesKey, context.nandWrites);
    set64(kNANDInfoNumPhysicalErasesKey, context.bandErases);
    set64(kNANDInfoNumNodesFreeKey, context.IND_pool_free);
    set64(kNANDInfoNumNodesTotalKey, context.IND_pool_count);
  }

  void addEndurance(const FSPParseContext& context) {
    set64(kNANDInfoFormatWeeksSince2000Key, WeeksSince2000(context.utilFormatTime));
    set64(kNANDInfoNumSleepOpsKey, context.numSleepOps);
    set64(kNANDInfoHighEnduranceBlockEraseCountKey, context.maxHighEnduranceBlockErases);
    set32(kNANDInfoBlocksPerVirtualBlock, context.blocksPerVirtualBlock);
    for (std::size_t i = 0; i < kNANDInfoReadsBeforeErasureKeys.size(); ++i) {
      set64(kNANDInfoReadsBeforeErasureKeys[i], context.readCountHisto[i]);
    }
  }

  void addCounters(const FSPParseContext& context) {
    for (const StatisticsPair& pair : context.pairs) addCounter(pair);
    if (userStart_ != kNotSeen && intermediateStart_ != kNotSeen) {
      set64(kNANDInfoIntermediatePartitionSizeKey, userStart_ - intermediateStart_);
    }
    set64(kNANDInfoNumMaintenanceRequestsKey, maintenanceRequests_);
    set64(kNANDInfoMaintenanceFailedReadKey, failedReads_);
    set64(kNANDInfoMaintenanceFailedProgKey, failedProgs_);
    set64(kNANDInfoMaintenanceFailedEraseKey, failedErases_);
  }

  Dictionary dictionary() const { return dictionary_; }

 private:
  // Counters are stored with their bits, as the signed numbers of the dictionary.
  void set32(std::string_view key, std::uint32_t value) {
    SetNumberValue(platform_.standardError, dictionary_, key, static_cast<std::int32_t>(value));
  }
  void set64(std::string_view key, std::uint64_t value) {
    SetNumberValue(platform_.standardError, dictionary_, key, static_cast<std::int64_t>(value));
  }

  void addCounter(const StatisticsPair& pair) {
    const std::uint64_t failures = pair.value != 0 ? 1 : 0;
    switch (kRules[pair.slot]) {
      case Rule::kRename:
        rename(pair.slot, pair.value);
        break;
      case Rule::kRenameRounded:
        rename(pair.slot, RoundedPeak(pair.value));
        break;
      case Rule::kUserStart:
        userStart_ = pair.value;
        break;
      case Rule::kIntermediateStart:
        intermediateStart_ = pair.value;
        break;
      case Rule::kMaintenanceRequests:
        maintenanceRequests_ += pair.value;
        break;
      case Rule::kFailedRead:
        failedReads_ += failures;
        break;
      case Rule::kFailedProg:
        failedProgs_ += failures;
        break;
      case Rule::kFailedErase:
        failedErases_ += failures;
        break;
    }
  }
  void rename(StatisticsSlot slot, std::uint64_t value) {
    const std::string_view key = NANDInfoKeyOf(slot);
    if (!key.empty()) set64(key, value);
  }

  Platform& platform_;
  Dictionary dictionary_;
  std::uint64_t userStart_ = kNotSeen;
  std::uint64_t intermediateStart_ = kNotSeen;
  std::uint64_t maintenanceRequests_ = 0;
  std::uint64_t failedReads_ = 0;
  std::uint64_t failedProgs_ = 0;
  std::uint64_t failedErases_ = 0;
};

Dictionary ErrorDictionary(std::string_view message) {
  return {{kNANDInfoErrorKey, "1"}, {kNANDInfoErrorMessageKey, message}};
}

// What the fixed entries of the dictionary are made of.
struct FixedEntry {
  std::string_view key;
  StatisticsSlot slot;
};
// clang-format off
constexpr auto kFixedEntries = std::to_array<FixedEntry>({
    {kNANDInfoNumVirtualBlocksKey, StatisticsSlotOf("numVirtualBlocks")},
    {kNANDInfoPagesPerVirtualBlockKey, StatisticsSlotOf("pagesPerVirtualBlock")},
    {kNANDInfoBytesPerPageKey, StatisticsSlotOf("bytesPerPage")},
    {kNANDInfoNumLogicalReadsKey, StatisticsSlotOf("hostReads")},
    {kNANDInfoNumLogicalWritesKey, StatisticsSlotOf("hostWrites")},
    {kNANDInfoNumFreeVirtualBlocksKey, StatisticsSlotOf("numFreeVirtualBlocks")},
    {kNANDInfoNumWearLevelOpsKey, StatisticsSlotOf("wearLevMoves")},
    {kNANDInfoNumPhysicalReadsKey, StatisticsSlotOf("nandReads")},
    {kNANDInfoNumPhysicalWritesKey, StatisticsSlotOf("nandWrites")},
    {kNANDInfoNumPhysicalErasesKey, StatisticsSlotOf("bandErases")},
    {kNANDInfoNumNodesFreeKey, StatisticsSlotOf("IND_pool_free")},
    {kNANDInfoNumNodesTotalKey, StatisticsSlotOf("IND_pool_count")},
    {kNANDInfoFormatWeeksSince2000Key, StatisticsSlotOf("utilFormatTime")},
    {kNANDInfoNumSleepOpsKey, StatisticsSlotOf("numSleepOps")},
    {kNANDInfoHighEnduranceBlockEraseCountKey, StatisticsSlotOf("maxHighEnduranceBlockErases")},
    {kNANDInfoBlocksPerVirtualBlock, StatisticsSlotOf("blocksPerVirtualBlock")},
    {kNANDInfoReadsBeforeErasureKeys[0], StatisticsSlotOf("readCountHisto0")},
    {kNANDInfoReadsBeforeErasureKeys[1], StatisticsSlotOf("readCountHisto1")},
    {kNANDInfoReadsBeforeErasureKeys[2], StatisticsSlotOf("readCountHisto2")},
    {kNANDInfoReadsBeforeErasureKeys[3], StatisticsSlotOf("readCountHisto3")},
    {kNANDInfoReadsBeforeErasureKeys[4], StatisticsSlotOf("readCountHisto4")},
    {kNANDInfoNumMaintenanceRequestsKey, StatisticsSlotOf("numBootBlockRefreshSuccess0")},
    {kNANDInfoMaintenanceFailedReadKey, StatisticsSlotOf("mspBootBlockReadFail0")},
    {kNANDInfoMaintenanceFailedProgKey, StatisticsSlotOf("mspBootBlockProgFail0")},
    {kNANDInfoMaintenanceFailedEraseKey, StatisticsSlotOf("mspBootBlockEraseFail0")},
});
// clang-format on

// Whether the driver that was asked leaves out of its export what it does not know.
bool TellsOnlyWhatItHas(Platform& platform) {
  const StorageExporter* row = nullptr;
  const RegistryHandle service = findNandExporter(platform.driverRegistry, row);
  const auto property = platform.driverRegistry.CopyEntryProperty(service, kTellsOnlyWhatItHas);
  platform.driverRegistry.ReleaseHandle(service);
  const bool* tells = property ? property->asBoolean() : nullptr;
  return tells != nullptr && *tells;
}

// Drops the zeros that stand for what the export does not say.
void DropUntold(const FSPParseContext& context, Dictionary& dictionary) {
  for (const FixedEntry& entry : kFixedEntries) {
    if (std::ranges::find(context.pairs, entry.slot, &StatisticsPair::slot) ==
        context.pairs.end()) {
      dictionary.remove(entry.key);
    }
  }
}

// The dictionary of the driver's export, or nothing when that cannot be read.
std::optional<Dictionary> FetchDictionary(Platform& platform, bool forMerge) {
  FSPParseContext context;
  const StorageExporter* row = nullptr;
  std::optional<Dictionary> dictionary;
  if (FetchAndParseStats(platform, row, context)) {
    dictionary = BuildNANDInfoDictionary(platform, context, forMerge);
    if (dictionary && TellsOnlyWhatItHas(platform)) DropUntold(context, *dictionary);
  }
  if (row->releaseContext != nullptr) row->releaseContext(context);
  return dictionary;
}

}  // namespace

std::optional<Dictionary> BuildNANDInfoDictionary(Platform& platform,
                                                  const FSPParseContext& context, bool forMerge) {
  if (context.exportVersion == 0) {
    if (forMerge) return std::nullopt;
    return ErrorDictionary("Unsupported export version");
  }
  DictionaryBuilder builder(platform);
  if (!forMerge) builder.addVersions(context);
  builder.addTraffic(context);
  if (context.exportVersion >= kFirstFullVersion) {
    builder.addEndurance(context);
    builder.addCounters(context);
  }
  return builder.dictionary();
}

Dictionary CopyNANDInfo(Platform& platform) {
  const auto dictionary = FetchDictionary(platform, false);
  return dictionary ? *dictionary : ErrorDictionary("Unable to parse buffer");
}

void DumpNANDInfo(Platform& platform, Dictionary& target) {
  const auto dictionary = FetchDictionary(platform, true);
  if (!dictionary) return;
  for (const auto& [key, value] : *dictionary) target[key] = value;
}

void internal::ReportNumberFailure(StandardError& standardError, const void* value) {
  // Without an allocation, as there is no memory left.
  char text[80];
  std::snprintf(text, sizeof text, "Failed to create PropNumber from value: %p", value);
  standardError.write(text);
}

}  // namespace quorlet
