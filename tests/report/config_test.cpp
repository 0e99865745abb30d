#include "report/config.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "fakes/fake_platform.h"
#include "fakes/whitelist.h"

namespace quorlet {
namespace {

class ConfigTest : public testing::Test {
 protected:
  void whitelist(const std::string& groups) {
    device.environment.files[std::string(kWhitelistPath)] = Plist("<dict>" + groups + "</dict>");
  }
  void makeInternal() { device.deviceInfo.answers["InternalBuild"] = true; }
  TLConfig load() {
    auto config = TLConfig::init(device.services);
    EXPECT_TRUE(config.has_value());
    return *config;
  }
  // The options' text, "-" when the key is left out.
  static std::string text(const std::optional<KeyOptions>& options) {
    return options ? (options->empty() ? "{}" : PropertyValue(*options).description()) : "-";
  }
  static std::string sigFig(const std::optional<KeyOptions>& options) {
    const auto digits = options ? RoundingOption(*options, kSigFig) : std::nullopt;
    return digits ? std::to_string(*digits) : text(options);
  }

  FakePlatform device;
};

TEST_F(ConfigTest, ExactKeysComeBeforePrefixesAndLongPrefixesBeforeShortOnes) {
  whitelist(Group("G", "ScalarKeys", {{"a.b.c", "sig_fig", "1"}}) +  // replaces that of group F
            Group("F", "ScalarKeys", {{"a.b.c", "sig_fig", "9"}}) +
            Group("H", "ScalarKeyPrefixes",
                  {{"a.", "sig_fig", "2"}, {"a.b.c.d", "sig_fig", "3"}, {"a.b", "sig_fig", "4"}}) +
            Group("I", "DistributionKeyPrefixes", {{"", "x", "9"}}));
  const TLConfig config = load();
  const std::pair<const char*, const char*> cases[] = {
      {"a.b.c", "1"}, {"a.x", "2"}, {"a.b.c.d.e", "3"}, {"a.b.c.", "4"}, {"a", "-"}, {"A.x", "-"}};
  for (const auto& [key, expected] : cases) {
    EXPECT_EQ(sigFig(config.configOptionsForScalarKey(key)), expected) << key;
  }
  EXPECT_TRUE(config.configOptionsForDistributionKey("anything")) << "an empty prefix matches all";
  EXPECT_EQ(device.log.at(LogLevel::kDebug).front(), "prefix match a. for a.x");
}

TEST_F(ConfigTest, TaskingSwitchesGroupsOff) {
  whitelist(Group("Absent", "ScalarKeys", {{"absent", "sig_fig", "1"}}) +
            Group("Off", "ScalarKeys", {{"off", "sig_fig", "1"}}) +
            Group("On", "ScalarKeys", {{"on", "sig_fig", "1"}}) +
            Group("Text", "ScalarKeys", {{"text", "sig_fig", "1"}}) +
            Group("InternalTesting", "ScalarKeys", {{"internal", "sig_fig", "1"}}));
  device.preferences.DGWPreferencesSetValue("Off", PropertyValue(false), "nuvex.da");
  device.preferences.DGWPreferencesSetValue("On", PropertyValue(true), "nuvex.da");
  device.preferences.DGWPreferencesSetValue("Text", PropertyValue("no"), "nuvex.da");
  const auto allowed = [&](const TLConfig& config) {
    std::string keys;
    for (const char* key : {"absent", "off", "on", "text", "internal"}) {
      const auto options = config.configOptionsForScalarKey(key);
      if (options && !options->empty()) keys += std::string(key) + " ";
    }
    return keys;
  };
  EXPECT_EQ(allowed(load()), "absent on text ");
  EXPECT_EQ(device.log.at(LogLevel::kDefault),
            std::vector<std::string>{"keyGroup Off is disabled by tasking"});

  FakePlatform internal;
  internal.environment.files = device.environment.files;
  internal.deviceInfo.answers["InternalBuild"] = true;
  internal.preferences.DGWPreferencesSetValue("Off", PropertyValue(false), "nuvex.da");
  const auto config = TLConfig::init(internal.services);
  EXPECT_EQ(allowed(*config), "absent off on text internal ");
  EXPECT_EQ(text(config->configOptionsForScalarKey("unknown")), "{}");
  EXPECT_EQ(internal.log.lines.back().second,
            "passing @{} for unknown as device is Nuvex Internal");
}

TEST_F(ConfigTest, FaultyEntriesAreSkippedWithOneLineEach) {
  whitelist(
      "<key>G</key><dict><key>ScalarKeys</key><dict><key>good</key><dict/>"
      "<key>bad</key><string>x</string></dict>"
      "<key>DistributionKeys</key><array/><key>ScalarKeyz</key><true/></dict>"
      "<key>H</key><integer>1</integer>");
  EXPECT_TRUE(load().configOptionsForScalarKey("good"));
  EXPECT_EQ(device.log.errors(),
            (std::vector<std::string>{
                "Skipping whitelist entry DistributionKeys of keyGroup G: it is not a dictionary",
                "Skipping whitelist entry bad of keyGroup G: it has options that are not a "
                "dictionary",
                "Skipping keyGroup H: it is not a dictionary"}));
}

TEST_F(ConfigTest, AnEntryAnswersUpToTheDayOnWhichItExpires) {
  const auto table = [](const char* name, const char* entries) {
    return std::string("<key>") + name + "</key><dict>" + entries + "</dict>";
  };
  const std::string date = "<dict><key>expires</key><date>1970-01-11T23:59:59Z</date></dict>";
  const std::string worded = "<dict><key>expires</key><string>1970-01-11</string></dict>";
  whitelist("<key>G</key><dict>" + table("ScalarKeys", ("<key>a.x</key>" + date).c_str()) +
            table("ScalarKeyPrefixes", ("<key>a.</key><dict/><key>a.y</key>" + worded).c_str()) +
            "</dict>");
  for (const bool isInternal : {false, true}) {
    if (isInternal) makeInternal();
    TLConfig config = load();
    for (const std::int32_t day : {10, 11}) {
      config.setReportedDay(day);
      EXPECT_EQ(config.configOptionsForScalarKey("a.x").has_value(), day == 10) << "hides a.";
      EXPECT_EQ(text(config.configOptionsForScalarKey("a.yz")) == "{}", day == 11) << "passed over";
    }
  }
}

TEST_F(ConfigTest, AnUnknownOptionIsToldAndItsEntryUsed) {
  whitelist(Group("G", "ScalarKeys",
                  {{"k", "sig_figs", "1"}, {"ok", "sig_fig", "1"}, {"ok.why", "why", "1"}}));
  EXPECT_TRUE(load().configOptionsForScalarKey("k"));
  EXPECT_EQ(device.log.errors(),
            std::vector<std::string>{"Whitelist entry k: \"sig_figs\" is not an option, did you "
                                     "mean \"sig_fig\"?"});
}

TEST(KeyOptionFaults, NameEachOptionThatWillNotWorkAsMeant) {
  const auto bounds = [](std::initializer_list<double> numbers) {
    Array array;
    for (const double number : numbers) array.push_back(Double(number));
    return PropertyValue(array);
  };
  constexpr auto kScalar = KeyKind::kScalar;
  constexpr auto kDistribution = KeyKind::kDistribution;
  const double infinity = std::numeric_limits<double>::infinity();
  const struct {
    KeyKind kind;
    std::string name;
    PropertyValue value;
    std::string fault;
  } cases[] = {
      {kScalar, "sig_fig", Int64(2), ""},
      {kScalar, "sig_fig", Int64(-1), "\"sig_fig\" is negative"},
      {kScalar, "bucket_interval", "100", "\"bucket_interval\" is not a number"},
      {kScalar, "intervals", bounds({1}), "\"intervals\" is for distributions only"},
      {kDistribution, "sig_fig", Int64(2), "\"sig_fig\" is for scalars only"},
      {kDistribution, "intervals", bounds({-infinity, 1, 2, infinity}), ""},
      {kDistribution, "intervals", bounds({}), ""},
      {kDistribution, "intervals", bounds({1, 1}), "\"intervals\" has bounds that do not ascend"},
      {kDistribution, "intervals", bounds({2, 1}), "\"intervals\" has bounds that do not ascend"},
      {kDistribution, "intervals", bounds({NAN}),
       "\"intervals\" holds something that is not a number"},
      {kDistribution, "interval", bounds({1}),
       "\"interval\" is not an option, did you mean \"intervals\"?"},
      {kScalar, "bucketinterval", Int64(1),
       "\"bucketinterval\" is not an option, did you mean \"bucket_interval\"?"},
      {kScalar, "round", Int64(1), "\"round\" is not an option"},
      {kScalar, "", Int64(1), "\"\" is not an option"},
      {kScalar, std::string(100'000, 's'), Int64(1),
       "\"" + std::string(100'000, 's') + "\" is not an option"},
      {kScalar, "why", "asked for", ""},
      {kDistribution, "why", true, "\"why\" is not a text"},
      {kDistribution, "expires", Date{0}, ""},
      {kScalar, "expires", "2026-02-28", ""},
      {kScalar, "expires", "2026-02-29", "\"expires\" is neither a date nor \"YYYY-MM-DD\""},
      {kScalar, "expires", Int64(1), "\"expires\" is neither a date nor \"YYYY-MM-DD\""},
  };
  for (const auto& [kind, name, value, fault] : cases) {
    const auto faults = KeyOptionFaults(Dictionary{{name, value}}, kind);
    EXPECT_EQ(faults, fault.empty() ? std::vector<std::string>() : std::vector{fault}) << name;
  }
}

TEST_F(ConfigTest, WithoutAUsableFileThereIsNoConfig) {
  EXPECT_FALSE(TLConfig::init(device.services));
  EXPECT_EQ(device.log.errors(), std::vector<std::string>{"Couldn't load whitelist"});
  for (const char* document : {"", "garbage", "<plist><dict><key>a</key></dict></plist>",
                               "<plist version=\"1.0\"><array/></plist>", "bplist00\x01\x02"}) {
    device.log.lines.clear();
    device.environment.files[std::string(kWhitelistPath)] = document;
    EXPECT_FALSE(TLConfig::init(device.services)) << document;
    ASSERT_EQ(device.log.errors().size(), 1u) << document;
    EXPECT_TRUE(device.log.errors()[0].starts_with(
        "Couldn't parse the contents of the config file. Error: "))
        << device.log.errors()[0];
  }
}

}  // namespace
}  // namespace quorlet
