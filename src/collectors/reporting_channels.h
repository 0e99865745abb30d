// The values of the drivers' reporting channels that belong into the daily record.
#ifndef QUORLET_COLLECTORS_REPORTING_CHANNELS_H_
#define QUORLET_COLLECTORS_REPORTING_CHANNELS_H_

#include "drvreport/driver_registry.h"
#include "platform/counter_store.h"

namespace quorlet {

// Samples the simple channels of category 0x100 once and sets the counter
// "nuvex.drvreport.<channel name>" of each to its value; of two channels with one name, the later
// one's counts. A value that cannot be read is the lowest 64-bit number. When there are no such
// channels, or they cannot be sampled, nothing is set.
void collectReportingChannelMetrics(DriverRegistry& registry, CounterBatch& counters);

}  // namespace quorlet

#endif  // QUORLET_COLLECTORS_REPORTING_CHANNELS_H_
