#include "collectors/platform_statistics.h"

#include <cstdint>
#include <optional>
#include <utility>

#include "collectors/ecc_events.h"
#include "collectors/flash_wear.h"
#include "collectors/nand_scalars.h"
#include "collectors/network_usage.h"
#include "collectors/reporting_channels.h"
#include "collectors/run_step.h"

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

// One pass over the collectors.
struct Collection {
  Platform& platform;
  const PassProgress& progress;
  CounterBatch counters{platform.counterStore};
  std::optional<UsageGrowth> usage;

  bool logsStorage() const { return !progress.storageLogged; }
};

// What has been measured so far, with what tells that the storage log is staged.
void CommitStorage(Collection& pass) {
  if (pass.logsStorage() && pass.progress.storageLoggedNote) {
    pass.counters.add(pass.progress.storageLoggedNote());
  }
  pass.counters.commit();
}

void CommitTheRest(Collection& pass) {
  auto& [platform, progress, counters, usage] = pass;
  if (usage) counters.add(std::move(usage->changes));
  if (usage && usage->note) counters.add(*std::move(usage->note));
  // The two stores cannot be changed at once. The store remembers the baseline as well, for a pass
  // that is killed in between.
  if (counters.commit() && usage) storeBaseline(usage->baseline, platform.preferences);
}

// A collector adds what it finds to the counters. It is given the services that it needs, and no
// others.
struct Collector {
  const char* name;
  void (*collect)(Collection& pass);
};

// In the order of the pass.
constexpr Collector kCollectors[] = {
    {"disk usage",
     [](Collection& pass) { CollectDiskUsage(pass.platform.deviceInfo, pass.counters); }},
    {"storage",
     [](Collection& pass) {
       PushNANDInfoScalars(pass.platform, pass.counters, pass.logsStorage());
     }},
    {"wear of drives",
     [](Collection& pass) {
       RecordFlash(pass.platform.drives, pass.platform.counterStore, pass.counters);
     }},
    // Before the network's answer, which may be waited for into the next day.
    {"storage counters", CommitStorage},
    // The storage log is staged, and published once the store knows of it: cut short before, it is
    // dropped; cut short after, the next pass publishes it and makes none of its own.
    {"storage log",
     [](Collection& pass) {
       static_cast<void>(pass.platform.crashSupport.publishStagedEntries());
     }},
    {"ECC events",
     [](Collection& pass) {
       logECCEvents(pass.platform.kernelParameters, pass.platform.crashSupport, pass.platform.log);
     }},
    {"network usage", [](Collection& pass) { pass.usage = collectDataUsage(pass.platform); }},
    {"reporting channels",
     [](Collection& pass) {
       collectReportingChannelMetrics(pass.platform.driverRegistry, pass.counters);
     }},
    {"counters", CommitTheRest},
};

}  // namespace

void collectPlatformStatistics(Platform& platform, const PassProgress& progress) {
  Collection pass{.platform = platform, .progress = progress, .usage = {}};
  if (pass.logsStorage()) static_cast<void>(platform.crashSupport.stageEntries());
  for (const Collector& collector : kCollectors) {
    RunStep(platform.log, collector.name, [&] { collector.collect(pass); });
  }
}

}  // namespace quorlet
