#include "storage/statistics_parser.h"

#include <gtest/gtest.h>

#include <set>

#include "storage/statistics_export.h"

namespace quorlet {
namespace {

constexpr std::uint64_t kVersion = 53;

// The pairs, and the export version that is left of 5.
std::string Parsed(const ExportWords& words) {
  FSPParseContext context;
  context.exportVersion = 5;
  std::string text = FSPParseBufferToCxt(context, std::as_bytes(std::span(words))) ? "" : "BAD ";
  EXPECT_EQ(context.driverVersion, 0xFFFFFFFF);
  for (const auto& pair : context.pairs)
    text += pair.name() + "=" + std::to_string(pair.value) + " ";
  text += std::to_string(context.exportVersion);
  FSPReleaseContext(context);
  EXPECT_TRUE(context.pairs.empty() && context.driverVersion == 0);
  return text;
}

TEST(StatisticsParser, Records) {
  const std::uint64_t one = std::uint64_t{1} << 32;
  const std::pair<ExportWords, const char*> cases[] = {
      {{}, "BAD 5"},
      {{1}, "5"},
      {{1 | one, 9}, "version=9 5"},
      {{1 | 3 * one, 9, 8, 7, 10 | one, 6}, "version=9 boots=6 5"},
      {{1 | one, 9, 1 | one, 8}, "version=9 version=8 5"},
      {{121}, "5"},
      {{121 | one, 5}, "padSizes=5 5"},
      {{121 | 2 * one, 5, ~0ULL}, "padSizes0=5 padSizes1=18446744073709551615 5"},
      {{121 | 5 * one, 1, 2, 3, 4, 5, 10 | one, 9},
       "padSizes0=1 padSizes1=2 padSizes2=3 padSizes3=4 boots=9 5"},
      {{184, 238 | 2 * one, 3, 4}, "CalibrationLastTmp=3 5"},
      {{0 | one, 1, 21 | one, 2, 396 | one, 3, 0x30000000, 373}, "5"},
      {{kVersion | one, 7 + 5 * one, kVersion}, "exportVersion=21474836487 7"},
      {{kVersion | one, 7, 0x30000001}, "BAD exportVersion=7 0"},
      {{kVersion | one, 7, 0xFFFFFFFF}, "BAD exportVersion=7 0"},
      {{kVersion | one, 7, 1 | one}, "BAD exportVersion=7 0"},
      {{kVersion | one, 7, 121 | 0xFFFFFFFF * one, 1}, "BAD exportVersion=7 0"},
  };
  for (const auto& [words, parsed] : cases) EXPECT_EQ(Parsed(words), parsed);
}

TEST(StatisticsParser, FieldsAndNamesOfAFullExport) {
  ExportWords words;
  std::size_t values = 0;
  for (const StatisticsKey& key : kStatisticsKeys) {
    values += key.cap;
    ExportWords record(key.cap + 1U);
    for (std::size_t i = 0; i < record.size(); ++i) record[i] = key.id + 0x100000001 * 1000 * i;
    AddRecord(words, key.id, record);
  }
  FSPParseContext context;
  ASSERT_TRUE(FSPParseBufferToCxt(context, std::as_bytes(std::span(words))));
  ASSERT_EQ(context.pairs.size(), values);
  std::set<std::string> names;
  for (const StatisticsPair& pair : context.pairs) {
    names.insert(pair.name());
    EXPECT_EQ(FindStatisticsSlot(pair.name()), pair.slot) << pair.name();
  }
  EXPECT_EQ(names.size(), values);
  EXPECT_TRUE(names.contains("qosPerCmdQ159") && names.contains("refreshUtil00"));
  for (const char* name : {"", "0", "qosPerCmdQ160", "qosPerCmdQ00", "boots0", "padSizes99999"}) {
    EXPECT_EQ(FindStatisticsSlot(name), std::nullopt) << name;
  }
}

TEST(StatisticsParser, EveryLength) {
  const ExportWords words = ExportOf({{"exportVersion", {9}}, {"padSizes", {1, 2}}, {"boots", {}}});
  const std::set<std::size_t> whole = {2, 5, 6};  // words
  for (std::size_t length = 0; length <= words.size() * 8; ++length) {
    const auto cut = std::as_bytes(std::span(words)).first(length);
    const std::vector<std::byte> exact(cut.begin(), cut.end());  // its end is guarded
    FSPParseContext context;
    EXPECT_EQ(FSPParseBufferToCxt(context, exact), whole.contains(length / 8)) << length;
    EXPECT_EQ(context.pairs.size(), length < 16 ? 0U : length < 40 ? 1U : 3U) << length;
  }
}

}  // namespace
}  // namespace quorlet
