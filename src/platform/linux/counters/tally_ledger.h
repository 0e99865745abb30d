// The file of the counter store: where it is, who may write it, and what is done about damage.
#ifndef QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_LEDGER_H_
#define QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_LEDGER_H_

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/counter_store.h"
#include "platform/environment_queries.h"
#include "platform/linux/base/access.h"
#include "platform/linux/base/files.h"
#include "platform/linux/counters/counter_store.h"
#include "platform/linux/counters/tally_database.h"
#include "platform/preferences.h"
#include "platform/system_log.h"

namespace quorlet {

// Opens the database lazily, on first use, and makes it when it is missing. A database that is
// damaged, on a second look too, is moved aside and a new one started (with one error line, and the
// preference that counts corruptions goes up); with read-only access nothing changes and a damaged
// database gives no rows.
//
// Safe to use from any thread once one operation has returned on the main thread. Each reader
// belongs to one thread at a time and must not outlive the ledger.
class TallyLedger {
 public:
  TallyLedger(const Root& root, Access access, EnvironmentQueries& queries,
              Preferences& preferences, SystemLog& log, const TallyOptions& options);
  TallyLedger(const TallyLedger&) = delete;
  TallyLedger& operator=(const TallyLedger&) = delete;
  ~TallyLedger();

  // Given the database with a transaction open; gives SQLite's result code.
  using Work = std::function<int(TallyDatabase&)>;

  // Runs `work` in one transaction, which is durable when this returns true; false after one error
  // line. `work` runs once more where the database turned out to be damaged and was replaced.
  [[nodiscard]] bool write(const Work& work);

  // For the rest see CounterStore. The first day of a checkpoint is the first that is kept.
  [[nodiscard]] bool readNote(std::string_view name, std::optional<std::string>& value);
  [[nodiscard]] bool keysOfDay(std::int32_t day, const DayKeyHandler& handler);
  [[nodiscard]] bool checkpoint(std::int32_t firstDay);
  [[nodiscard]] bool isSound();
  std::unique_ptr<TLHistory> openHistory();

 private:
  bool findPath();
  bool mayWrite();
  int openWriter();
  int openOrCreate();
  int begin();
  std::string reasonOf(int code) const;
  bool recover(int code, bool mayTryAgain);
  bool replaceDamaged(const FileIdentity& damaged, const std::string& why);
  bool moveAside(const FileIdentity& damaged, const std::string& why);
  void countCorruption(const FileIdentity& damaged);
  int startNewDatabase();
  int placeNewDatabase();
  int lockFailed(const FileLock& lock);
  void handleReadFailure(TallyDatabase& reader, int code);

  const Root root_;
  const Access access_;
  EnvironmentQueries& queries_;
  Preferences& preferences_;
  SystemLog& log_;
  const bool copiesBack_;
  // Recursive: reading may meet damage, which is handled under the same lock.
  std::recursive_mutex mutex_;
  std::string directory_;
  std::string path_;
  LockPatience patience_;
  TallyDatabase writer_;
  std::string fileError_;  // what kept the writer from being opened
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_LEDGER_H_
