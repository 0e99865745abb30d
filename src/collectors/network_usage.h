// The network traffic of every process since the last run, added to daily counters.
#ifndef QUORLET_COLLECTORS_NETWORK_USAGE_H_
#define QUORLET_COLLECTORS_NETWORK_USAGE_H_

#include <optional>
#include <vector>

#include "drvreport/property_value.h"
#include "platform/counter_store.h"
#include "platform/platform.h"
#include "platform/preferences.h"

namespace quorlet {

// What a reply of the network-usage service comes to.
struct UsageGrowth {
  std::vector<ScalarChange> changes;
  Dictionary baseline;  // what the next reply is compared with, once the changes are written
  // The baseline as the store remembers it; goes into one transaction with the changes. Nothing
  // where the baseline stays as it is.
  std::optional<StoreNote> note;
};

// Asks the network-usage service for the counts of all processes and waits for its reply for at
// most 10 seconds. What the reply comes to is the caller's to write: the changes with the note,
// then, if that went well, the baseline. A reply that comes later is processed in full all the
// same, beside whatever the caller does by then; the log, the preferences, the clock and the
// counter store must be safe to use from the service's thread.
std::optional<UsageGrowth> collectDataUsage(Platform& platform);

// Asks the same, and gives the baseline that the counts make; nothing without a reply in time.
std::optional<Dictionary> askForBaseline(Platform& platform);

// Makes the baseline durable in place of the last one; false, after an error line, when it is not.
bool storeBaseline(const Dictionary& baseline, Preferences& preferences);

// Makes the store forget its baseline, so that the stored preference alone counts.
StoreNote forgottenBaseline();

// Adds, for each usage record (see platform/network_usage.h), what its counts have grown by since
// the last reply to today's counters of its process, in KB:
//   datausage.<kind>KB.<process>   kind: wifiIn, wifiOut, wwanIn, wwanOut
//   datausage.baddata.<process>    counts that went down although their since-time stayed the same
//   datausage.olddata.<process>    records that started before yesterday and cannot be compared
// <process> is the bundle name, or "nuvex." and the process name. The counts become the baseline of
// the next reply, in place of the last one's, unless the counters could not be written. A record
// that lacks a name, the since-time or a count is skipped. So are names of more than 1024 bytes,
// and records that the baseline has no room for; one error line tells how many there were.
//
// Growth is counted once, whenever the process is killed: the counters' transaction holds the new
// baseline and the digest of the one it replaces. Where the preference still is that one, the
// store's baseline is the right one. Where either cannot be read, nothing is added until the next
// reply.
void processDataUsageReply(const Array& records, Platform& platform);

}  // namespace quorlet

#endif  // QUORLET_COLLECTORS_NETWORK_USAGE_H_
