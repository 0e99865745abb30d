#include "ctl/demo_data.h"

#include <algorithm>
#include <array>
#include <span>
#include <string_view>

#include "ctl/demo_bytes.h"
#include "ctl/demo_drivers.h"
#include "report/config.h"

namespace quorlet {
namespace {

Array Bounds(std::span<const std::int64_t> bounds) {
  Array array;
  for (const std::int64_t bound : bounds) array.push_back(Int64(bound));
  return array;
}

Dictionary SystemMetricKeys() {
  return {{"nuvex.diagwell.tallyd.database.size", Dictionary()},
          {"nuvex.diagwell.tallyd.database.corruptions", Dictionary()},
          {"nuvex.usage.cur_boot_session_cpu_uptime", Dictionary{{kSigFig, Int64(2)}}},
          {"nuvex.kernel.memorystatus_freeze_count", Dictionary()},
          {"nuvex.kernel.memorystatus_freeze_pageouts", Dictionary{{kSigFig, Int64(2)}}},
          {"nuvex.kernel.memorystatus_freeze_budget_pages_remaining", Dictionary()},
          {"nuvex.kernel.memorystatus_thaw_count", Dictionary()},
          {"nuvex.kernel.swapusage", Dictionary{{kSigFig, Int64(2)}}}};
}

Dictionary Whitelist() {
  const Dictionary twoDigits{{kSigFig, Int64(2)}};
  const Dictionary applications{
      {"ScalarKeys", Dictionary{{"nuvex.demo.launches", Dictionary{{kBucketInterval, Int64(100)}}},
                                {"nuvex.demo.crashes", Dictionary()},
                                {"nuvex.tilehall.numAllInstalledApps", Dictionary()},
                                {"nuvex.tilehall.numThirdPartyApps", Dictionary()}}},
      {"DistributionKeys",
       Dictionary{
           {"nuvex.demo.launch.milliseconds",
            Dictionary{{kIntervals, Bounds(std::array<std::int64_t, 4>{100, 200, 400, 800})}}}}}};
  const Dictionary battery{
      {"ScalarKeys", Dictionary{{"nuvex.demo.battery.cycles", Dictionary()}}},
      {"DistributionKeyPrefixes",
       Dictionary{
           {"nuvex.demo.battery.",
            Dictionary{{kIntervals, Bounds(std::array<std::int64_t, 4>{20, 40, 60, 80})}}}}}};
  const Dictionary network{
      {"ScalarKeyPrefixes", Dictionary{{"nuvex.demo.net.", twoDigits}, {"datausage.", twoDigits}}},
      {"DistributionKeys", Dictionary{{"nuvex.demo.latency.milliseconds", Dictionary()}}}};
  const Dictionary storage{
      {"ScalarKeys", Dictionary{{"nuvex.tilehall.DiskUsageUserTotalBlocks", twoDigits},
                                {"nuvex.tilehall.DiskUsageUserBlocksFree",
                                 Dictionary{{kBucketInterval, Int64(100)}, {kSigFig, Int64(2)}}}}},
      {"ScalarKeyPrefixes", Dictionary{{"nuvex.NANDInfo.", Dictionary()}}}};
  return {{"Applications", applications},
          {"Battery", battery},
          {"InternalTesting",
           Dictionary{{"ScalarKeyPrefixes", Dictionary{{"nuvex.internal.", Dictionary()}}}}},
          {"Network", network},
          {"ReportingChannels",
           Dictionary{{"ScalarKeyPrefixes", Dictionary{{"nuvex.drvreport.", Dictionary()}}}}},
          {"Storage", storage},
          {"System", Dictionary{{"ScalarKeys", SystemMetricKeys()}}}};
}

Array UsageRecords(Date since) {
  const auto counts = [since](const char* nameKey, const char* name, std::int64_t wifiIn,
                              std::int64_t wifiOut, std::int64_t wwanIn, std::int64_t wwanOut) {
    return Dictionary{{nameKey, name},
                      {"since", since},
                      {"wifiInBytes", Int64(wifiIn)},
                      {"wifiOutBytes", Int64(wifiOut)},
                      {"wwanInBytes", Int64(wwanIn)},
                      {"wwanOutBytes", Int64(wwanOut)}};
  };
  Dictionary browser = counts("bundleName", "org.example.browser", 52'428'800, 3'145'728, 0, 0);
  browser["procName"] = "browser";
  return {browser, counts("procName", "syncd", 8192, 20'480, 4096, 1024)};
}

std::string DesktopFile(std::string_view name) {
  return std::string("[Desktop Entry]\nType=Application\nName=")
      .append(name)
      .append("\nExec=true\n");
}

// One process with the thread that writes compressed memory to flash.
std::string DemoTaskSnapshot() {
  enum Item : std::uint64_t { kBegin = 0x13, kEnd = 0x14, kIO = 0x901, kName = 0x909 };
  constexpr std::uint64_t kBufferEnd = 0xF19158ED;
  ByteWriter items;
  items.u32(kBegin).u32(4).u64(1).u32(1);
  items.u32(kBegin).u32(4).u64(2).u32(2);
  items.u32(kName).u32(16).u64(0).text("VM_swapout", 16);
  items.u32(kIO).u32(32).u64(0).u64(811).u64(26'574'848).u64(9402).u64(616'169'472);
  items.u32(kEnd).u32(0).u64(2).u32(kEnd).u32(0).u64(1).u32(kBufferEnd).u32(0).u64(0);
  return FileOf(items);
}

struct DemoScalar {
  const char* key;
  std::int64_t value;
};
// The last one is not in the whitelist: no log holds it.
constexpr std::array<DemoScalar, 6> kScalars = {{{"nuvex.demo.launches", 1234},
                                                 {"nuvex.demo.crashes", 2},
                                                 {"nuvex.demo.battery.cycles", 417},
                                                 {"nuvex.demo.net.wifi.bytes", 987'654'321},
                                                 {"nuvex.demo.net.cellular.bytes", 12'345'678},
                                                 {"nuvex.demo.unlisted", 42}}};

struct DemoDistribution {
  const char* key;
  int low;
  int high;
};
constexpr std::array<DemoDistribution, 3> kDistributions = {
    {{"nuvex.demo.launch.milliseconds", 60, 1200},
     {"nuvex.demo.battery.level", 5, 100},
     {"nuvex.demo.latency.milliseconds", 8, 250}}};

constexpr std::int32_t kSampleSpacing = 300;  // seconds

// Values that look measured, and are the same on every machine.
RecordedValues DemoValues(const DemoDistribution& distribution, std::int32_t day) {
  RecordedValues recorded;
  recorded.key = distribution.key;
  recorded.day = day;
  std::uint32_t state = 1;
  for (std::int32_t second = 0; second < 86400; second += kSampleSpacing) {
    state = state * 1'664'525 + 1'013'904'223;
    const auto range = static_cast<std::uint32_t>(distribution.high - distribution.low);
    recorded.add(distribution.low + static_cast<double>((state >> 8) % (range * 4)) / 4, second);
  }
  return recorded;
}

}  // namespace

std::vector<DemoFile> MakeDemoFiles(Date startOfToday) {
  return {
      {std::string(kWhitelistPath), Document(Whitelist())},
      {"/var/mobile/Library/Preferences/nuvex.diagwell.plist",
       Document(Dictionary{{"SubmissionEnabled", true}})},
      {"/var/db/drivers/hub.plist", Document(DemoHub())},
      {"/var/db/drivers/net0.plist", Document(DemoNetworkDriver())},
      {"/var/db/drivers/storage0.plist", Document(DemoStorageDriver())},
      {"/var/db/vigil/usage.plist", Document(UsageRecords(startOfToday))},
      {"/var/db/kernel/kern.memorystatus_freeze_count", FileOf(ByteWriter().u32(17))},
      {"/var/db/kernel/kern.memorystatus_freeze_pageouts", FileOf(ByteWriter().u64(52'311))},
      {"/var/db/kernel/kern.memorystatus_freeze_budget_pages_remaining",
       FileOf(ByteWriter().u64(20'480))},
      {"/var/db/kernel/kern.memorystatus_thaw_count", FileOf(ByteWriter().u32(5))},
      {"/var/db/kernel/task-snapshot", DemoTaskSnapshot()},
      {"/etc/os-release", "NAME=\"Demo OS\"\nVERSION_ID=1.0\nBUILD_ID=1A1\n"},
      {"/etc/machine-id", "00000000000000000000000000000de0\n"},
      {"/usr/share/applications/org.example.clock.desktop", DesktopFile("Clock")},
      {"/usr/local/share/applications/org.example.browser.desktop", DesktopFile("Browser")},
  };
}

void AddDemoCounters(std::int32_t day, StoreChanges& changes) {
  for (const DemoScalar& scalar : kScalars) {
    changes.scalars.push_back({ScalarChange::Kind::kSet, scalar.key, scalar.value, day});
  }
  for (const DemoDistribution& distribution : kDistributions) {
    changes.values.push_back(DemoValues(distribution, day));
  }
}

}  // namespace quorlet
