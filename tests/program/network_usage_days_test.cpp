// Network usage over three days of the program, with a shifted clock and files as a device has
// them.
#include <gtest/gtest.h>

#include "program/program_device.h"

namespace quorlet {
namespace {

constexpr int kFirstDay = 20516;  // 2026-03-04

std::string Usage(const std::string& nameKey, const std::string& name, const std::string& since,
                  std::initializer_list<std::int64_t> counts) {
  std::string record = "<dict><key>" + nameKey + "</key><string>" + name +
                       "</string><key>since</key><date>" + since + "</date>";
  const char* const fields[] = {"wifiInBytes", "wifiOutBytes", "wwanInBytes", "wwanOutBytes"};
  const char* const* field = fields;
  for (const std::int64_t count : counts) {
    record +=
        std::string("<key>") + *field++ + "</key><integer>" + std::to_string(count) + "</integer>";
  }
  return record + "</dict>";
}

struct NetworkUsageDays : testing::Test, ProgramDevice {
  // One pass at noon of a day; the counters of network usage that the day then has.
  std::vector<std::string> pass(int day, const std::string& records) {
    device.write("/var/db/vigil/usage.plist", Plist("<array>" + records + "</array>"));
    const std::string noon = "@2026-03-0" + std::to_string(4 + day) + " 12:00:00";
    const auto run =
        RunProgram("/usr/bin/faketime", {"-f", noon, QUORLET_PROGRAM, "-d"}, setting());
    EXPECT_EQ(run.status, 0) << run.err;
    const auto dump = RunProgram(
        QUORLETCTL_PROGRAM, {"tally", "dump", "--day", std::to_string(kFirstDay + day)}, setting());
    std::vector<std::string> counters;
    std::istringstream lines(dump.out);
    for (std::string line; std::getline(lines, line);) {
      const std::size_t key = line.find("\tdatausage.");
      if (key != std::string::npos) counters.push_back(line.substr(key + 11));
    }
    return counters;
  }
};

TEST_F(NetworkUsageDays, TheCountersAreThoseOfAHandComputedTable) {
  using Counters = std::vector<std::string>;
  const std::string boot = "2026-03-04T06:00:00Z";
  const std::string longAgo = "2026-02-20T00:00:00Z";
  // The first pass counts everything that began since yesterday began.
  EXPECT_EQ(pass(0, Usage("procName", "web", boot, {5000, 2048, 0, 1023}) +
                        Usage("bundleName", "org.app", boot, {1 << 20, 0, 0, 0}) +
                        Usage("procName", "old", longAgo, {900000, 1, 2, 3})),
            (Counters{"olddata.nuvex.old\t1", "wifiInKB.nuvex.web\t4", "wifiInKB.org.app\t1024",
                      "wifiOutKB.nuvex.web\t2"}));
  // web grew by 5000, 1000 and 2000 bytes; org.app lost two counts; old grew by 1024 bytes.
  EXPECT_EQ(pass(1, Usage("procName", "web", boot, {10000, 3048, 2000, 1023}) +
                        Usage("bundleName", "org.app", boot, {0, 0, 4096, -1}) +
                        Usage("procName", "old", longAgo, {901024, 1, 2, 3})),
            (Counters{"baddata.org.app\t2", "wifiInKB.nuvex.old\t1", "wifiInKB.nuvex.web\t4",
                      "wwanInKB.nuvex.web\t1", "wwanInKB.org.app\t4"}));
  // web began anew; the day's second pass is no pass.
  const std::string third = Usage("procName", "web", "2026-03-06T11:00:00Z", {3000, 0, 0, 0}) +
                            Usage("bundleName", "org.app", boot, {1024, 0, 4096, -1});
  const Counters expected{"wifiInKB.nuvex.web\t2", "wifiInKB.org.app\t1"};
  EXPECT_EQ(pass(2, third), expected);
  EXPECT_EQ(pass(2, Usage("procName", "web", boot, {1 << 30, 0, 0, 0})), expected);
  EXPECT_EQ(lines("error"), Counters{});
}

}  // namespace
}  // namespace quorlet
