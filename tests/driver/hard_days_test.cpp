// Passes whose services fail, or that are killed, beside a plain model of what must come of them.
#include <gtest/gtest.h>

#include <cstdlib>
#include <map>
#include <random>
#include <set>
#include <string>

#include "driver/run_driver.h"
#include "fakes/failing_platform.h"
#include "fakes/fake_platform.h"
#include "fakes/whitelist.h"
#include "report/config.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr char kDomain[] = "nuvex.aggregated.quorlet";
constexpr char kGateDay[] = "LastCrashLogSerializationDateInDaysSince1970";
constexpr char kCountDomain[] = "nuvex.aggregated";
constexpr char kCount[] = "DatabaseCorruptionCount";
constexpr char kCorruptions[] = "nuvex.diagwell.tallyd.database.corruptions";
constexpr char kEvents[] = "kern.next_ecc_event";
constexpr char kScalar[] = "s";
constexpr char kValues[] = "v";

// A device in use, and what was put into it.
class HardDays {
 public:
  HardDays() {
    device.environment.files[std::string(kWhitelistPath)] =
        Plist("<dict>" + Group("G", "ScalarKeys", {{kScalar, "", ""}, {kCorruptions, "", ""}}) +
              Group("H", "DistributionKeys", {{kValues, "", ""}}) + "</dict>");
    // A controller that answers nothing, and a driver with a channel of the daily category.
    device.driverRegistry.entries.emplace_back().className = "FSPStorage";
    FakeEntry driver;
    driver.properties["DrvReportLegendPublic"] = true;
    driver.properties["DrvReportLegend"] = Array{Dictionary{
        {"DrvReportChannels", Array{PropertyValue(Array{Int64(1), Int64(0x100000001), "c"})}}}};
    device.driverRegistry.entries.push_back(driver);
    Drive& drive = device.drives.drives.emplace_back();
    drive.place = "slot";
    drive.figures.set(DriveFigure::kUsed, 5);
  }

  std::int32_t today() { return device.counterStore.TLDaysSince1970(); }
  std::int64_t recordedDay() {
    return device.preferences.DGWPreferencesGetIntegerValue(kGateDay, kDomain);
  }

  void count(std::int64_t amount) {
    StoreChanges changes;
    changes.scalars.push_back({ScalarChange::Kind::kAdd, kScalar, amount, today()});
    ASSERT_TRUE(device.counterStore.write(changes));
    counted[today()] += amount;
  }
  void record(double value) {
    device.counterStore.hasDistribution(kValues, today(), {value});
    ++recorded[today()];
  }
  void transfer(std::int64_t kibibytes) {
    transferred += kibibytes;
    device.networkUsage.records = {Dictionary{{"procName", "p"},
                                              {"since", Date{20000 * 86400.0}},
                                              {"wifiInBytes", Int64(transferred * 1024)},
                                              {"wifiOutBytes", Int64(0)},
                                              {"wwanInBytes", Int64(0)},
                                              {"wwanOutBytes", Int64(0)}}};
  }
  void suffer() {
    std::string event(72, '\0');
    event[0] = static_cast<char>(++events);
    event[1] = 1;
    device.kernelParameters.queues[kEvents].push_back(event);
    device.preferences.addToInteger(kCount, 1, kCountDomain);
    device.preferences.DGWPreferencesSynchronize(kCountDomain);
    ++corruptions;
  }
  void update() { device.diagnostics.osVersion += "x"; }

  // A gated pass, some calls of which fail; false when it was killed.
  bool pass(Strike strike) {
    FailingPlatform failing(device.services, std::move(strike));
    Platform platform = failing.services();
    try {
      RunDriver(platform).runDailyTasksIfNewDay(std::nullopt);
      EXPECT_FALSE(device.passLock.held);
      // At its end a process tries once more to write what it could not.
      for (const char* domain : {kDomain, kCountDomain}) {
        device.preferences.DGWPreferencesSynchronize(domain);
      }
      return true;
    } catch (const Killed&) {
      // What is not durable is gone with the process.
      device.preferences.crash();
      device.kernelParameters.taken.clear();
      device.crashSupport.isStaging = false;
      device.passLock.held = false;
      return false;
    }
  }
  bool pass() {
    return pass([](const char*) { return false; });
  }

  // The bodies of the aggregated logs of `day`.
  std::vector<Dictionary> logsOf(std::int32_t day) {
    std::vector<Dictionary> found;
    for (const SubmittedLog& log : device.diagnostics.logs) {
      if (log.name != "log-aggregated") continue;
      const auto document = ReadPropertyList(log.body);
      const Dictionary& body = *std::get<PropertyValue>(document).asDictionary();
      if (*body.find("TLStartDate") == PropertyValue(Date{day * 86400.0})) found.push_back(body);
    }
    return found;
  }

  // The OS versions that logs name as those before.
  std::vector<std::string> versionsTold() {
    std::vector<std::string> versions;
    for (const SubmittedLog& log : device.diagnostics.logs) {
      if (log.metadata) versions.push_back(*StringEntry(*log.metadata, "previous_os_version"));
    }
    return versions;
  }

  // A day's log tells what was put in on that day.
  void expectLogOf(std::int32_t day) {
    const auto logs = logsOf(day);
    ASSERT_EQ(logs.size(), 1U) << day;
    const Dictionary& scalars = *logs[0].find("TLScalars")->asDictionary();
    EXPECT_EQ(IntegerEntry(scalars, kScalar).value_or(0), counted[day]) << day;
    const Dictionary& distributions = *logs[0].find("TLDistributions")->asDictionary();
    const PropertyValue* numbers = distributions.find(kValues);
    ASSERT_EQ(numbers != nullptr, recorded.contains(day)) << day;
    if (numbers != nullptr) {
      EXPECT_EQ((*numbers->asArray())[4], Int64(recorded[day])) << day;
    }
  }

  // After a pass that nothing hindered: what was put in has been told, or waits to be, once.
  void expectNothingLostOrDoubled() {
    std::int64_t growth = 0;
    for (const auto& [row, value] : device.counterStore.scalars) {
      if (row.first == "datausage.wifiInKB.nuvex.p") growth += value;
    }
    EXPECT_EQ(growth, transferred) << "network usage";
    // A drive's wear is stored together with which drive it is of.
    const auto worn = device.counterStore.scalars.lower_bound({"nuvex.flash.slot.used", 0});
    if (worn != device.counterStore.scalars.end() && worn->first.first.starts_with("nuvex.flash")) {
      EXPECT_TRUE(device.counterStore.notes.contains("flash"));
    }
    std::set<std::string> seen;
    for (const auto& [type, entry] : device.crashSupport.entries) {
      if (type == 172) seen.insert(PropertyValue(entry).description());
    }
    for (const std::string& event : device.kernelParameters.queues[kEvents]) seen.insert(event);
    EXPECT_EQ(seen.size(), static_cast<std::size_t>(events)) << "ECC events";
    std::int64_t told = 0;
    for (const SubmittedLog& log : device.diagnostics.logs) {
      if (log.name != "log-aggregated") continue;
      const auto document = ReadPropertyList(log.body);
      const Dictionary& body = *std::get<PropertyValue>(document).asDictionary();
      told += IntegerEntry(*body.find("TLScalars")->asDictionary(), kCorruptions).value_or(0);
    }
    const auto waiting = device.preferences.DGWPreferencesGetIntegerValue(kCount, kCountDomain);
    EXPECT_EQ(told + waiting, corruptions) << "corruptions";
    const std::vector<std::string> versions = versionsTold();
    EXPECT_EQ(std::set<std::string>(versions.begin(), versions.end()).size(), versions.size())
        << "an OS version was told twice";
  }

  FakePlatform device;
  std::map<std::int32_t, std::int64_t> counted;  // by day
  std::map<std::int32_t, std::int64_t> recorded;
  std::int64_t transferred = 0;
  std::int64_t corruptions = 0;
  int events = 0;
};

enum class Way { kFails, kThrows, kKills };

// Does the one call with this number in, in the given way.
Strike StrikeAt(int number, Way way, std::string& struck) {
  return [number, way, &struck, calls = 0](const char* call) mutable {
    if (++calls != number) return false;
    struck = call;
    if (way == Way::kThrows) throw std::bad_alloc();
    if (way == Way::kKills) throw Killed();
    return true;
  };
}

TEST(HardDays, EachCallOfEachServiceFailsOnce) {
  for (const Way way : {Way::kFails, Way::kThrows, Way::kKills}) {
    std::string struck = "first";
    int number = 0;
    while (!struck.empty()) {
      ++number;
      SCOPED_TRACE(testing::Message() << "way " << static_cast<int>(way) << ", call " << number);
      HardDays days;
      days.device.clock.goToDay(19999);
      days.count(1);
      days.device.clock.goToDay(20000);
      days.transfer(1000);
      days.pass();
      days.count(7);
      days.record(1);
      days.suffer();
      days.update();
      days.device.clock.goToDay(20001);
      days.count(1);
      days.transfer(100);
      days.device.log.lines.clear();
      struck.clear();
      const int rolls = days.device.crashSupport.rolls;
      bool lived = true;
      try {
        lived = days.pass(StrikeAt(number, way, struck));
      } catch (const std::bad_alloc&) {
        // Out of memory outside of any step: the program says so and ends.
        days.device.passLock.held = false;
      }
      SCOPED_TRACE(struck);
      const bool hasEnded = lived && days.recordedDay() == 20000;
      if (hasEnded && struck != "rotate logs") {
        EXPECT_EQ(days.device.crashSupport.rolls, rolls + 1);
      }
      days.transfer(10);
      days.pass();  // nothing, when the gate is shut
      EXPECT_EQ(days.recordedDay(), 20000);
      if (days.logsOf(20000).empty() && way != Way::kKills) {
        EXPECT_FALSE(days.device.log.errors().empty()) << "a log was lost without a word";
      } else {
        days.expectLogOf(20000);
      }
      days.device.clock.goToDay(20002);
      days.pass();
      days.expectLogOf(20001);
      days.expectNothingLostOrDoubled();
      EXPECT_EQ(days.versionsTold(), (std::vector<std::string>{"<unknown>", "TestOS 1 (A1)"}));
    }
    EXPECT_GT(number, 30);
  }
}

std::uint32_t NumberFrom(const char* variable, std::uint32_t otherwise) {
  const char* text = std::getenv(variable);
  return text != nullptr ? static_cast<std::uint32_t>(std::strtoul(text, nullptr, 10)) : otherwise;
}

// Days of a device's life as they come: the clock goes on, now and then over several days, or is
// set back; every so often passes are killed, or one of their calls fails.
void Live(std::uint32_t seed) {
  constexpr std::int32_t kBorn = 20000;
  constexpr std::int32_t kLastDay = kBorn + 25;  // before the store drops the first days
  std::mt19937 random(seed);
  const auto oneIn = [&](unsigned many) { return random() % many == 0; };
  const auto upTo = [&](unsigned most) { return static_cast<int>(random() % (most + 1)); };
  HardDays days;
  days.device.clock.goToDay(kBorn);
  days.transfer(0);
  days.pass();  // what came before the first one is not this device's to tell
  while (days.today() < kLastDay) {
    for (int times = upTo(3); times > 0; --times) days.count(upTo(9));
    for (int times = upTo(2); times > 0; --times) days.record(1);
    if (oneIn(2)) days.transfer(upTo(1000));
    if (oneIn(4)) days.suffer();
    if (oneIn(5)) days.update();
    days.device.clock.goToDay(days.today() + (oneIn(12) ? -1 : oneIn(8) ? 4 : 1));
    const std::int64_t before = days.recordedDay();
    days.device.log.lines.clear();
    for (int starts = upTo(2); starts > 0; --starts) {
      std::string struck;
      const Way way = oneIn(2) ? Way::kKills : Way::kFails;
      days.pass(StrikeAt(1 + upTo(80), way, struck));
    }
    const bool isTold = days.device.log.errors().empty();
    days.device.log.lines.clear();
    days.pass();
    EXPECT_EQ(days.device.log.errors(), std::vector<std::string>());
    const std::int32_t yesterday = days.today() - 1;
    EXPECT_EQ(days.recordedDay(), std::max<std::int64_t>(before, yesterday));
    const bool hasAnything = days.counted.contains(yesterday) || days.recorded.contains(yesterday);
    if (before < yesterday && hasAnything && (isTold || !days.logsOf(yesterday).empty())) {
      days.expectLogOf(yesterday);
    }
  }
  for (std::int32_t day = kBorn; day < kLastDay; ++day) {
    EXPECT_LE(days.logsOf(day).size(), 1U) << day;
  }
  days.device.clock.goToDay(static_cast<std::int32_t>(days.recordedDay()) + 2);
  days.pass();
  days.expectNothingLostOrDoubled();
}

TEST(HardDays, ManyOfThemInARow) {
  const std::uint32_t first = NumberFrom("QUORLET_SEED", 1);
  const std::uint32_t lives = NumberFrom("QUORLET_LIVES", 30);
  for (std::uint32_t seed = first; seed < first + lives && !HasFailure(); ++seed) {
    SCOPED_TRACE(testing::Message() << "QUORLET_SEED=" << seed << " QUORLET_LIVES=1 repeats this");
    Live(seed);
  }
}

}  // namespace
}  // namespace quorlet
