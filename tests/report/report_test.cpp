#include "report/report.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "fakes/fake_platform.h"
#include "fakes/whitelist.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr double kInfinity = std::numeric_limits<double>::infinity();
constexpr std::int64_t kMax = std::numeric_limits<std::int64_t>::max();
constexpr std::int64_t kMin = std::numeric_limits<std::int64_t>::min();

// Yesterday is day 19999.
class ReportTest : public testing::Test {
 protected:
  void whitelist(const std::string& groups) {
    device.environment.files[std::string(kWhitelistPath)] = Plist("<dict>" + groups + "</dict>");
  }
  void allowScalars(std::initializer_list<WhitelistKey> keys) {
    whitelist(Group("G", "ScalarKeys", keys));
  }
  void writeLog(const std::optional<Array>& appInfo = std::nullopt) {
    TLReport(device.services).writeLogForYesterdayWithAppInfo(19999, appInfo);
  }
  Dictionary document() {
    EXPECT_FALSE(device.diagnostics.logs.empty());
    if (device.diagnostics.logs.empty()) return {};
    const auto parsed = ReadPropertyList(device.diagnostics.logs.back().body);
    return *std::get<PropertyValue>(parsed).asDictionary();
  }
  PropertyValue scalar(const char* key) {
    const Dictionary log = document();
    const PropertyValue* value = DictionaryEntry(log, "TLScalars")->find(key);
    return value != nullptr ? *value : PropertyValue("(none)");
  }

  FakePlatform device;
};

struct Samples : TLHistoryDistributionEnumerator {
  explicit Samples(std::initializer_list<double> values) {
    for (const double value : values) samples.push_back({value, 0});
  }
  // Two at a time, so that block ends are met.
  std::span<const DistributionSample> nextBlock() override {
    const auto block =
        std::span(samples).subspan(next, std::min<std::size_t>(2, samples.size() - next));
    next += block.size();
    return block;
  }
  std::vector<DistributionSample> samples;
  std::size_t next = 0;
};

TEST_F(ReportTest, OptionsRoundScalars) {
  using Options = std::initializer_list<std::pair<std::string_view, PropertyValue>>;
  const struct {
    Options options;
    std::int64_t value, expected;
  } cases[] = {
      {{}, 1234, 1234},
      {{{"bucket_interval", Int64(100)}}, 1234, 1200},
      {{{"bucket_interval", Int64(100)}}, 1250, 1300},
      {{{"bucket_interval", Int64(100)}}, -1250, -1300},
      {{{"bucket_interval", Int64(7)}}, 11, 14},
      {{{"bucket_interval", Int64(0)}}, 5, 0},
      {{{"bucket_interval", Double(100.9)}}, 1250, 1300},
      {{{"bucket_interval", UInt64(1ull << 63)}}, kMax, kMax},
      {{{"bucket_interval", UInt64(1ull << 63)}}, kMin, kMin},
      {{{"bucket_interval", Double(1e30)}}, 5, 0},
      {{{"sig_fig", Int64(2)}}, 123456, 120000},
      {{{"sig_fig", Int64(2)}}, -123456, -120000},
      {{{"sig_fig", Int64(2)}}, 7, 7},
      {{{"sig_fig", Int64(2)}}, 0, 0},
      {{{"sig_fig", Int64(1)}}, 150, 200},
      {{{"sig_fig", Int64(1)}}, 987654, 1000000},
      {{{"sig_fig", Int64(0)}}, kMax, kMax},
      {{{"sig_fig", Int64(0)}}, kMin, kMin},
      {{{"sig_fig", UInt64(~0ull)}}, kMin, kMin},
      {{{"bucket_interval", Int64(100)}, {"sig_fig", Int64(1)}}, 1234, 1000},
  };
  TLReport report(device.services);
  for (const auto& c : cases) {
    const Dictionary options(c.options);
    EXPECT_EQ(report.addScalarForKeyWithOptions(c.value, "k", options), c.expected)
        << c.value << " with " << PropertyValue(options).description();
    EXPECT_EQ(report.scalarsOutput(), (Dictionary{{"k", Int64(c.expected)}}));
  }
}

TEST_F(ReportTest, OptionsThatWillNotWorkAreLeftOutWithOneLine) {
  device.log.lines.clear();
  TLReport report(device.services);
  device.log.lines.clear();
  const std::pair<PropertyValue, const char*> bad[] = {{Int64(-1), "is negative"},
                                                       {"2", "is not a number"},
                                                       {Double(kInfinity), "is not finite"},
                                                       {Double(std::nan("")), "is not finite"},
                                                       {true, "is not a number"}};
  for (const auto& [value, reason] : bad) {
    const KeyOptions options{{"sig_fig", value}, {"bucket_interval", Int64(10)}};
    EXPECT_EQ(report.addScalarForKeyWithOptions(1234, "a", options), 1230);
    EXPECT_EQ(report.addScalarForKeyWithOptions(1234, "b", options), 1230);
    EXPECT_EQ(device.log.errors(),
              std::vector<std::string>{
                  std::string("Ignoring a whitelist option for key a: \"sig_fig\" ") + reason});
    device.log.lines.clear();
  }
  Samples values{1};
  report.computeAndAddDistributionForKeyWithOptions(
      values, "d", KeyOptions{{"intervals", Array{Int64(1), "x"}}});
  EXPECT_EQ(device.log.errors().size(), 1u);
  EXPECT_EQ(report.distributionsOutput().size(), 1u);
  EXPECT_TRUE(report.histogramsOutput().empty());
}

TEST_F(ReportTest, DistributionsBecomeFiveNumbers) {
  const struct {
    std::initializer_list<double> values;
    Array expected;
  } cases[] = {
      {{1, 2, 3, 4}, {Double(1), Double(4), Double(2.5), Double(5), Int32(4)}},
      {{}, {Double(0), Double(0), Double(0), Double(0), Int32(0)}},
      {{-7.5}, {Double(-7.5), Double(-7.5), Double(-7.5), Double(0), Int32(1)}},
      {{std::nan(""), 3, std::nan(""), 1, std::nan("")},
       {Double(1), Double(3), Double(2), Double(2), Int32(2)}},
      {{std::nan("")}, {Double(0), Double(0), Double(0), Double(0), Int32(0)}},
  };
  TLReport report(device.services);
  for (const auto& c : cases) {
    Samples values(c.values);
    report.computeAndAddDistributionForKeyWithOptions(values, "d", {});
    EXPECT_EQ(PropertyValue(report.distributionsOutput()),
              PropertyValue(Dictionary{{"d", c.expected}}));
  }
  Samples infinite{1, kInfinity};
  report.computeAndAddDistributionForKeyWithOptions(infinite, "d", {});
  const Array stats = *report.distributionsOutput().find("d")->asArray();
  EXPECT_EQ(stats[1], Double(kInfinity));
  EXPECT_EQ(stats[4], Int32(2));
}

TEST_F(ReportTest, HistogramsCountTheValuesOfEachBucket) {
  const struct {
    Array bounds;
    std::initializer_list<double> values;
    Dictionary expected;
  } cases[] = {
      {{Int64(10), Int64(20)},
       {5, 10, 10.5, 20, 25, 30},
       {{"(-inf, 10]", UInt64(2)}, {"(10, 20]", UInt64(2)}, {"(20, inf)", UInt64(2)}}},
      {{}, {1, -kInfinity, kInfinity}, {{"(-inf, inf)", UInt64(3)}}},
      {{Double(2.5), Double(10)}, {3}, {{"(2.5, 10]", UInt64(1)}}},
      // The first bound in array order that is not less decides.
      {{Int64(20), Int64(10), Int64(30)},
       {5, 15, 25, 35},
       {{"(-inf, 20]", UInt64(2)}, {"(10, 30]", UInt64(1)}, {"(30, inf)", UInt64(1)}}},
      {{Int64(1)}, {std::nan("")}, {}},
  };
  TLReport report(device.services);
  for (const auto& c : cases) {
    Samples values(c.values);
    report.computeAndAddDistributionForKeyWithOptions(values, "h",
                                                      KeyOptions{{"intervals", c.bounds}});
    const PropertyValue* histogram = report.histogramsOutput().find("h");
    EXPECT_EQ(histogram != nullptr ? *histogram : PropertyValue(Dictionary()),
              PropertyValue(c.expected))
        << PropertyValue(c.bounds).description();
  }
  EXPECT_TRUE(report.histogramsOutput().empty()) << "an earlier histogram goes with the last value";
}

TEST_F(ReportTest, TheLogHoldsWhatTheWhitelistAllows) {
  whitelist(Group("G", "ScalarKeys", {{"s", "sig_fig", "1"}}) +
            "<key>H</key><dict><key>DistributionKeys</key><dict><key>d</key><dict>"
            "<key>intervals</key><array><integer>2</integer></array></dict></dict></dict>");
  device.counterStore.hasScalar("s", 19999, 149);
  device.counterStore.hasScalar("s", 19998, 999);
  device.counterStore.hasScalar("s", 20000, 888);
  device.counterStore.hasScalar("not allowed", 19999, 1);
  device.counterStore.hasDistribution("d", 19999, {1, 2, 3});
  device.counterStore.hasDistribution("not allowed", 19999, {1});
  device.locale.preferred = {"de-AT", "en"};
  device.locale.system = {"en"};
  device.locale.region = "AT";
  writeLog(Array{Dictionary{{"bundle", "b"}}});

  Dictionary log = document();
  EXPECT_EQ(DictionaryEntry(log, "TLWhitelistDigest"), nullptr);
  EXPECT_EQ(StringEntry(log, "TLWhitelistDigest")->size(), 32u);
  log.remove("TLWhitelistDigest");
  EXPECT_EQ(
      PropertyValue(log).description(),
      PropertyValue(
          Dictionary{
              {"TLCrashLogVersion", Int64(1)},
              {"TLStartDate", Date{19999 * 86400.0}},
              {"TLLogCreationDate", Date{20000 * 86400.0 + 43200}},
              {"TLMetadata", Dictionary{{"TLUserInterfaceLanguage", "en"},
                                        {"TLPreferredUserInterfaceLanguage", "de-AT"},
                                        {"TLUserSetRegionFormat", "AT"}}},
              {"TLScalars", Dictionary{{"s", Int64(100)}}},
              {"TLDistributions",
               Dictionary{{"d", Array{Double(1), Double(3), Double(2), Double(2), Int64(3)}}}},
              {"TLDistributionsHistogram",
               Dictionary{{"d", Dictionary{{"(-inf, 2]", Int64(2)}, {"(2, inf)", Int64(1)}}}}},
              {"TLTasking", Array()},
              {"TLTaskID", "(no tasking id)"},
              {"TLTaskDigest", "(no tasking digest)"},
              {"TLActivatedAppInfo", Array{Dictionary{{"bundle", "b"}}}},
          })
          .description());
  EXPECT_EQ(device.diagnostics.logs[0].typeCode, "193");
  EXPECT_EQ(device.diagnostics.logs[0].name, "log-aggregated");
}

TEST_F(ReportTest, AppInfoThatCannotBeWrittenIsLeftOut) {
  allowScalars({{"s", "", ""}});
  device.counterStore.hasScalar("s", 19999, 1);
  Array deep;
  for (std::size_t i = 0; i < kMaxPropertyListDepth; ++i) deep = Array{PropertyValue(deep)};
  writeLog(deep);
  EXPECT_FALSE(document().contains("TLActivatedAppInfo"));
  EXPECT_EQ(device.log.errors().size(), 1u);
}

TEST_F(ReportTest, NothingToReportLeavesNoTrace) {
  allowScalars({{"s", "", ""}, {"nuvex.kernel.swapusage", "", ""}});
  device.counterStore.hasScalar("other", 19999, 1);
  device.counterStore.hasScalar("s", 20000, 1);
  writeLog(Array());
  EXPECT_TRUE(device.diagnostics.logs.empty());
  EXPECT_TRUE(device.kernelParameters.asked.empty());
  EXPECT_FALSE(
      device.preferences.DGWPreferencesGetValue("LastOSVersion", "nuvex.aggregated.quorlet"));
}

TEST_F(ReportTest, AnOSChangeIsToldOnce) {
  allowScalars({{"s", "", ""}});
  device.counterStore.hasScalar("s", 19999, 1);
  const auto previous = [&] {
    const auto& metadata = device.diagnostics.logs.back().metadata;
    return metadata ? PropertyValue(*metadata) : PropertyValue("none");
  };
  writeLog();
  EXPECT_EQ(previous(), PropertyValue(Dictionary{{"previous_os_version", "<unknown>"}}));
  writeLog();
  EXPECT_EQ(previous(), PropertyValue("none"));
  device.diagnostics.osVersion = "TestOS 2 (B1)";
  writeLog();
  EXPECT_EQ(previous(), PropertyValue(Dictionary{{"previous_os_version", "TestOS 1 (A1)"}}));

  device.diagnostics.osVersion = "TestOS 3 (C1)";
  device.diagnostics.diskIsFull = true;
  writeLog();
  EXPECT_EQ(device.log.errors(), std::vector<std::string>{"Failed to write aggregated log"});
  device.diagnostics.diskIsFull = false;
  writeLog();
  EXPECT_EQ(previous(), PropertyValue("none")) << "the change was recorded before";
}

TEST_F(ReportTest, SystemMetricsHaveFailureValues) {
  const char* keys[] = {"nuvex.diagwell.tallyd.database.size",
                        "nuvex.diagwell.tallyd.database.corruptions",
                        "nuvex.usage.cur_boot_session_cpu_uptime",
                        "nuvex.kernel.memorystatus_freeze_count",
                        "nuvex.kernel.memorystatus_freeze_pageouts",
                        "nuvex.kernel.memorystatus_freeze_budget_pages_remaining",
                        "nuvex.kernel.memorystatus_thaw_count",
                        "nuvex.kernel.swapusage"};
  std::string table;
  for (const char* key : keys) table += "<key>" + std::string(key) + "</key><dict/>";
  whitelist("<key>G</key><dict><key>ScalarKeys</key><dict><key>s</key><dict/>" + table +
            "</dict></dict>");
  device.counterStore.hasScalar("s", 19999, 1);
  device.environment.timebaseDenominator = 0;
  device.supportLibrary.present = false;
  device.preferences.DGWPreferencesSetValue("DatabaseCorruptionCount", Int64(3),
                                            "nuvex.aggregated");
  writeLog();
  std::vector<PropertyValue> values;
  for (const char* key : keys) values.push_back(scalar(key));
  EXPECT_EQ(values, (std::vector{Int64(-1), Int64(0), Int64(-1), Int64(-1), Int64(-1), Int64(-1),
                                 Int64(-1), Int64(-1)}));
  EXPECT_EQ(device.log.errors(),
            (std::vector<std::string>{"Failed to dynamically load the FaultScribeSupport framework",
                                      "Could not retrieve the tick timebase"}));

  const std::string path = "/var/mobile/Library/TallyLedger/TLDataStore.sqlitedb";
  device.environment.sizes[path] = 1048575;
  device.supportLibrary.present = true;
  device.environment.timebaseDenominator = 3;
  device.environment.timebaseNumerator = 125;
  device.environment.ticks = 24'000'000ull * 3600;  // an hour at 24 MHz
  auto& kernel = device.kernelParameters.values;
  kernel["kern.memorystatus_freeze_count"] = "\xff\xff\xff\xff";
  kernel["kern.memorystatus_freeze_pageouts"] = std::string("\0\0\0\0\1\0\0\0", 8);
  kernel["kern.memorystatus_freeze_budget_pages_remaining"] = std::string(8, '\xff');
  kernel["kern.memorystatus_thaw_count"] = std::string(5, '\1');
  kernel["vm.swapusage"] = std::string("\0\1\0\0\0\0\0\0", 8) + std::string(24, '\x55');
  writeLog();
  values.clear();
  for (const char* key : keys) values.push_back(scalar(key));
  EXPECT_EQ(values, (std::vector{Int64(0), Int64(3), Int64(60), Int64(0xffffffff), Int64(1ll << 32),
                                 Int64(-1), Int64(-1), Int64(256)}));
  device.environment.sizes[path] = 1048576;
  writeLog();
  EXPECT_EQ(scalar("nuvex.diagwell.tallyd.database.size"), Int64(1));
  EXPECT_EQ(scalar("nuvex.diagwell.tallyd.database.corruptions"), Int64(0)) << "it was reset";
}

}  // namespace
}  // namespace quorlet
