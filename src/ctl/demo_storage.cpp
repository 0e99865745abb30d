#include <initializer_list>
#include <vector>

#include "ctl/demo_bytes.h"
#include "ctl/demo_drivers.h"
#include "platform/statistics_keys.h"
#include "platform/storage_exports.h"
#include "values/byte_writer.h"

namespace quorlet {
namespace {

constexpr std::int64_t kStorageId = 0x200;
constexpr std::uint64_t kChannels = 2;

struct Statistic {
  std::uint64_t key;
  std::vector<std::uint64_t> values;
};

// A drive of 128 GiB after a good year. Sectors are of 4 KiB, a virtual block holds 16,384 of them;
// the NAND has been written a little more than twice as much as the host wrote.
const std::vector<Statistic>& Statistics() {
  static const std::vector<Statistic> statistics = {
      {StatisticsIdOf("exportVersion"), {0x20005}},          // version of the export
      {StatisticsIdOf("numVirtualBlocks"), {2048}},          // virtual blocks
      {StatisticsIdOf("blocksPerVirtualBlock"), {16}},       // blocks of a virtual block
      {StatisticsIdOf("pagesPerVirtualBlock"), {4096}},      // pages of a virtual block
      {StatisticsIdOf("bytesPerPage"), {16'384}},            // bytes of a page
      {StatisticsIdOf("pagesPerVirtualBlockSlc"), {1365}},   // pages of a virtual block in SLC mode
      {StatisticsIdOf("hostWrites"), {600'412'331}},         // host writes, sectors
      {StatisticsIdOf("hostReads"), {1'904'118'020}},        // host reads
      {StatisticsIdOf("nandWrites"), {1'311'002'752}},       // NAND writes
      {StatisticsIdOf("nandReads"), {2'744'901'633}},        // NAND reads
      {StatisticsIdOf("bandErases"), {82'004}},              // erased bands
      {StatisticsIdOf("intermediateBandErases"), {60'731}},  // of the intermediate partition
      {StatisticsIdOf("numFreeVirtualBlocks"), {187}},       // free virtual blocks
      {StatisticsIdOf("wearLevMoves"), {412}},               // wear-level moves
      {StatisticsIdOf("IND_pool_free"), {90'112}},           // nodes free
      {StatisticsIdOf("IND_pool_count"), {131'072}},         // nodes in all
      {StatisticsIdOf("utilFormatTime"), {1'735'689'600}},   // formatted on 2025-01-01
      {StatisticsIdOf("numSleepOps"), {8120}},               // sleeps
      {StatisticsIdOf("maxHighEnduranceBlockErases"),
       {1466}},  // most erasures of a high-endurance block
      {StatisticsIdOf("readCountHisto"),
       {70'112, 8204, 310, 12, 1}},                          // bands by reads before erasure
      {StatisticsIdOf("intermediatePartitionStart"), {16}},  // start of the intermediate partition
      {StatisticsIdOf("userPartitionStart"), {144}},         // start of the user partition
      {StatisticsIdOf("gcWrites"), {402'118'772}},           // sectors moved by garbage collection
      {StatisticsIdOf("numFlushes"), {733'102}},             // flushes
      {StatisticsIdOf("numFences"), {12'881}},               // fences
      {StatisticsIdOf("uncleanBoots"), {4}},                 // unclean boots
      {StatisticsIdOf("staticSizeInMB"), {9216}},            // static data, MB
      {StatisticsIdOf("secsPerHostFlow"),
       {401'772'190, 120'331'804, 60'112'009, 18'196'328}},    // sectors by host flow
      {StatisticsIdOf("coldestCycle"), {31, 640}},             // fewest erasures, by partition
      {StatisticsIdOf("hottestCycle"), {52, 1466}},            // most erasures
      {StatisticsIdOf("numMemChoke"), {7}},                    // memory chokes
      {StatisticsIdOf("maxMemChokeDuration"), {12'345}},       // the longest one, us
      {StatisticsIdOf("memChokeDuration"), {40'877}},          // all of them, us
      {StatisticsIdOf("numBootBlockRefreshSuccess"), {2, 0}},  // boot-block refreshes
      {StatisticsIdOf("numBootBlockRefreshFail"), {1}},
      {StatisticsIdOf("mspBootBlockReadFail"), {0, 1, 0}},  // failed reads while refreshing
      {StatisticsIdOf("bandsMaxTempHisto"),
       {0, 0, 3, 40, 612, 901, 388, 90, 14}},  // bands by highest temperature
  };
  return statistics;
}

Data StatisticsExport() {
  ByteWriter records;
  for (const Statistic& statistic : Statistics()) {
    records.u32(statistic.key).u32(statistic.values.size());
    for (const std::uint64_t value : statistic.values) records.u64(value);
  }
  return records.data();
}

// Entries of list 0 (intermediate bands) and 1 (user bands): valid sectors of a band.
Data BandStatistics() {
  constexpr std::uint64_t kEntries = 16;
  constexpr std::uint64_t kUnusedWords = 2;
  ByteWriter list;
  list.u32(kEntries).u32(kUnusedWords).u64(0).u64(0);
  for (std::uint64_t i = 0; i < kEntries; ++i) {
    list.u32(i).u32(i / 4 == 0 ? 0 : 1).u32(16'384 - 977 * i).u32(0).u32(0);
  }
  return list.data();
}

// The first words of a channel's raw counters, and its summary.
Data Telemetry(std::uint64_t list) {
  constexpr std::uint64_t kBlockWords = 1024;
  constexpr std::uint64_t kUsedWords = 128;
  ByteWriter blocks;
  for (std::uint64_t channel = 0; channel < kChannels; ++channel) {
    for (std::uint64_t word = 0; word < kBlockWords; ++word) {
      const std::uint64_t reads = 4000 / (word + 1) + 7 * channel + list;
      blocks.u32(word < kUsedWords ? reads : 0);
    }
  }
  for (std::uint64_t channel = 0; channel < kChannels; ++channel) {
    // RD, PE, highest PE rate, t0, retention, block type, pages; one word is not used
    blocks.u32(4810 + channel).u32(40 + list).u32(3).u32(12).u32(86).u32(list).u32(4096).u32(0);
  }
  return blocks.data();
}

Data Defects() {
  constexpr std::uint64_t kFactoryCount = 37;
  ByteWriter list;
  list.u32(0).u32(kFactoryCount).u32(2);
  // Bus and chip enable, CAU, block, cycle, reason, page, temperature
  list.u32(1 | 2 << 16).u32(0).u32(1207).u32(44).u32(3).u32(511).u32(38);
  list.u32(0 | 1 << 16).u32(1).u32(88).u32(51).u32(1).u32(4090).u32(0xFC);  // -4 degrees
  return list.data();
}

constexpr std::uint64_t kRecordBytes = 252;
constexpr std::uint64_t kIntervals = 4;

Data Snapshot() {
  ByteWriter records;
  for (std::uint64_t interval = 1; interval <= kIntervals; ++interval) {
    for (std::uint64_t word = 0; word < kRecordBytes / 4; ++word) {
      const bool isTime = word == 0;
      const bool isHysteresis = word == 39;  // microseconds
      records.u32(isTime         ? 1000 * interval
                  : isHysteresis ? 1'234'567 / interval
                                 : (word * 37 + interval * 11) % 97);
    }
  }
  return records.data();
}

struct Field {
  enum Kind : std::uint64_t { kNumber = 0, kMilliseconds = 2, kOperations = 3 };
  Kind kind;
  std::uint64_t word;
  std::uint64_t size;  // bytes
  const char* format;
};

Data SnapshotHeader() {
  constexpr std::uint64_t kVersion = 6;
  constexpr std::uint64_t kFieldTable = 256;
  const std::initializer_list<Field> fields = {{Field::kNumber, 0, 4, "T=%04u"},
                                               {Field::kNumber, 26, 4, " E=%02u"},
                                               {Field::kNumber, 27, 4, " HR=%4u"},
                                               {Field::kNumber, 28, 4, " HW=%4u"},
                                               {Field::kMilliseconds, 39, 4, " TH=%u.%02u"},
                                               {Field::kOperations, 14, 48, " R%s="},
                                               {Field::kOperations, 2, 48, " W%s="}};
  ByteWriter header;
  header.u32(0).u32(kVersion).u32(kRecordBytes).u32(kIntervals).u32(0).u32(0).u32(kFieldTable);
  header.u32(0).u32(0);
  header.text("Key: T time, E erased bands, HR/HW host reads/writes, TH hysteresis (ms)\n\n",
              kFieldTable - header.size());
  header.u32(fields.size()).u32(0);
  for (const Field& field : fields) {
    header.u16(field.kind).u16(0).u32(4 * field.word).u32(field.size).text(field.format, 16);
  }
  return header.data();
}

Dictionary Export(std::uint32_t selector, const Data& data, std::uint64_t listIndex = 0) {
  return {{"Selector", Int64(std::int64_t{selector})},
          {"ListIndex", Int64(static_cast<std::int64_t>(listIndex))},
          {"Data", data}};
}

}  // namespace

Dictionary DemoStorageDriver() {
  Array exports{Export(kStatisticsSelector, StatisticsExport()),
                Export(kBandStatisticsSelector, BandStatistics())};
  for (std::uint64_t list = 0; list < 3; ++list) {
    exports.push_back(Export(kTelemetryListSelector, Telemetry(list), list));
  }
  exports.push_back(Export(kDefectsListSelector, Defects()));
  exports.push_back(Export(kSnapshotSelector, Snapshot()));
  exports.push_back(Export(kSnapshotHeaderSelector, SnapshotHeader()));
  const Dictionary characteristics{{"chip-id", "K3A"},
                                   {"manufacturer-id", "4582603A57FF"},
                                   {"num-bus", Int64(static_cast<std::int64_t>(kChannels))}};
  // Method 5: whether content should be deleted.
  const Dictionary methods{{"5", Dictionary{{"Output", ByteWriter().u32(0).data()}}}};
  return {{"EntryID", Int64(kStorageId)},
          {"EntryName", "storage0"},
          {"ClassName", std::string(kFlashStorageClass.name)},
          {"Properties",
           Dictionary{{std::string(kFlashStorageClass.characteristicsKey), characteristics}}},
          {"ExportMethods", Array{Int64(std::int64_t{kFlashStorageClass.exportMethod})}},
          {"Exports", exports},
          {"Methods", methods}};
}

}  // namespace quorlet
