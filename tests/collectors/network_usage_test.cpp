#include "collectors/network_usage.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "fakes/fake_platform.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

using Counters = std::map<std::string, std::int64_t>;
constexpr char kDomain[] = "nuvex.diagwell.quorlet";
constexpr std::int64_t kMax = std::numeric_limits<std::int64_t>::max();
constexpr std::int64_t kMin = std::numeric_limits<std::int64_t>::min();
constexpr double kToday = 20000 * 86400.0;
constexpr double kYesterday = kToday - 86400;

Dictionary Usage(std::string_view name, double since, std::int64_t wifiIn,
                 std::int64_t wwanOut = 0) {
  return {{"procName", name},         {"since", Date{since}},     {"wifiInBytes", Int64(wifiIn)},
          {"wifiOutBytes", Int64(0)}, {"wwanInBytes", Int64(10)}, {"wwanOutBytes", Int64(wwanOut)}};
}

Dictionary With(std::string_view key, std::optional<PropertyValue> value,
                Dictionary record = Usage("p", kToday, 9000)) {
  record.remove(key);
  if (value) record[key] = *value;
  return record;
}

class NetworkUsageTest : public testing::Test {
 protected:
  // What a run adds, by key without "datausage."; the baseline has been in a file, if there is one.
  Counters collected(const Array& records) {
    if (const auto baseline = device.preferences.DGWPreferencesGetValue(kBaseline, kDomain)) {
      const auto document = WriteXmlPropertyList(*baseline);
      hasBaseline(std::get<PropertyValue>(ReadPropertyList(std::get<std::string>(document))));
    }
    device.networkUsage.records = records;
    device.counterStore.scalars.clear();
    collectDataUsage(device.services);
    return added();
  }
  Counters added() {
    Counters counters;
    for (const auto& [row, value] : device.counterStore.scalars) {
      counters[row.first.substr(10)] = value;
    }
    return counters;
  }
  void hasBaseline(const PropertyValue& value) {
    device.preferences.DGWPreferencesSetValue(kBaseline, value, kDomain);
  }

  static constexpr char kBaseline[] = "netUsageBaseline";
  FakePlatform device;
};

TEST_F(NetworkUsageTest, EachReplyIsComparedWithTheOneBefore) {
  const Dictionary app = With("bundleName", "p", Usage("q", kToday, 1024));
  const double old = 1000.75;  // with a fraction, which the stored baseline loses
  const std::pair<Array, Counters> replies[] = {
      {{app}, {{"wifiInKB.p", 1}}},
      {{Usage("p", kToday, 3072, kMax), app},
       {{"wifiInKB.nuvex.p", 2}, {"wwanOutKB.nuvex.p", kMax / 1024}}},
      {{Usage("p", kToday, 2047)}, {}},
      {{Usage("p", kToday, 3071, 5000)}, {{"wifiInKB.nuvex.p", 1}, {"wwanOutKB.nuvex.p", 4}}},
      {{Usage("p", kToday, 0)}, {{"baddata.nuvex.p", 2}}},
      {{Usage("p", kToday + 1, 9000)}, {{"wifiInKB.nuvex.p", 8}}},
      {{}, {}},
      {{Usage("p", kToday + 1, 9000)}, {{"wifiInKB.nuvex.p", 8}}},
      {{Usage("p", kYesterday, -5000)}, {{"wifiInKB.nuvex.p", -4}}},
      {{Usage("p", kYesterday - 1, 9000)}, {{"olddata.nuvex.p", 1}}},
      {{Usage("p", old, kMin, kMax)}, {{"olddata.nuvex.p", 1}}},
      {{Usage("p", old, kMax, kMin)}, {{"wifiInKB.nuvex.p", kMax / 1024}, {"baddata.nuvex.p", 1}}},
      {{Usage("p", std::nan(""), 9000)}, {{"olddata.nuvex.p", 1}}},
      {{Usage("p", 1e300, 9000)}, {{"wifiInKB.nuvex.p", 8}}},
      {{With("since", Date{1e300}), With("wwanInBytes", UInt64(~0ULL))},
       {{"wifiInKB.nuvex.p", 8}, {"wwanInKB.nuvex.p", kMax / 1024}}},
  };
  for (const auto& [records, added] : replies) {
    EXPECT_EQ(collected(records), added) << PropertyValue(records).description();
    EXPECT_TRUE(device.preferences.isDurable(kBaseline, kDomain));
  }
}

TEST_F(NetworkUsageTest, IncompleteRecordsLeaveNoTrace) {
  EXPECT_EQ(collected({"text", With("procName", std::nullopt), With("procName", Int64(1)),
                       With("bundleName", false), With("since", std::nullopt),
                       With("since", Int64(5)), With("wifiInBytes", "9000"),
                       With("wwanInBytes", true), With("wwanOutBytes", std::nullopt)}),
            Counters());
  EXPECT_EQ(device.preferences.DGWPreferencesGetValue(kBaseline, kDomain), Dictionary());
  EXPECT_TRUE(device.log.lines.empty());
}

TEST_F(NetworkUsageTest, WhatTheBaselineShouldNotHoldCountsAsAbsent) {
  const Date since{kToday};
  const std::pair<PropertyValue, std::int64_t> baselines[] = {
      {Int64(7), 9},
      {Dictionary{{"p", "text"}}, 9},
      {Dictionary{{"p", Array()}}, 9},
      {Dictionary{{"p", Array{Int64(1), since}}}, 9},
      {Dictionary{{"p", Array{since, "1024"}}}, 9},
      {Dictionary{{"p", Array{since, Int64(1024), Int64(0), Int64(0), Int64(0), "more"}}}, 8},
  };
  for (const auto& [baseline, kilobytes] : baselines) {
    hasBaseline(baseline);
    EXPECT_EQ(collected({Usage("p", kToday, 9216)})["wifiInKB.nuvex.p"], kilobytes)
        << baseline.description();
  }
}

TEST_F(NetworkUsageTest, NamesFindTheirRowsAgainUnlessTheBaselineCannotHoldThem) {
  using namespace std::string_literals;
  for (const std::string& name : {""s, " a "s, "../a/b"s, "a\r\nb"s, "a\0b"s, "\x01\xff\xfe"s,
                                  "<&>%@%s"s, "\xEF\xBF\xBE"s, std::string(1024, 'x')}) {
    EXPECT_EQ(collected({Usage(name, kToday, 9000)})["wifiInKB.nuvex." + name], 8);
    EXPECT_EQ(collected({Usage(name, kToday, 11048)})["wifiInKB.nuvex." + name], 2);
  }
  Array records{Usage(std::string(10 << 20, 'x'), kToday, 9000),
                Usage(std::string(1025, 'x'), kToday, 9000)};
  for (int i = 1000; i < 4000; ++i) {
    records.push_back(Usage(std::to_string(i) + std::string(1020, '&'), kToday, 9000));
  }
  const std::size_t counted = collected(records).size();
  constexpr std::size_t kRowBytes = 1024 + 1020 * std::string_view("amp;").size() + 300;
  EXPECT_GT(counted, kMaxPropertyListBytes / kRowBytes * 9 / 10);
  EXPECT_LT(counted, kMaxPropertyListBytes / kRowBytes);
  EXPECT_EQ(device.log.errors().size(), 1u);
  const auto stored = device.preferences.DGWPreferencesGetValue(kBaseline, kDomain);
  EXPECT_EQ(stored->asDictionary()->size(), counted);
}

TEST_F(NetworkUsageTest, ALateReplyIsProcessedInFull) {
  device.networkUsage.holdsBack = true;
  EXPECT_EQ(collected({Usage("p", kToday, 9000)}), Counters());
  EXPECT_EQ(device.semaphores.waits.at(0), std::chrono::seconds(10));
  device.networkUsage.deliver();
  EXPECT_EQ(added(), (Counters{{"wifiInKB.nuvex.p", 8}}));
}

}  // namespace
}  // namespace quorlet
