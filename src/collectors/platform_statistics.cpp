#include "collectors/platform_statistics.h"

#include <cstdint>
#include <optional>
#include <utility>

#include "collectors/ecc_events.h"
#include "collectors/network_usage.h"
#include "collectors/reporting_channels.h"
#include "platform/run_step.h"
#include "storage/daily_push.h"
#include "storage/flash_record.h"

namespace quorlet {
namespace {

// The entry, a number of bytes, in MiB; -1 without such an entry.
std::int64_t Mebibytes(const Dictionary& usage, std::string_view entry) {
  const auto bytes = IntegerEntry(usage, entry);
  return bytes ? *bytes >> 20 : -1;
}

void CollectDiskUsage(DeviceInfo& deviceInfo, CounterBatch& counters) {
  const auto answer = deviceInfo.DQCopyAnswer("DiskUsage");
  const Dictionary* dictionary = answer ? answer->asDictionary() : nullptr;
  const Dictionary usage = dictionary != nullptr ? *dictionary : Dictionary();
  counters.TLClientSetValueForScalarKey("nuvex.tilehall.DiskUsageUserTotalBlocks",
                                        Mebibytes(usage, "kDQQDiskUsageTotalDiskCapacity"));
  counters.TLClientSetValueForScalarKey("nuvex.tilehall.DiskUsageUserBlocksFree",
                                        Mebibytes(usage, "kDQQDiskUsageTotalDataAvailable"));
}

}  // namespace

void collectPlatformStatistics(Platform& platform, const PassProgress& progress) {
  SystemLog& log = platform.log;
  CrashSupport& support = platform.crashSupport;
  CounterBatch counters(platform.counterStore);
  // The storage log is staged, and published once the store knows of it: cut short before, it is
  // dropped; cut short after, the next pass publishes it and makes none of its own.
  const bool logsStorage = !progress.storageLogged;
  if (logsStorage) static_cast<void>(support.stageEntries());
  RunStep(log, "disk usage", [&] { CollectDiskUsage(platform.deviceInfo, counters); });
  RunStep(log, "storage", [&] { PushNANDInfoScalars(platform, counters, logsStorage); });
  RunStep(log, "wear of drives", [&] { RecordFlash(platform, counters); });
  // Before the network's answer, which may be waited for into the next day.
  RunStep(log, "storage counters", [&] {
    if (logsStorage && progress.storageLoggedNote) counters.add(progress.storageLoggedNote());
    counters.commit();
  });
  RunStep(log, "storage log", [&] { static_cast<void>(support.publishStagedEntries()); });
  RunStep(log, "ECC events", [&] { logECCEvents(platform); });
  std::optional<UsageGrowth> usage;
  RunStep(log, "network usage", [&] { usage = collectDataUsage(platform); });
  RunStep(log, "reporting channels",
          [&] { collectReportingChannelMetrics(platform.driverRegistry, counters); });
  RunStep(log, "counters", [&] {
    if (usage) counters.add(std::move(usage->changes));
    if (usage && usage->note) counters.add(*std::move(usage->note));
    // The two stores cannot be changed at once. The store remembers the baseline as well, for a
    // pass that is killed in between.
    if (counters.commit() && usage) storeBaseline(usage->baseline, platform.preferences);
  });
}

}  // namespace quorlet
