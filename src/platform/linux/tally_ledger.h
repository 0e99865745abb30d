// The counter store's database: what the daily pass reads, and what recorders and quorletctl write.
#ifndef QUORLET_PLATFORM_LINUX_TALLY_LEDGER_H_
#define QUORLET_PLATFORM_LINUX_TALLY_LEDGER_H_

#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <string>
#include <string_view>

#include "platform/counter_store.h"
#include "platform/environment_queries.h"
#include "platform/linux/access.h"
#include "platform/linux/files.h"
#include "platform/preferences.h"
#include "platform/system_log.h"

namespace quorlet {

// Opens the database lazily, on first use. A damaged database is moved aside and a new one started
// (with one error line, and the preference that counts corruptions goes up); with read-only access
// nothing changes and a damaged database gives no rows. All writes of an operation happen or none.
//
// Safe to use from any thread once one operation has returned on the main thread; another thread's
// operations wait for a transaction to end. Each reader belongs to one thread at a time, must not
// outlive the ledger, and its row handlers must not write: the write would wait for the reader.
class TallyLedger {
 public:
  virtual ~TallyLedger() = default;

  // Whether a key is short enough for the database; one error line when it is not.
  [[nodiscard]] virtual bool takesKey(std::string_view key) = 0;

  // Each returns false after one error line when the database could not be written.
  [[nodiscard]] virtual bool setScalar(std::string_view key, std::int32_t day,
                                       std::int64_t value) = 0;
  // Adds, saturating; a missing value counts as 0.
  [[nodiscard]] virtual bool addToScalar(std::string_view key, std::int32_t day,
                                         std::int64_t value) = 0;
  // Appends to the sequence of the key and day.
  [[nodiscard]] virtual bool recordValues(std::string_view key, std::int32_t day,
                                          std::span<const DistributionSample> samples) = 0;
  // Runs `work` inside one transaction; everything it wrote is kept when it returns true, dropped
  // when it returns false. Returns whether it was kept. Not for nesting. Once a write inside has
  // failed, the later ones return false without a message, and nothing is kept. `work` runs at most
  // once, even when the database turns out to be damaged midway.
  [[nodiscard]] virtual bool inTransaction(const std::function<bool()>& work) = 0;

  // Drops the rows of days before `firstDay`.
  [[nodiscard]] virtual bool dropDaysBefore(std::int32_t firstDay) = 0;

  // A reader, or nullptr (no database: nullptr without a message).
  virtual std::unique_ptr<TLHistory> openHistory() = 0;
};

std::unique_ptr<TallyLedger> MakeTallyLedger(const Root& root, Access access,
                                             EnvironmentQueries& queries, Preferences& preferences,
                                             SystemLog& log);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_TALLY_LEDGER_H_
