// The counter store's reader.
#ifndef QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_HISTORY_H_
#define QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_HISTORY_H_

#include <functional>
#include <memory>

#include "platform/counter_store.h"
#include "platform/linux/counters/tally_database.h"

namespace quorlet {

// Called once when an enumeration ends early, with SQLite's result code; the statements have let
// go of the database by then. May close it: later enumerations then give no rows.
using TallyReadFailure = std::function<void(TallyDatabase& database, int code)>;

// Reads through `database`, which is open for reading and has its tables; one that is not open
// makes a reader that has failed.
std::unique_ptr<TLHistory> MakeTallyHistory(TallyDatabase database, TallyReadFailure onFailure);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_HISTORY_H_
