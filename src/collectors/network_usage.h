// The network traffic of every process since the last run, added to daily counters.
#ifndef QUORLET_COLLECTORS_NETWORK_USAGE_H_
#define QUORLET_COLLECTORS_NETWORK_USAGE_H_

#include <optional>
#include <vector>

#include "platform/counter_store.h"
#include "platform/platform.h"
#include "platform/preferences.h"
#include "platform/system_log.h"
#include "values/property_value.h"

namespace quorlet {

// What a reply of the network-usage service comes to.
struct UsageGrowth {
  std::vector<ScalarChange> changes;
  Dictionary baseline;  // what the next reply is compared with, once the changes are written
};

// Asks the network-usage service for the counts of all processes and waits for its reply for at
// most 10 seconds. What the reply comes to is the caller's to write: the changes, then, if that
// went well, the baseline. A reply that comes later is processed in full all the same, beside
// whatever the caller does by then; the log, the preferences, the clock and the counter store must
// be safe to use from the service's thread.
std::optional<UsageGrowth> collectDataUsage(Platform& platform);

// Makes the baseline durable in place of the last one.
void storeBaseline(const Dictionary& baseline, Preferences& preferences);

// Adds, for each usage record (see platform/network_usage.h), what its counts have grown by since
// the last reply to today's counters of its process, in KB:
//   datausage.<kind>KB.<process>   kind: wifiIn, wifiOut, wwanIn, wwanOut
//   datausage.baddata.<process>    counts that went down although their since-time stayed the same
//   datausage.olddata.<process>    records that started before yesterday and cannot be compared
// <process> is the bundle name, or "nuvex." and the process name. The counts become the baseline of
// the next reply, in place of the last one's, unless the counters could not be written. A record
// that lacks a name, the since-time or a count is skipped. So are names of more than 1024 bytes,
// and records that the baseline has no room for; one error line tells how many there were.
void processDataUsageReply(const Array& records, CounterStore& counterStore,
                           Preferences& preferences, SystemLog& log);

}  // namespace quorlet

#endif  // QUORLET_COLLECTORS_NETWORK_USAGE_H_
