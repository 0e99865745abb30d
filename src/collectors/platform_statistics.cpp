#include "collectors/platform_statistics.h"

#include <cstdint>
#include <optional>
#include <utility>

#include "collectors/ecc_events.h"
#include "collectors/network_usage.h"
#include "collectors/reporting_channels.h"
#include "platform/run_step.h"
#include "storage/daily_push.h"

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

void collectPlatformStatistics(Platform& platform) {
  SystemLog& log = platform.log;
  // Written at the end in one go. The gated pass is made anew when it is killed before.
  CounterBatch counters(platform.counterStore);
  RunStep(log, "disk usage", [&] { CollectDiskUsage(platform.deviceInfo, counters); });
  RunStep(log, "storage", [&] { PushNANDInfoScalars(platform, counters); });
  RunStep(log, "ECC events", [&] { logECCEvents(platform); });
  std::optional<UsageGrowth> usage;
  RunStep(log, "network usage", [&] { usage = collectDataUsage(platform); });
  RunStep(log, "reporting channels",
          [&] { collectReportingChannelMetrics(platform.driverRegistry, counters); });
  RunStep(log, "counters", [&] {
    if (usage) counters.add(std::move(usage->changes));
    // The two stores cannot be changed at once. This way round, a pass that is killed in between,
    // or that cannot write its counters, loses no traffic: the next one adds the same growth again.
    if (counters.commit() && usage) storeBaseline(usage->baseline, platform.preferences);
  });
}

}  // namespace quorlet
