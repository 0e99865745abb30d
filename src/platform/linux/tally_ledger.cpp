#include "platform/linux/tally_ledger.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <limits>
#include <mutex>
#include <optional>
#include <utility>

#include "platform/linux/tally_database.h"
#include "platform/linux/tally_history.h"

namespace quorlet {
namespace {

constexpr char kDirectory[] = "/Library/TallyLedger";
constexpr char kDatabaseName[] = "/TLDataStore.sqlitedb";
constexpr char kLockName[] = "/.TLDataStore.lock";
constexpr char kCorruptionCountKey[] = "DatabaseCorruptionCount";
constexpr char kCorruptionCountDomain[] = "nuvex.aggregated";

class LinuxTallyLedger final : public TallyLedger {
 public:
  LinuxTallyLedger(const Root& root, Access access, EnvironmentQueries& queries,
                   Preferences& preferences, SystemLog& log)
      : root_(root), access_(access), queries_(queries), preferences_(preferences), log_(log) {}

  bool takesKey(std::string_view key) override {
    if (key.size() <= kLongestTallyKey) return true;
    log_.error("A counter's key of %llu bytes is too long", key.size());
    return false;
  }

  bool setScalar(std::string_view key, std::int32_t day, std::int64_t value) override {
    return write(key, [&] { return writer_.setScalar(key, day, value); });
  }
  bool addToScalar(std::string_view key, std::int32_t day, std::int64_t value) override {
    return write(key, [&] { return writer_.addToScalar(key, day, value); });
  }
  bool recordValues(std::string_view key, std::int32_t day,
                    std::span<const DistributionSample> samples) override {
    if (samples.empty()) return true;
    return write(key, [&] { return writer_.recordValues(key, day, samples); });
  }
  bool inTransaction(const std::function<bool()>& work) override;
  bool dropDaysBefore(std::int32_t firstDay) override;
  std::unique_ptr<TLHistory> openHistory() override;

 private:
  using Work = std::function<int()>;  // gives SQLite's result code

  bool findPath();
  bool mayWrite();
  int openWriter();
  int begin();
  bool write(std::string_view key, const Work& work);
  bool writeJoined(const Work& work);
  bool recover(int code, bool mayTryAgain);
  bool replaceDamaged(const FileIdentity& damaged, const std::string& why);
  void countCorruption();
  bool startNewDatabase();
  void handleReadFailure(TallyDatabase& reader, int code);

  const Root root_;
  const Access access_;
  EnvironmentQueries& queries_;
  Preferences& preferences_;
  SystemLog& log_;
  // Recursive: the work of a transaction calls the writing operations.
  std::recursive_mutex mutex_;
  std::string directory_;
  std::string path_;
  TallyDatabase writer_;
  std::string directoryError_;
  bool inTransaction_ = false;
  bool transactionFailed_ = false;
};

// Where the database is. Without a data home there is nothing to work on, which has been logged.
bool LinuxTallyLedger::findPath() {
  if (!path_.empty()) return true;
  const std::optional<std::string> home = queries_.dataHomePath();
  if (!home) return false;
  directory_ = root_.path(*home + kDirectory);
  path_ = directory_ + kDatabaseName;
  return true;
}

bool LinuxTallyLedger::mayWrite() {
  if (access_ == Access::kReadWrite) return findPath();
  log_.error("The counter store cannot be written with read-only access");
  return false;
}

int LinuxTallyLedger::openWriter() {
  // Another process may have replaced a damaged database meanwhile.
  if (writer_.isOpen() && IdentityOf(path_) != writer_.identity()) writer_.close();
  if (writer_.isOpen()) return SQLITE_OK;
  if (const int error = MakeDirectories(directory_); error != 0) {
    directoryError_ = ErrnoText(error);
    return SQLITE_CANTOPEN;
  }
  return writer_.openForWriting(path_);
}

int LinuxTallyLedger::begin() {
  const int code = openWriter();
  return code == SQLITE_OK ? writer_.begin() : code;
}

bool LinuxTallyLedger::write(std::string_view key, const Work& work) {
  const std::lock_guard lock(mutex_);
  if (!takesKey(key)) return false;
  if (inTransaction_) return writeJoined(work);
  if (!mayWrite()) return false;
  for (const bool mayTryAgain : {true, false}) {
    int code = begin();
    if (code == SQLITE_OK) code = work();
    if (code == SQLITE_OK) code = writer_.commit();
    if (code == SQLITE_OK) return true;
    if (!recover(code, mayTryAgain)) return false;
  }
  return false;
}

// One operation of an open transaction. After a failure nothing more is tried: all is lost anyway.
bool LinuxTallyLedger::writeJoined(const Work& work) {
  if (transactionFailed_) return false;
  const int code = work();
  if (code == SQLITE_OK) return true;
  transactionFailed_ = true;
  static_cast<void>(recover(code, /*mayTryAgain=*/true));
  return false;
}

bool LinuxTallyLedger::inTransaction(const std::function<bool()>& work) {
  const std::lock_guard lock(mutex_);
  if (!mayWrite()) return false;
  if (int code = begin(); code != SQLITE_OK) {
    if (!recover(code, /*mayTryAgain=*/true)) return false;
    code = begin();
    if (code != SQLITE_OK) return recover(code, /*mayTryAgain=*/false);
  }
  inTransaction_ = true;
  transactionFailed_ = false;
  const bool keep = work();
  inTransaction_ = false;
  if (transactionFailed_) return false;
  if (!keep) {
    writer_.rollback();
    return false;
  }
  const int code = writer_.commit();
  if (code != SQLITE_OK) static_cast<void>(recover(code, /*mayTryAgain=*/true));
  return code == SQLITE_OK;
}

bool LinuxTallyLedger::dropDaysBefore(std::int32_t firstDay) {
  const std::lock_guard lock(mutex_);
  if (!mayWrite()) return false;
  if (!IdentityOf(path_)) return true;
  for (const bool mayTryAgain : {true, false}) {
    // Looking first spares the usual case the write lock and its syncs.
    bool has = false;
    int code = openWriter();
    if (code == SQLITE_OK) code = writer_.hasDaysBefore(firstDay, has);
    if (code == SQLITE_OK && !has) return true;
    if (code == SQLITE_OK) return write({}, [&] { return writer_.dropDaysBefore(firstDay); });
    if (!recover(code, mayTryAgain)) return false;
  }
  return false;
}

// Ends the failed transaction. Returns whether the operation should be tried once more, which the
// caller can; otherwise there is one error line.
bool LinuxTallyLedger::recover(int code, bool mayTryAgain) {
  const std::string why =
      directoryError_.empty() ? writer_.message(code) : std::exchange(directoryError_, {});
  const FileIdentity file = writer_.identity();
  // Drops what was not committed. It may also never have opened properly.
  writer_.close();
  if (mayTryAgain && IsDamage(code)) return replaceDamaged(file, why);
  if (mayTryAgain && IsMoved(code)) return true;
  log_.error("Cannot write the counter store %@: %@", path_, why);
  return false;
}

// Moves the damaged database aside and starts a new one. Returns whether there is a good one now.
bool LinuxTallyLedger::replaceDamaged(const FileIdentity& damaged, const std::string& why) {
  if (access_ == Access::kReadOnly) {
    log_.error("The counter store %@ is damaged: %@", path_, why);
    return false;
  }
  // A reader may have found it while a transaction is open here.
  if (inTransaction_) transactionFailed_ = true;
  writer_.close();
  const FileLock lock(directory_ + kLockName);
  if (lock.error() != 0) {
    log_.error("The counter store %@ is damaged (%@) and cannot be locked: %@", path_, why,
               ErrnoText(lock.error()));
    return false;
  }
  // Another process found the damage as well, and was faster.
  if (IdentityOf(path_) != damaged) return true;
  // The journal goes first: left behind, it would be played back into the new database.
  unlink((path_ + "-journal").c_str());
  if (rename(path_.c_str(), (path_ + ".damaged").c_str()) != 0) {
    log_.error("The counter store %@ is damaged (%@) and cannot be moved aside: %@", path_, why,
               ErrnoText(errno));
    return false;
  }
  log_.error("The counter store %@ is damaged (%@); it was moved aside and a new one started",
             path_, why);
  countCorruption();
  return startNewDatabase();
}

void LinuxTallyLedger::countCorruption() {
  const std::int64_t count =
      preferences_.DGWPreferencesGetIntegerValue(kCorruptionCountKey, kCorruptionCountDomain);
  if (count == std::numeric_limits<std::int64_t>::max()) return;
  preferences_.DGWPreferencesSetValue(kCorruptionCountKey, Int64(count + 1),
                                      kCorruptionCountDomain);
  // At once, so that the next process that finds damage counts on from here.
  preferences_.DGWPreferencesSynchronize(kCorruptionCountDomain);
}

bool LinuxTallyLedger::startNewDatabase() {
  int code = begin();
  if (code == SQLITE_OK) code = writer_.commit();
  return code == SQLITE_OK || recover(code, /*mayTryAgain=*/false);
}

std::unique_ptr<TLHistory> LinuxTallyLedger::openHistory() {
  const std::lock_guard lock(mutex_);
  if (!findPath()) return nullptr;
  for (int attempt = 0; attempt < 2; ++attempt) {
    if (!IdentityOf(path_)) return nullptr;
    TallyDatabase reader;
    const int code = reader.openForReading(path_, access_ == Access::kReadOnly);
    if (code == SQLITE_OK) {
      if (reader.isBlank()) return nullptr;
      return MakeTallyHistory(std::move(reader), [this](TallyDatabase& database, int failure) {
        handleReadFailure(database, failure);
      });
    }
    handleReadFailure(reader, code);
    if (!IsDamage(code) || access_ == Access::kReadOnly) return nullptr;
  }
  return nullptr;
}

void LinuxTallyLedger::handleReadFailure(TallyDatabase& reader, int code) {
  const std::lock_guard lock(mutex_);
  const std::string why = reader.message(code);
  const FileIdentity file = reader.identity();
  reader.close();
  if (IsDamage(code)) {
    static_cast<void>(replaceDamaged(file, why));
  } else {
    log_.error("Cannot read the counter store %@: %@", path_, why);
  }
}

}  // namespace

std::unique_ptr<TallyLedger> MakeTallyLedger(const Root& root, Access access,
                                             EnvironmentQueries& queries, Preferences& preferences,
                                             SystemLog& log) {
  return std::make_unique<LinuxTallyLedger>(root, access, queries, preferences, log);
}

}  // namespace quorlet
