// The counter store in an SQLite database: what the daily pass reads, and what recorders and
// quorletctl write.
#ifndef QUORLET_PLATFORM_LINUX_COUNTERS_COUNTER_STORE_H_
#define QUORLET_PLATFORM_LINUX_COUNTERS_COUNTER_STORE_H_

#include <chrono>
#include <memory>

#include "platform/clock.h"
#include "platform/counter_store.h"
#include "platform/environment_queries.h"
#include "platform/linux/base/access.h"
#include "platform/linux/base/files.h"
#include "platform/preferences.h"
#include "platform/system_log.h"

namespace quorlet {

struct TallyOptions {
  // How long a writer waits for another.
  std::chrono::milliseconds patience{5000};
  // Whether the destructor copies the write-ahead log back, so that the database is whole without
  // it.
  bool copiesBack = true;
};
// A pass would lose a day's figures if it did not wait; and it spares itself the copy's syncs.
inline constexpr TallyOptions kPassOptions{std::chrono::seconds(60), false};

// What is given must outlive the store. Safe to use from any thread once one operation has returned
// on the main thread; another thread's operations wait. Each reader belongs to one thread at a time
// and must not outlive the store.
std::unique_ptr<CounterStore> MakeLinuxCounterStore(const Root& root, Access access, Clock& clock,
                                                    EnvironmentQueries& queries,
                                                    Preferences& preferences, SystemLog& log,
                                                    const TallyOptions& options = {});

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_COUNTERS_COUNTER_STORE_H_
