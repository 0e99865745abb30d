#include "storage/nand_info.h"

#include <gtest/gtest.h>

#include <cstring>

#include "collectors/platform_statistics.h"
#include "storage/statistics_export.h"

namespace quorlet {
namespace {

constexpr std::uint64_t k2000 = 946684800;
constexpr std::uint64_t kWeek = 604800;

// Without the prefix of the keys.
std::map<std::string, std::int64_t> InfoOf(Records records, std::uint64_t version = 0x20002) {
  ExportDevice device;
  records.emplace_back("exportVersion", ExportWords{version});
  device.words = ExportOf(records);
  std::map<std::string, std::int64_t> numbers;
  for (const auto& [key, value] : CopyNANDInfo(device.services)) {
    numbers[key.substr(std::strlen("nuvex.NANDInfo."))] = value.asNumber()->toInt64();
  }
  return numbers;
}

// What is not in an export of that version without records.
std::string Added(const Records& records, std::uint64_t version = 0x20002) {
  const auto base = InfoOf({}, version);
  std::string text;
  for (const auto& [key, value] : InfoOf(records, version)) {
    const auto found = base.find(key);
    if (found == base.end() || found->second != value) {
      text += key + "=" + std::to_string(value) + " ";
    }
  }
  return text;
}

TEST(NANDInfo, OldExportsHaveFifteenKeys) {
  EXPECT_EQ(Added({{"numVirtualBlocks", {1}},
                   {"pagesPerVirtualBlock", {2}},
                   {"bytesPerPage", {~0ULL}},
                   {"hostReads", {4}},
                   {"hostWrites", {5}},
                   {"numFreeVirtualBlocks", {6}},
                   {"wearLevMoves", {7}},
                   {"nandReads", {8}},
                   {"nandWrites", {~0ULL}},
                   {"bandErases", {10}},
                   {"IND_pool_free", {11}},
                   {"IND_pool_count", {12}},
                   {"numSleepOps", {13}},
                   {"numFlushes", {14}}},
                  0x20001),
            "BytesPerPage=-1 NodesFree=11 NodesTotal=12 NumFreeVirtualBlocks=6 NumLogicalReads=4 "
            "NumLogicalWrites=5 NumPhysicalErases=10 NumPhysicalReads=8 NumPhysicalWrites=-1 "
            "NumVirtualBlocks=1 NumWearLevelOps=7 PagesPerVirtualBlock=2 ");
  EXPECT_EQ(InfoOf({}, 0x20001).size(), 15U);
  EXPECT_EQ(InfoOf({}).size(), 15U + 13U);
}

TEST(NANDInfo, WhatLaterExportsAdd) {
  const std::pair<Records, const char*> cases[] = {
      {{{"numSleepOps", {1}}, {"maxHighEnduranceBlockErases", {2}}, {"blocksPerVirtualBlock", {3}}},
       "BlocksPerVirtualBlock=3 HighEnduranceBlockEraseCount=2 NumSleepOps=1 "},
      {{{"readCountHisto", {1, 2, 3, 4, 5}}},
       "ReadsBeforeErasure0=1 ReadsBeforeErasure100000=3 ReadsBeforeErasure150000=4 "
       "ReadsBeforeErasure200000=5 ReadsBeforeErasure50000=2 "},
      {{{"utilFormatTime", {k2000}}}, ""},
      {{{"utilFormatTime", {k2000 - 1}}}, ""},
      {{{"utilFormatTime", {k2000 + kWeek - 1}}}, ""},
      {{{"utilFormatTime", {k2000 + kWeek}}}, "formatDaysSince2000=1 "},
      {{{"userPartitionStart", {7}}}, ""},
      {{{"intermediatePartitionStart", {7}}}, ""},
      {{{"userPartitionStart", {0xFFFFFFFF}}, {"intermediatePartitionStart", {7}}}, ""},
      {{{"userPartitionStart", {7}}, {"intermediatePartitionStart", {0}}},
       "IntermediatePartitionSize=7 "},
      {{{"userPartitionStart", {7}}, {"intermediatePartitionStart", {9}}},
       "IntermediatePartitionSize=-2 "},
      {{{"numBootBlockRefreshSuccess", {5, 100}}, {"numBootBlockRefreshFail", {6, 100}}},
       "NumMaintenanceRequests=11 "},
      {{{"numBootBlockRefreshSuccess", {5}}, {"mspBootBlockReadFail", {5}}}, ""},
      {{{"mspBootBlockReadFail", {9, 0, 8, 7}},
        {"mspBootBlockProgFail", {0, 1}},
        {"mspBootBlockEraseFail", {1, 2, 3, 4}}},
       "MaintenanceRequestsFailedErase=3 MaintenanceRequestsFailedProg=1 "
       "MaintenanceRequestsFailedRead=2 "},
      {{{"padSizes", {1, 2, 3, 4}}, {"bandsPerSpecialFlow", {1, 2, 3, 4, 5}}},
       "BandsPerInternalFlow0=1 BandsPerInternalFlow1=2 BandsPerInternalFlow2=3 "
       "BandsPerInternalFlow3=5 PadSize1=1 PadSize2=2 PadSize3=3 PadSize4=4 "},
      {{{"padSizes", {1}}, {"numMemExtreme", {1}}, {"lhotSkipPrecent", {9}}, {"numMemLow", {3}}},
       "lhotSkipPercent=9 numMemExtreme=3 "},
      {{{"numFences", {1}}, {"numFences", {2}}}, "NumFences=2 "},
      {{{"coldestCycle", {1, 2}}, {"E2EDPErrorCounters", {1, 2}}},
       "ColdestCycle=1 E2E_H2F_VL_Corr=2 E2E_H2F_VL_LBA=1 IntermediateColdestCycle=2 "},
  };
  for (const auto& [records, added] : cases) EXPECT_EQ(Added(records), added);
}

TEST(NANDInfo, PeaksAreRounded) {
  const std::pair<std::uint64_t, std::int64_t> cases[] = {
      {0, 0},
      {999, 999},
      {1000, 1000},
      {1044, 1040},
      {1049, 1050},
      {9995, 10000},
      {12345, 12300},
      {12350, 12400},
      {0xFFFFFFFF, 4290000000},
      {1ULL << 32, 0},
      {(7ULL << 32) + 1234, 1230},
  };
  for (const auto& [value, rounded] : cases) {
    auto info = InfoOf({{"maxMemLowDuration", {value}}, {"memLowDuration", {value}}});
    EXPECT_EQ(info["maxMemExtremeDuration"], rounded) << value;
    EXPECT_EQ(info["memExtremeDuration"], static_cast<std::int64_t>(value));
    EXPECT_EQ(InfoOf({{"maxMemChokeDuration", {value}}})["maxMemChokeDuration"], rounded);
  }
}

TEST(NANDInfo, MergeLeavesOutVersionsAndErrors) {
  ExportDevice device;
  device.words = ExportOf({{"exportVersion", {1}}, {"hostReads", {9}}});
  Dictionary target{{kNANDInfoNumLogicalReadsKey, Int64(1)}, {"Other", "text"}};
  DumpNANDInfo(device.services, target);
  EXPECT_EQ(target.size(), 13U);
  EXPECT_EQ(IntegerEntry(target, kNANDInfoNumLogicalReadsKey), 9);
  EXPECT_FALSE(target.contains(kNANDInfoDemoModeKey));
  const Dictionary before = target.deepCopy();
  for (const ExportWords& words : {ExportOf({{"hostReads", {7}}}), ExportWords{1ULL << 32}}) {
    device.words = words;
    DumpNANDInfo(device.services, target);
    EXPECT_EQ(target, before);
  }
}

TEST(DailyPush, ErrorsAreLogged) {
  const std::pair<ExportWords, std::string> cases[] = {
      {{1}, "Unsupported export version"},
      {{}, "Unable to parse buffer"},
      {{1ULL << 32}, "Unable to parse buffer"},
  };
  for (const auto& [words, message] : cases) {
    ExportDevice device;
    device.words = words;
    collectPlatformStatistics(device.services);
    EXPECT_EQ(device.log.at(LogLevel::kDefault),
              std::vector<std::string>{"error reading nand info, error 1 with message " + message});
    EXPECT_EQ(device.counterStore.scalars.size(), 2U);
  }
}

}  // namespace
}  // namespace quorlet
