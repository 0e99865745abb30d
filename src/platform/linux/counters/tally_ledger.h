// The counter store's database: what the daily pass reads, and what recorders and quorletctl write.
#ifndef QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_LEDGER_H_
#define QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_LEDGER_H_

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/counter_store.h"
#include "platform/environment_queries.h"
#include "platform/linux/base/access.h"
#include "platform/linux/base/files.h"
#include "platform/preferences.h"
#include "platform/system_log.h"

namespace quorlet {

// Given a key of a day, and how many values it has; nothing for a scalar's. False: no more keys.
using DayKeyHandler =
    std::function<bool(std::string_view key, std::optional<std::uint64_t> values)>;

// Opens the database lazily, on first use, and makes it when it is missing. A database that is
// damaged, on a second look too, is moved aside and a new one started (with one error line, and the
// preference that counts corruptions goes up); with read-only access nothing changes and a damaged
// database gives no rows. All writes of an operation happen or none, and what was written is
// durable when the operation returns.
//
// Safe to use from any thread once one operation has returned on the main thread; another thread's
// operations wait for a transaction to end. Each reader belongs to one thread at a time and must
// not outlive the ledger.
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

  // Sets the note of that name, or removes it when there is no value. Notes are what the program
  // has to remember in one transaction with the counters.
  [[nodiscard]] virtual bool setNote(std::string_view name,
                                     const std::optional<std::string>& value) = 0;
  // Reads a note; nothing when there is none. False after an error line when it cannot be read.
  [[nodiscard]] virtual bool readNote(std::string_view name, std::optional<std::string>& value) = 0;
  // Drops every scalar and distribution; the notes stay.
  [[nodiscard]] virtual bool dropCounters() = 0;

  // Names the keys of a day until `handler` answers false. False, after an error line, when they
  // cannot be read.
  [[nodiscard]] virtual bool keysOfDay(std::int32_t day, const DayKeyHandler& handler) = 0;

  // Looks for damage that reading would not notice, then drops the rows of days before `firstDay`.
  [[nodiscard]] virtual bool checkpoint(std::int32_t firstDay) = 0;

  // Looks for damage, in every value too, and changes nothing. False, after an error line, when
  // there is some or when it cannot be known; true where there is no database.
  [[nodiscard]] virtual bool isSound() = 0;

  // A reader, or nullptr when there is no database. One that cannot be opened gives, after an error
  // line, a reader that has failed.
  virtual std::unique_ptr<TLHistory> openHistory() = 0;
};

struct TallyOptions {
  // How long a writer waits for another.
  std::chrono::milliseconds patience{5000};
  // Whether the destructor copies the write-ahead log back, so that the database is whole without
  // it.
  bool copiesBack = true;
};
// A pass would lose a day's figures if it did not wait; and it spares itself the copy's syncs.
inline constexpr TallyOptions kPassOptions{std::chrono::seconds(60), false};

std::unique_ptr<TallyLedger> MakeTallyLedger(const Root& root, Access access,
                                             EnvironmentQueries& queries, Preferences& preferences,
                                             SystemLog& log, const TallyOptions& options = {});

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_LEDGER_H_
