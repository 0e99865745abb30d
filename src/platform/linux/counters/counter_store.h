// The counter store on a TallyLedger.
#ifndef QUORLET_PLATFORM_LINUX_COUNTERS_COUNTER_STORE_H_
#define QUORLET_PLATFORM_LINUX_COUNTERS_COUNTER_STORE_H_

#include <memory>

#include "platform/clock.h"
#include "platform/counter_store.h"
#include "platform/linux/counters/tally_ledger.h"

namespace quorlet {

// What is given must outlive the store.
std::unique_ptr<CounterStore> MakeLinuxCounterStore(TallyLedger& ledger, Clock& clock,
                                                    SystemLog& log);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_COUNTERS_COUNTER_STORE_H_
