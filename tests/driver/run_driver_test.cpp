#include "driver/run_driver.h"

#include <gtest/gtest.h>

#include "fakes/fake_platform.h"
#include "fakes/whitelist.h"
#include "report/config.h"

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

}  // namespace
}  // namespace quorlet
