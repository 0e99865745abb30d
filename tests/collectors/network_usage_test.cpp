#include <gtest/gtest.h>

#include <cmath>

#include "collectors/platform_statistics.h"
#include "fakes/fake_platform.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

using Counters = std::map<std::string, std::int64_t>;
constexpr char kDomain[] = "nuvex.diagwell.quorlet";
constexpr char kBaseline[] = "netUsageBaseline";
constexpr double kSince = 19999 * 86400.0;  // the start of yesterday, the oldest that counts

Dictionary Usage(std::string_view name, double since, std::int64_t wifi, std::int64_t wwan = 0) {
  return {{"procName", name},         {"since", Date{since}},     {"wifiInBytes", Int64(wifi)},
          {"wifiOutBytes", Int64(0)}, {"wwanInBytes", Int64(10)}, {"wwanOutBytes", Int64(wwan)}};
}

Dictionary With(std::string_view key, std::optional<PropertyValue> value) {
  Dictionary record = Usage("q", kSince, 1024);
  record.remove(key);
  if (value) record[key] = *value;
  return record;
}

struct NetworkUsageTest : testing::Test {
  // What a run adds, by key without "datausage."; the baseline has been in a file, if there is one.
  Counters collected(const Array& records) {
    if (const auto value = device.preferences.DGWPreferencesGetValue(kBaseline, kDomain)) {
      const auto text = std::get<std::string>(WriteXmlPropertyList(*value));
      hasBaseline(std::get<PropertyValue>(ReadPropertyList(text)));
    }
    device.networkUsage.records = records;
    device.counterStore.scalars.clear();
    collectPlatformStatistics(device.services);
    Counters added;
    for (auto& [row, value] : device.counterStore.scalars) {
      if (row.first.starts_with("datausage.")) added[row.first.substr(10)] = value;
    }
    return added;
  }
  void hasBaseline(const PropertyValue& value) {
    device.preferences.DGWPreferencesSetValue(kBaseline, value, kDomain);
  }
  FakePlatform device;
};

TEST_F(NetworkUsageTest, EachReplyIsComparedWithTheOneBefore) {
  const double old = kSince - 1.25;  // with a fraction, which the stored baseline loses
  const std::pair<Array, Counters> replies[] = {
      {{With("bundleName", "p")}, {{"wifiInKB.p", 1}}},
      {{Usage("p", kSince, 3072)}, {{"wifiInKB.nuvex.p", 2}}},
      {{Usage("p", kSince, 4095, 1024)}, {{"wwanOutKB.nuvex.p", 1}}},
      {{"text", With("procName", Int64(1)), With("bundleName", false), With("since", Int64(5)),
        With("wifiInBytes", "9000"), With("wwanInBytes", true), With("wwanOutBytes", std::nullopt)},
       {}},
      {{Usage("p", kSince, -5000)}, {{"wifiInKB.nuvex.p", -4}}},
      {{Usage("p", old, INT64_MIN, INT64_MAX)}, {{"olddata.nuvex.p", 1}}},
      {{Usage("p", old, INT64_MAX, INT64_MIN)},
       {{"wifiInKB.nuvex.p", INT64_MAX / 1024}, {"baddata.nuvex.p", 1}}},
      {{Usage("p", std::nan(""), 9000)}, {{"olddata.nuvex.p", 1}}},
      {{Usage("p", 1e300, 9000)}, {{"wifiInKB.nuvex.p", 8}}},
      {{With("wifiInBytes", UInt64(~0ULL))}, {{"wifiInKB.nuvex.q", INT64_MAX / 1024}}},
  };
  for (const auto& [records, added] : replies) {
    EXPECT_EQ(collected(records), added) << PropertyValue(records).description();
    EXPECT_TRUE(device.preferences.isDurable(kBaseline, kDomain));
  }
}

TEST_F(NetworkUsageTest, WhatTheBaselineShouldNotHoldCountsAsAbsent) {
  for (const PropertyValue& row : std::initializer_list<PropertyValue>{
           "text", Array(), Array{Int64(1), Date{kSince}}, Array{Date{kSince}, "1024"}}) {
    hasBaseline(Dictionary{{"p", row}});
    EXPECT_EQ(collected({Usage("p", kSince, 9216)})["wifiInKB.nuvex.p"], 9) << row.description();
    hasBaseline(row);
    EXPECT_EQ(collected({Usage("p", kSince, 9216)})["wifiInKB.nuvex.p"], 9) << row.description();
  }
}

TEST_F(NetworkUsageTest, NamesFindTheirRowsAgainUnlessTheBaselineCannotHoldThem) {
  using namespace std::string_literals;
  for (const std::string& name : {""s, " a "s, "../a/b"s, "a\r\nb"s, "a\0b"s, "\x01\xff\xfe"s,
                                  "<&>%@%s"s, "\xEF\xBF\xBE"s, std::string(1024, 'x')}) {
    EXPECT_EQ(collected({Usage(name, kSince, 9000)})["wifiInKB.nuvex." + name], 8);
    EXPECT_EQ(collected({Usage(name, kSince, 11048)})["wifiInKB.nuvex." + name], 2);
  }
  Array records{Usage(std::string(1025, 'x'), kSince, 9000)};
  for (int i = 1000; i < 4000; ++i) {
    records.push_back(Usage(std::to_string(i) + std::string(1020, '&'), kSince, 9000));
  }
  const std::size_t counted = collected(records).size();
  constexpr std::size_t kRows = kMaxPropertyListBytes / (1324 + 1020 * sizeof "amp");
  EXPECT_TRUE(kRows * 9 / 10 < counted && counted < kRows) << counted;
  EXPECT_EQ(device.log.errors().size(), 1u);
}

TEST_F(NetworkUsageTest, ALateReplyIsProcessedInFull) {
  device.networkUsage.holdsBack = true;
  EXPECT_EQ(collected({Usage("p", kSince, 9000)}), Counters());
  EXPECT_EQ(device.semaphores.waits.at(0), std::chrono::seconds(10));
  device.networkUsage.deliver();
  EXPECT_EQ((device.counterStore.scalars[{"datausage.wifiInKB.nuvex.p", 20000}]), 8);
}

}  // namespace
}  // namespace quorlet
