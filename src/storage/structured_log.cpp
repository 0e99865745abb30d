// The lists, little-endian. Band statistics, for the validity list:
//    0       u32       N: number of entries
//    4       u32       M: number of words
//    8       M x u64   not used
//    8 + 8M  N x 20    entries: u32 not used, u32 list index, u32 value, two u32 not used
// Defects:
//    0       u32       not used
//    4       u32       factory count
//    8       u32       number of records
//   12       28 each   records: u16 bus, u16 chip enable, then u32 CAU, block, cycle, reason and
//                      page, then i8 temperature and three bytes that are not used
#include "storage/structured_log.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <functional>
#include <memory>
#include <new>
#include <string>
#include <vector>

#include "platform/names.h"
#include "storage/exporters.h"
#include "storage/nand_info.h"
#include "storage/statistics_parser.h"
#include "storage/status_log.h"
#include "storage/telemetry.h"
#include "values/byte_reader.h"
#include "values/digits.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr std::int32_t kStructuredLogType = 176;
constexpr float kDefaultThreshold = 2.0F;
constexpr float kThresholdLimit = 10.0F;

constexpr char kNoDictionaryMessage[] = "failed to create dictionary";
constexpr char kNotParsedMessage[] = "data cannot be parsed";

// ---- Write amplification.

// Single precision, as the threshold is.
struct WriteAmplification {
  float user = 0;
  float intermediate = 0;
};

WriteAmplification AmplificationFrom(const FSPParseContext& context) {
  constexpr int kPage = 12;  // 4 KiB
  constexpr StatisticsSlot kSlcPages = StatisticsSlotOf("pagesPerVirtualBlockSlc");
  constexpr StatisticsSlot kSlcErases = StatisticsSlotOf("intermediateBandErases");
  const auto hostWrites = static_cast<double>(context.hostWrites);
  const std::uint32_t blockSize = (context.pagesPerVirtualBlock * context.bytesPerPage) >> kPage;
  WriteAmplification ratios;
  ratios.user =
      static_cast<float>(static_cast<double>(context.bandErases) * blockSize / hostWrites);

  std::uint64_t intermediateSize = 0;
  std::uint64_t intermediateErases = 0;
  for (const auto& [slot, value] : context.pairs) {
    if (slot == kSlcPages) intermediateSize = (value * context.bytesPerPage) >> kPage;
    if (slot == kSlcErases) intermediateErases = value;
  }
  if (intermediateSize != 0 && intermediateErases != 0) {
    ratios.intermediate = static_cast<float>(static_cast<double>(intermediateSize) *
                                             static_cast<double>(intermediateErases) / hostWrites);
  }
  return ratios;
}

bool ExceedsThreshold(Preferences& preferences, float userRatio) {
  const auto preference = preferences.CopyPreferenceValue("userWAmp", "nuvex.NANDInfo");
  const Number* number = preference ? preference->asNumber() : nullptr;
  if (number != nullptr && number->isReal()) {
    const auto threshold = static_cast<float>(number->toDouble());
    if (threshold > 0 && threshold < kThresholdLimit) return userRatio > threshold;
  }
  return userRatio > kDefaultThreshold;
}

void DecideOnValidityList(Platform& platform, StorageLogState& state) {
  state.gCurrentUserWamp = 0;
  state.gCurrentSysWamp = 0;
  state.gNeedValidityList = state.gForceCollectionSet;
  const std::unique_ptr<FSPParseContext> context(new (std::nothrow) FSPParseContext);
  if (!context) {
    platform.standardError.write("not enough memory?");
    return;
  }
  const StorageExporter* row = nullptr;
  WriteAmplification ratios;
  if (FetchAndParseStats(platform, row, *context)) ratios = AmplificationFrom(*context);
  if (row != nullptr && row->releaseContext != nullptr) row->releaseContext(*context);
  state.gCurrentUserWamp = static_cast<double>(ratios.user);
  state.gCurrentSysWamp = static_cast<double>(ratios.intermediate);
  if (ExceedsThreshold(platform.preferences, ratios.user)) state.gNeedValidityList = true;
}

// ---- Collection of the lists.

struct List {
  StorageExporter::SelectorGetter getSelectors = nullptr;
  std::uint8_t index = 0;
  // `written`: how many bytes of the buffer the driver filled; the others are zero.
  std::function<bool(std::span<const std::byte> buffer, std::size_t written)> handler;
};

constexpr std::uint8_t kTelemetryLists = 3;
constexpr std::size_t kMostLists = 5;

std::vector<List> ListsOf(Platform& platform, const StorageLogState& state,
                          const StorageExporter& row, const PropertyValue& characteristics) {
  std::vector<List> lists;
  if (row.getBandStatsSelectors != nullptr) {
    lists.push_back(
        {row.getBandStatsSelectors, 0, [&](std::span<const std::byte> buffer, std::size_t) {
           return LogValidityList(platform, state, buffer);
         }});
  } else {
    platform.standardError.write("Validity list retrieval is not supported\n");
  }
  if (row.getTelemetryListSelectors != nullptr) {
    for (std::uint8_t index = 0; index < kTelemetryLists; ++index) {
      lists.push_back({row.getTelemetryListSelectors, index,
                       [&](std::span<const std::byte> buffer, std::size_t) {
                         return LogTelemetryList(platform.crashSupport, platform.standardError,
                                                 buffer, characteristics);
                       }});
    }
  } else {
    platform.standardError.write("Telemetry list retrieval is not supported\n");
  }
  if (row.getDefectsListSelectors != nullptr) {
    lists.push_back({row.getDefectsListSelectors, 0,
                     [&](std::span<const std::byte> buffer, std::size_t written) {
                       return LogDefectsList(platform, buffer, written);
                     }});
  } else {
    platform.standardError.write("Defects list retrieval is not supported\n");
  }
  return lists;
}

// Fetches one list, the `position`-th, and hands it to its handler.
bool CollectList(StandardError& errors, ExporterConnection& exporter, const List& list,
                 std::size_t position, bool requestFlag) {
  const SelectorPair* selectors = list.getSelectors();
  if (selectors == nullptr) return false;
  const std::uint16_t flags = ExportFlags(requestFlag, list.index);
  std::uint32_t size = 0;
  const KernelReturn status = exporter.querySize(selectors, flags, size);
  if (status != kKernelSuccess) {
    errors.write(FormatText("CallDriverStruct failed with status 0x%s on selector index %d\n",
                            HexNumber(status), position));
    return true;
  }
  if (size == 0) return true;
  const auto buffer = ExportBuffer::Allocate(size);
  if (!buffer) {
    errors.write(FormatText("Could not malloc %u bytes", size));
    return false;
  }
  std::size_t written = 0;
  if (exporter.fetch(selectors, flags, buffer->bytes(), written) != kKernelSuccess) {
    errors.write(
        FormatText("Could not retrieve data from driver for selector %u\n", selectors->fetch));
    return true;
  }
  return list.handler(buffer->bytes(), written);
}

bool CollectLists(Platform& platform, const StorageLogState& state, bool requestFlag) {
  StandardError& errors = platform.standardError;
  const StorageExporter* row = nullptr;
  const RegistryHandle service = findNandExporter(platform.driverRegistry, row);
  if (service == 0) {
    errors.write(kNoExporterMessage);
    return false;
  }
  ExporterConnection exporter(platform, service, *row);
  if (!exporter) return false;
  const auto characteristics =
      platform.driverRegistry.SearchEntryProperty(service, row->characteristicsKey);
  if (!characteristics) {
    errors.write(kNoDictionaryMessage);
    return false;
  }
  const std::vector<List> lists = ListsOf(platform, state, *row, *characteristics);
  if (lists.size() > kMostLists) {
    errors.write("Increase the size of the selectorFunctions Array");
    return false;
  }
  bool result = true;
  for (std::size_t i = 0; i < lists.size(); ++i) {
    if (!CollectList(errors, exporter, lists[i], i, requestFlag)) result = false;
  }
  return result;
}

Dictionary DefectEntry(StandardError& errors, ByteReader& reader) {
  struct Field {
    const char* key;
    std::uint32_t value;
  };
  const auto bus = reader.little<std::uint16_t>();
  const auto chipEnable = reader.little<std::uint16_t>();
  const Field fields[] = {{"Bus", bus},
                          {"CE", chipEnable},
                          {"CAU", reader.little<std::uint32_t>()},
                          {"Block", reader.little<std::uint32_t>()},
                          {"Cycle", reader.little<std::uint32_t>()},
                          {"Reason", reader.little<std::uint32_t>()},
                          {"Page", reader.little<std::uint32_t>()}};
  const auto temperature = static_cast<std::int8_t>(reader.little<std::uint32_t>() & 0xFF);
  Dictionary entry;
  for (const Field& field : fields) {
    SetNumberValue(errors, entry, field.key, static_cast<std::int32_t>(field.value));
  }
  SetNumberValue(errors, entry, "Temperature", temperature);
  return entry;
}

}  // namespace

bool DumpStorageStructuredLog(Platform& platform, StorageLogState& state, bool requestFlag) {
  DecideOnValidityList(platform, state);
  return CollectLists(platform, state, requestFlag);
}

bool LogValidityList(Platform& platform, const StorageLogState& state,
                     std::span<const std::byte> buffer) {
  constexpr std::size_t kEntrySize = 20;
  constexpr std::size_t kLists = 16;
  if (!state.gNeedValidityList) return true;
  ByteReader reader(buffer);
  const std::uint64_t entries = reader.little<std::uint32_t>();
  const std::uint64_t words = reader.little<std::uint32_t>();
  // 64 bits hold the largest sum that two 32-bit counts make.
  if (entries == 0 || 8 + 8 * words + kEntrySize * entries > buffer.size()) {
    platform.standardError.write(kNotParsedMessage);
    return false;
  }
  Dictionary values;
  SetNumberValue(platform.standardError, values, "IntermediateWamp", state.gCurrentSysWamp);
  SetNumberValue(platform.standardError, values, "UserWamp", state.gCurrentUserWamp);
  DumpNANDInfo(platform, values);

  std::array<Array, kLists> lists;
  reader.skip(static_cast<std::size_t>(8 * words));
  for (std::uint64_t i = 0; i < entries; ++i) {
    ByteReader entry(reader.take(kEntrySize));
    entry.skip(4);
    const auto list = entry.little<std::uint32_t>();
    const auto value = static_cast<std::int32_t>(entry.little<std::uint32_t>());
    if (list < kLists) lists[list].push_back(Int32(value));
  }
  for (std::size_t i = 0; i < kLists; ++i) {
    if (!lists[i].empty()) values[FormatText("ValidityList[%d]", i)] = lists[i];
  }
  NLW_WriteLog(platform, kStatusLogType, &values);
  return true;
}

bool LogDefectsList(Platform& platform, std::span<const std::byte> buffer, std::size_t written) {
  constexpr std::size_t kHeaderSize = 12;
  constexpr std::size_t kRecordSize = 28;
  constexpr std::size_t kMostRecords = 16384;  // many times what a drive that still works has
  StandardError& errors = platform.standardError;
  ByteReader reader(buffer);
  reader.skip(4);
  const auto factoryCount = static_cast<std::int32_t>(reader.little<std::uint32_t>());
  if (!reader.ok()) {
    errors.write(kNotParsedMessage);
    return false;
  }
  // 0 when the list ends before it.
  const std::size_t claimed = reader.little<std::uint32_t>();
  const std::size_t filled = std::min(written, buffer.size());
  const std::size_t present =
      std::min(claimed, (std::max(filled, kHeaderSize) - kHeaderSize) / kRecordSize);
  const std::size_t logged = std::min(present, kMostRecords);
  if (logged < present) {
    platform.log.error("The driver lists %u defects; the first %u are logged", present, logged);
  }
  std::vector<Dictionary> entries(1);
  SetNumberValue(errors, entries.front(), "Factory Count", factoryCount);
  for (std::size_t i = 0; i < logged; ++i) entries.push_back(DefectEntry(errors, reader));
  platform.crashSupport.logEntries(kStructuredLogType, entries);
  return true;
}

}  // namespace quorlet
