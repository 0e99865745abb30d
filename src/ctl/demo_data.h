// What "quorletctl init --demo" puts into a root: enough for a pass to have something to report.
#ifndef QUORLET_CTL_DEMO_DATA_H_
#define QUORLET_CTL_DEMO_DATA_H_

#include <cstdint>
#include <string>
#include <vector>

#include "drvreport/property_value.h"
#include "platform/counter_store.h"

namespace quorlet {

struct DemoFile {
  std::string path;  // absolute path of the system
  std::string bytes;
};

// A whitelist, preferences, drivers, usage records since the start of `today`, kernel parameters,
// a task snapshot, an OS release, a machine id and two applications.
std::vector<DemoFile> MakeDemoFiles(Date startOfToday);

// Adds the counters of the day: scalars and distributions.
void AddDemoCounters(std::int32_t day, StoreChanges& changes);

}  // namespace quorlet

#endif  // QUORLET_CTL_DEMO_DATA_H_
