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
  EXPECT_EQ(device.diagnostics.logs.size(), 3u) << "finished passes keep their logs";
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

TEST_F(RunDriverTest, MissingDaysAreClosedOnce) {
  using DayNumbers = std::vector<std::int32_t>;
  DayNumbers closed;
  const auto note = [&](std::int32_t day) { closed.push_back(day); };
  for (std::int32_t day = 19990; day < 19997; ++day) device.counterStore.scalars.erase({"s", day});
  device.counterStore.hasScalar("s", 19968, 1);                 // 31 days before yesterday
  device.counterStore.hasDistribution("unlisted", 19969, {1});  // closed without a log
  const DayNumbers missing = {19969, 19997, 19998};
  EXPECT_EQ(driver.missingDays(), missing);
  device.passLock.isFree = false;
  EXPECT_FALSE(driver.closeMissingDays(note));
  device.passLock.isFree = true;
  device.diagnostics.diskIsFull = true;
  EXPECT_FALSE(driver.closeMissingDays(note));
  EXPECT_EQ(closed, DayNumbers{19969}) << "the day that has nothing to report";
  device.diagnostics.diskIsFull = false;
  EXPECT_TRUE(driver.closeMissingDays(note));
  EXPECT_EQ(closed, missing);
  EXPECT_EQ(device.diagnostics.logs.size(), 2u);
  EXPECT_EQ(device.crashSupport.dumps + recordedDay(), 0) << "nothing else of a pass";
  // A pass closes its day where its logs are wanted.
  driver.runDailyTasksIfNewDay(std::nullopt);
  device.clock.goToDay(20002);
  device.diagnostics.submissionEnabled = false;
  driver.runDailyTasksIfNewDay(std::nullopt);
  device.diagnostics.submissionEnabled = true;
  device.clock.goToDay(20003);
  EXPECT_EQ(driver.missingDays(), (DayNumbers{20000, 20001}));
  device.counterStore.isUnreadable = true;
  EXPECT_EQ(driver.missingDays(), std::nullopt);
  EXPECT_FALSE(driver.closeMissingDays(note));
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
