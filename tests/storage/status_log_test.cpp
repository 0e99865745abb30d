#include "storage/status_log.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cmath>
#include <stdexcept>

#include "fakes/fake_platform.h"

namespace quorlet {
namespace {

constexpr char kDomain[] = "nuvex.diagwell.quorlet";

std::optional<PropertyValue> LastLoggedAt(FakePlatform& device) {
  return device.preferences.DGWPreferencesGetValue("SSLastLoggedAt", kDomain);
}

TEST(StatusLog, WholeLog) {
  FakePlatform device;
  device.clock.seconds = 1772600767.5;
  device.deviceInfo.answers["InverseDeviceID"] = "key-1";
  // clang-format off
  const Dictionary values{
      {"UserWamp", Double(1.234)}, {"Single", Single(0.5F)}, {"nuvex.NumFlushes", Int64(42)},
      {"Infinite", Double(INFINITY)}, {"ValidityList[2]", Array{Int32(3), "x", Double(5.5)}},
      {"NoNumbers", Array{"3"}}, {"Text", "3"}, {"Boolean", true}};
  // clang-format on
  NLW_WriteLog(device.services, "165", &values);
  const SubmittedLog& log = device.diagnostics.logs.at(0);
  EXPECT_EQ(log.typeCode + " " + log.name, "165 StorageStatus");
  EXPECT_EQ(log.body,
            "System ID: system-1\nHardware Model: Model 9\nOS Version: TestOS 1 (A1)\n"
            "Date: 2026-03-04 05:06:07 +0000\nIncident ID: INCIDENT-1\nFaultScribe Key: key-1\n\n"
            "2026-03-04 05:06:07 +0000 quorlet[" +
                std::to_string(getpid()) +
                "]: Infinite:inf;Single:0.50;UserWamp:1.23;ValidityList[2]:3,x,5.5;"
                "nuvex.NumFlushes:42\n");
  EXPECT_EQ(LastLoggedAt(device), PropertyValue(Date{1772600767.5}));
  EXPECT_EQ(device.preferences.synchronized, std::vector<std::string>{kDomain});
}

TEST(StatusLog, OnceAWeek) {
  FakePlatform device;
  const Dictionary empty;
  device.preferences.DGWPreferencesSetValue("SSLastLoggedAt", "no date", kDomain);
  NLW_WriteLog(device.services, "165", nullptr);
  NLW_WriteLog(device.services, "165", &empty);
  device.clock.seconds += 604799;
  NLW_WriteLog(device.services, "165", &empty);
  ASSERT_EQ(device.diagnostics.logs.size(), 1U);
  EXPECT_NE(device.diagnostics.logs[0].body.find(": error\n\n"), std::string::npos);
  EXPECT_TRUE(device.diagnostics.logs[0].body.ends_with("]: \n"));
  device.clock.seconds += 1;
  device.diagnostics.diskIsFull = true;
  NLW_WriteLog(device.services, "165", &empty);
  EXPECT_EQ(LastLoggedAt(device), PropertyValue(device.clock.now()));

  struct Failing : FakeCrashSupport {
    std::string GetHardwareModel() override { throw std::runtime_error("no model"); }
  } failing;
  Platform services = device.services.with({.crashSupport = &failing});
  device.clock.seconds += 604800;
  NLW_WriteLog(services, "165", &empty);
  EXPECT_NE(LastLoggedAt(device), PropertyValue(device.clock.now()));
  EXPECT_EQ(device.log.at(LogLevel::kDefault),
            (std::vector<std::string>{"NANDLogWriter:Last written at 2024-10-04 12:00:00 +0000 "
                                      "current 2024-10-11 11:59:59 +0000 :skipped",
                                      "An exception occurred: no model"}));
}

}  // namespace
}  // namespace quorlet
