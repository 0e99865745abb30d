#include "driver/run_driver.h"

#include <gtest/gtest.h>

#include "driver/consent.h"
#include "fakes/fake_platform.h"
#include "fakes/whitelist.h"
#include "report/config.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr char kDomain[] = "nuvex.aggregated.quorlet";
constexpr char kLastDay[] = "LastCrashLogSerializationDateInDaysSince1970";

// Today is day 20000, and there is something to report for yesterday.
class RunDriverTest : public testing::Test {
 protected:
  RunDriverTest() {
    device.environment.files[std::string(kWhitelistPath)] =
        Plist("<dict>" + Group("G", "ScalarKeys", {{"s", "", ""}}) + "</dict>");
    for (std::int32_t day = 19990; day < 20010; ++day) device.counterStore.hasScalar("s", day, day);
  }
  std::int64_t recordedDay() {
    return device.preferences.DGWPreferencesGetIntegerValue(kLastDay, kDomain);
  }
  // The days that passes ran for since the last call.
  std::vector<std::string> passes() {
    std::vector<std::string> days;
    for (const std::string& line : device.log.at(LogLevel::kDefault)) {
      if (line.starts_with("daily tasks for day ") || line.starts_with("Day unchanged")) {
        days.push_back(line.substr(line.rfind(' ') + 1));
      }
    }
    device.log.lines.clear();
    return days;
  }

  FakePlatform device;
  RunDriver driver{device.services};
};

using Days = std::vector<std::string>;

TEST_F(RunDriverTest, TheGateRunsOnePassForEachYesterday) {
  driver.runDailyTasksIfNewDay(std::nullopt);
  EXPECT_EQ(passes(), Days{"19999"});
  EXPECT_EQ(recordedDay(), 19999);
  EXPECT_TRUE(device.preferences.isDurable(kLastDay, kDomain));
  driver.runDailyTasksIfNewDay(std::nullopt);
  EXPECT_EQ(passes(), Days{"run"});

  device.clock.goToDay(20005);
  driver.runDailyTasksIfNewDay(std::nullopt);
  EXPECT_EQ(passes(), Days{"20004"}) << "the days in between are not processed";
  device.clock.goToDay(20003);
  driver.runDailyTasksIfNewDay(std::nullopt);
  EXPECT_EQ(passes(), Days{"run"}) << "the clock was set back";
  EXPECT_EQ(device.diagnostics.logs.size(), 2u);
}

TEST_F(RunDriverTest, UngatedPassesLeaveTheGateAlone) {
  driver.runDailyTasks(19999, std::nullopt);
  driver.runDailyTasks(19999, std::nullopt);
  EXPECT_EQ(recordedDay(), 0);
  driver.runDailyTasksIfNewDay(std::nullopt);
  EXPECT_EQ(passes(), (Days{"19999", "19999", "19999"}));
}

TEST_F(RunDriverTest, WithoutSubmissionTheOtherStepsStillRun) {
  device.diagnostics.submissionEnabled = false;
  driver.runDailyTasksIfNewDay(std::nullopt);
  EXPECT_TRUE(device.diagnostics.logs.empty());
  EXPECT_EQ(device.log.errors(), std::vector<std::string>{}) << "no report was made";
  EXPECT_EQ(device.crashSupport.dumps, 1);
  EXPECT_EQ(device.crashSupport.rolls, 1);
  EXPECT_EQ(recordedDay(), 19999);
}

TEST_F(RunDriverTest, AStepThatThrowsEndsNeitherThePassNorTheLock) {
  struct Failing : FakeCrashSupport {
    void FSDumpAllOldStructuredDataLogs() override { throw std::bad_alloc(); }
  } failing;
  Platform platform = device.services.with({.crashSupport = &failing});
  RunDriver(platform).runDailyTasksIfNewDay(std::nullopt);
  EXPECT_EQ(device.log.errors().size(), 1u);
  EXPECT_EQ(failing.rolls, 1);
  EXPECT_FALSE(device.passLock.held);
  EXPECT_EQ(recordedDay(), 19999);
}

// Kills the process at any change of the preferences, the counter store, the spool or the
// structured log, before it is made.
struct Killed {};

class DyingStore final : public CounterStore {
 public:
  DyingStore(CounterStore& store, std::function<void()> step) : store_(store), step_(step) {}
  std::int32_t TLDaysSince1970() override { return store_.TLDaysSince1970(); }
  Date dateForDaysSince1970(std::int32_t day) override { return store_.dateForDaysSince1970(day); }
  void TLClientCheckpoint() override { store_.TLClientCheckpoint(); }
  bool write(const StoreChanges& changes) override {
    step_();
    return store_.write(changes);
  }
  bool readNote(std::string_view name, std::optional<Dictionary>& value) override {
    return store_.readNote(name, value);
  }
  std::unique_ptr<TLHistory> initWithDefaultPath() override { return store_.initWithDefaultPath(); }

 private:
  CounterStore& store_;
  std::function<void()> step_;
};

// One day's pass, killed at step after step and repeated, always ends in the same state.
TEST_F(RunDriverTest, AKilledPassIsRepeatedNotDoubled) {
  device.environment.files[std::string(kWhitelistPath)] =
      Plist("<dict>" +
            Group("G", "ScalarKeys",
                  {{"s", "", ""}, {"nuvex.diagwell.tallyd.database.corruptions", "", ""}}) +
            "</dict>");
  const auto count = [&] {
    return device.preferences.DGWPreferencesGetIntegerValue("DatabaseCorruptionCount",
                                                            "nuvex.aggregated");
  };
  int kills = 0;
  bool isKilled = true;
  for (int last = 1; isKilled; ++last) {
    SCOPED_TRACE(last);
    device.diagnostics.logs.clear();
    device.preferences.addToInteger("DatabaseCorruptionCount", 3 - count(), "nuvex.aggregated");
    device.preferences.DGWPreferencesSynchronize("nuvex.aggregated");
    device.diagnostics.osVersion += "x";
    device.clock.goToDay(device.counterStore.TLDaysSince1970() + 1);
    const std::int32_t yesterday = device.counterStore.TLDaysSince1970() - 1;
    device.counterStore.hasScalar("s", yesterday, 7);
    device.networkUsage.records = {Dictionary{{"procName", "p"},
                                              {"since", Date{20000 * 86400.0}},
                                              {"wifiInBytes", Int64(last * 102400)},
                                              {"wifiOutBytes", Int64(0)},
                                              {"wwanInBytes", Int64(0)},
                                              {"wwanOutBytes", Int64(0)}}};
    int steps = 0;
    const auto step = [&] {
      if (++steps == last) throw Killed();
    };
    device.preferences.beforeChange = step;
    DyingStore store(device.counterStore, step);
    Platform platform = device.services.with({.counterStore = &store});
    isKilled = false;
    try {
      RunDriver(platform).runDailyTasksIfNewDay(Array{"app"});
    } catch (const Killed&) {
      isKilled = true;
      ++kills;
      device.preferences.crash();
      device.kernelParameters.taken.clear();
    }
    device.preferences.beforeChange = nullptr;
    if (isKilled) RunDriver(device.services).runDailyTasksIfNewDay(std::nullopt);
    EXPECT_EQ(recordedDay(), yesterday);
    ASSERT_EQ(device.diagnostics.logs.size(), 1u);
    const SubmittedLog& log = device.diagnostics.logs[0];
    ASSERT_TRUE(log.metadata);
    EXPECT_EQ(*log.metadata->find("previous_os_version"),
              last == 1 ? PropertyValue("<unknown>")
                        : PropertyValue(device.diagnostics.osVersion.substr(
                              0, device.diagnostics.osVersion.size() - 1)));
    const auto document = std::get<PropertyValue>(ReadPropertyList(log.body));
    const Dictionary& scalars = *document.asDictionary()->find("TLScalars")->asDictionary();
    EXPECT_EQ(*scalars.find("nuvex.diagwell.tallyd.database.corruptions"), Int64(3));
    EXPECT_EQ(count(), 0);
    // Killed before it had the records, the pass could not keep them.
    if (steps > 1) {
      EXPECT_NE(document.asDictionary()->find("TLActivatedAppInfo"), nullptr);
    }
    std::int64_t growth = 0;
    for (const auto& [row, value] : device.counterStore.scalars) {
      if (row.first == "datausage.wifiInKB.nuvex.p") growth += value;
    }
    EXPECT_EQ(growth, last * 100) << "network usage, exactly once";
  }
  EXPECT_GT(kills, 8);
}

TEST_F(RunDriverTest, FinishedPassesKeepTheirLogs) {
  for (int i = 0; i < 2; ++i) driver.runDailyTasks(19999, std::nullopt);
  driver.runDailyTasksIfNewDay(std::nullopt);
  EXPECT_EQ(device.diagnostics.logs.size(), 3u);
}

TEST_F(RunDriverTest, TheGateStaysShutWhileItCannotBeKnown) {
  device.passLock.isFree = false;
  driver.runDailyTasksIfNewDay(std::nullopt);
  device.passLock.isFree = true;
  device.preferences.unreadable.insert(kDomain);
  driver.runDailyTasksIfNewDay(std::nullopt);
  device.preferences.unreadable.clear();
  device.preferences.DGWPreferencesSetValue(kLastDay, Int32(30000), kDomain);
  driver.runDailyTasksIfNewDay(std::nullopt);
  EXPECT_EQ(device.log.errors().size(), 3u);
  EXPECT_TRUE(device.diagnostics.logs.empty());
}

TEST_F(RunDriverTest, ALostLogIsSaidAndWhatItUsedUpStandsInTheNext) {
  device.diagnostics.diskIsFull = true;
  driver.runDailyTasksIfNewDay(Array{"app"});
  EXPECT_EQ(device.log.errors().back(),
            "The log of day 19999 is not in the spool; \"quorlet -f\" repeats it");
  device.diagnostics.diskIsFull = false;
  driver.runDailyTasks(19999, std::nullopt);
  ASSERT_EQ(device.diagnostics.logs.size(), 1u);
  EXPECT_TRUE(device.diagnostics.logs[0].metadata);
  EXPECT_NE(device.diagnostics.logs[0].body.find("TLActivatedAppInfo"), std::string::npos);
  device.counterStore.isUnreadable = true;
  device.counterStore.scalars.clear();
  device.log.lines.clear();
  driver.runDailyTasks(19998, std::nullopt);
  EXPECT_EQ(
      device.log.errors().back(),
      "The log of day 19998 is not in the spool; \"quorletctl send run-day 19998\" repeats it");
}

TEST_F(RunDriverTest, WhatWasCountedWithoutConsentIsNeverReported) {
  device.diagnostics.submissionEnabled = false;
  ASSERT_TRUE(giveConsent(device.services, false));
  EXPECT_TRUE(device.counterStore.scalars.empty());
  EXPECT_EQ(consentOf(device.preferences), Consent::kOn);
  ASSERT_TRUE(withdrawConsent(device.services));
  EXPECT_EQ(consentOf(device.preferences), Consent::kOff);
  // Cut short after the consent: the pass drops what is due first, and drops it once.
  device.counterStore.hasScalar("s", 19999, 1);
  device.counterStore.isFull = true;
  EXPECT_FALSE(giveConsent(device.services, false));
  EXPECT_EQ(consentOf(device.preferences), Consent::kOn);
  device.diagnostics.submissionEnabled = true;
  driver.runDailyTasks(19999, std::nullopt);
  EXPECT_TRUE(device.diagnostics.logs.empty());
  device.counterStore.isFull = false;
  driver.runDailyTasks(19999, std::nullopt);
  EXPECT_TRUE(device.diagnostics.logs.empty()) << "nothing is left to report";
  device.counterStore.hasScalar("s", 19999, 1);
  EXPECT_TRUE(giveConsent(device.services, false)) << "given already: nothing changes";
  driver.runDailyTasks(19999, std::nullopt);
  EXPECT_EQ(device.diagnostics.logs.size(), 1u);
}

}  // namespace
}  // namespace quorlet
