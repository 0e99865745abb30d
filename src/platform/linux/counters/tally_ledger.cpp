#include "platform/linux/counters/tally_ledger.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <mutex>
#include <optional>
#include <utility>

#include "platform/linux/base/descriptor.h"
#include "platform/linux/base/paths.h"
#include "platform/linux/counters/lock_holder.h"
#include "platform/linux/counters/tally_database.h"
#include "platform/linux/counters/tally_history.h"

namespace quorlet {
namespace {

constexpr char kLockName[] = "/.TLDataStore.lock";
constexpr char kCorruptionCountKey[] = "DatabaseCorruptionCount";
constexpr char kCorruptionCountDomain[] = "nuvex.aggregated";
// Which file was counted last; there while it is being moved aside.
constexpr char kCountedFileKey[] = "DatabaseCorruptionCounted";

}  // namespace

TallyLedger::TallyLedger(const Root& root, Access access, EnvironmentQueries& queries,
                         Preferences& preferences, SystemLog& log, const TallyOptions& options)
    : root_(root),
      access_(access),
      queries_(queries),
      preferences_(preferences),
      log_(log),
      copiesBack_(options.copiesBack),
      patience_(options.patience) {}

TallyLedger::~TallyLedger() {
  if (copiesBack_ && writer_.isOpen()) writer_.copyBack();
}

// Where the database is. Without a data home there is nothing to work on, which has been logged.
bool TallyLedger::findPath() {
  if (!path_.empty()) return true;
  const std::optional<std::string> home = queries_.dataHomePath();
  if (!home) return false;
  directory_ = root_.path(*home + kCounterStoreDirectory);
  path_ = root_.path(*home + kCounterStorePath);
  return true;
}

bool TallyLedger::mayWrite() {
  if (access_ == Access::kReadWrite) return findPath();
  log_.error("The counter store cannot be written with read-only access");
  return false;
}

int TallyLedger::openWriter() {
  FileIdentity file;
  int error = FindIdentity(path_, file);
  // Another process may have replaced a damaged database meanwhile.
  if (writer_.isOpen() && (error != 0 || file != writer_.identity())) writer_.close();
  if (writer_.isOpen()) return SQLITE_OK;
  if (error == ENOENT) error = MakeDirectories(directory_);
  if (error != 0) {
    fileError_ = ErrnoText(error);
    return SQLITE_CANTOPEN;
  }
  int code = openOrCreate();
  if (code == SQLITE_CANTOPEN) {
    // Another process may just be moving it aside: that is over when it lets go of the lock.
    { const FileLock waited(directory_ + kLockName, Sharing::kGroupOfDirectory); }
    code = openOrCreate();
  }
  return code;
}

int TallyLedger::openOrCreate() {
  FileIdentity file;
  fileError_.clear();
  const bool isMissing = FindIdentity(path_, file) == ENOENT;
  int code = isMissing ? SQLITE_OK : writer_.openForWriting(path_, patience_);
  if (code == SQLITE_OK && (isMissing || writer_.isBlank())) {
    code = startNewDatabase();
    if (code == SQLITE_OK) code = writer_.openForWriting(path_, patience_);
  }
  return code;
}

int TallyLedger::begin() {
  int code = openWriter();
  if (code == SQLITE_OK) code = writer_.begin();
  if (code == SQLITE_OK) patience_.noteWait(/*inVain=*/false);
  return code;
}

bool TallyLedger::write(const Work& work) {
  const std::lock_guard lock(mutex_);
  if (!mayWrite()) return false;
  for (const bool mayTryAgain : {true, false}) {
    int code = begin();
    if (code == SQLITE_OK) code = work(writer_);
    if (code == SQLITE_OK) code = writer_.commit();
    if (code == SQLITE_OK) return true;
    if (!recover(code, mayTryAgain)) return false;
  }
  return false;
}

bool TallyLedger::readNote(std::string_view name, std::optional<std::string>& value) {
  const std::lock_guard lock(mutex_);
  value.reset();
  FileIdentity file;
  if (!findPath()) return false;
  if (FindIdentity(path_, file) == ENOENT) return true;
  for (const bool mayTryAgain : {true, false}) {
    TallyDatabase reader;
    int code = reader.openForReading(path_, access_ == Access::kReadOnly, patience_);
    if (code == SQLITE_OK && reader.isBlank()) return true;
    if (code == SQLITE_OK) code = reader.readNote(name, value);
    if (code == SQLITE_OK) return true;
    handleReadFailure(reader, code);
    if (!mayTryAgain || !IsDamage(code) || access_ == Access::kReadOnly) break;
  }
  value.reset();
  return false;
}

bool TallyLedger::keysOfDay(std::int32_t day, const DayKeyHandler& handler) {
  const std::lock_guard lock(mutex_);
  FileIdentity file;
  if (!findPath()) return false;
  if (FindIdentity(path_, file) == ENOENT) return true;
  TallyDatabase reader;
  int code = reader.openForReading(path_, access_ == Access::kReadOnly, patience_);
  if (code == SQLITE_OK && !reader.isBlank()) code = reader.keysOfDay(day, handler);
  if (code != SQLITE_OK) handleReadFailure(reader, code);
  return code == SQLITE_OK;
}

bool TallyLedger::checkpoint(std::int32_t firstDay) {
  const std::lock_guard lock(mutex_);
  if (!mayWrite()) return false;
  FileIdentity file;
  if (FindIdentity(path_, file) == ENOENT) return true;
  for (const bool mayTryAgain : {true, false}) {
    // Looking first spares the usual case the write lock and its sync.
    bool has = false;
    int code = openWriter();
    if (code == SQLITE_OK) code = writer_.examine(/*values=*/false);
    if (code == SQLITE_OK) code = writer_.hasDaysBefore(firstDay, has);
    if (code == SQLITE_OK && !has) return true;
    if (code == SQLITE_OK) {
      return write([&](TallyDatabase& database) { return database.dropDaysBefore(firstDay); });
    }
    if (!recover(code, mayTryAgain)) return false;
  }
  return false;
}

bool TallyLedger::isSound() {
  const std::lock_guard lock(mutex_);
  FileIdentity file;
  if (!findPath()) return false;
  if (FindIdentity(path_, file) == ENOENT) return true;
  TallyDatabase reader;
  int code = reader.openForReading(path_, /*untouched=*/true, patience_);
  if (code == SQLITE_OK && !reader.isBlank()) code = reader.examine(/*values=*/true);
  if (code == SQLITE_OK) return true;
  const std::string why = reader.message(code);
  if (IsDamage(code)) {
    log_.error("The counter store %@ is damaged: %@", path_, why);
  } else {
    log_.error("Cannot read the counter store %@: %@", path_, why);
  }
  return false;
}

std::string TallyLedger::reasonOf(int code) const {
  if (!fileError_.empty()) return fileError_;
  std::string why = writer_.message(code);
  // Of a write-ahead log, the lock that its one writer holds.
  constexpr std::uint64_t kWriterByte = 120;
  if ((code & 0xff) != SQLITE_BUSY) return why;
  const std::optional<int> holder = LockHolder(path_ + "-shm", kWriterByte);
  return holder ? why + " by process " + std::to_string(*holder) : why;
}

// Ends the failed transaction. Returns whether the operation should be tried once more, which the
// caller can; otherwise there is one error line.
bool TallyLedger::recover(int code, bool mayTryAgain) {
  const std::string why = reasonOf(code);
  const FileIdentity file = writer_.identity();
  fileError_.clear();
  // Drops what was not committed. It may also never have opened properly.
  writer_.close();
  if (mayTryAgain && IsDamage(code)) return replaceDamaged(file, why);
  if (mayTryAgain && IsMoved(code)) return true;
  log_.error("Cannot write the counter store %@: %@", path_, why);
  return false;
}

int TallyLedger::lockFailed(const FileLock& lock) {
  fileError_ = directory_ + kLockName + " cannot be locked: " + ErrnoText(lock.error());
  return SQLITE_CANTOPEN;
}

// Moves the damaged database aside, unless a second look finds it sound. Returns whether there may
// be a good one now; otherwise there is one error line.
bool TallyLedger::replaceDamaged(const FileIdentity& damaged, const std::string& why) {
  if (access_ == Access::kReadOnly) {
    log_.error("The counter store %@ is damaged: %@", path_, why);
    return false;
  }
  writer_.close();
  const FileLock lock(directory_ + kLockName, Sharing::kGroupOfDirectory);
  if (lock.error() != 0) {
    log_.error("The counter store %@ is damaged (%@) and cannot be locked: %@", path_, why,
               ErrnoText(lock.error()));
    return false;
  }
  // Another process found the damage as well, and was faster.
  FileIdentity file;
  if (FindIdentity(path_, file) != 0 || file != damaged) return true;
  TallyDatabase second;
  int code = second.openForWriting(path_, patience_);
  if (code == SQLITE_OK && !second.isBlank()) code = second.examine(/*values=*/true);
  if (IsDamage(code)) {
    second.close();
    return moveAside(damaged, why);
  }
  if (code != SQLITE_OK) {
    log_.error("Cannot read the counter store %@: %@", path_, second.message(code));
  }
  return code == SQLITE_OK;
}

// With the lock held. A kill at any point leaves what the next process brings to its end: the
// damage is counted once, and what lies beside the database goes when the new one is made.
bool TallyLedger::moveAside(const FileIdentity& damaged, const std::string& why) {
  countCorruption(damaged);
  std::string aside;
  if (const int error = MoveAsideAsDamaged(path_, aside)) {
    log_.error("The counter store %@ is damaged (%@) and cannot be moved aside: %@", path_, why,
               ErrnoText(error));
    return false;
  }
  // With its log, which may hold what the database lost. What cannot be kept is no loss.
  for (const char* suffix : kTallySideFiles) {
    unlink((aside + suffix).c_str());
    static_cast<void>(rename((path_ + suffix).c_str(), (aside + suffix).c_str()));
  }
  log_.error("The counter store %@ is damaged (%@); it was moved aside and a new one started",
             path_, why);
  preferences_.DGWPreferencesSetValue(kCountedFileKey, std::nullopt, kCorruptionCountDomain);
  return placeNewDatabase() == SQLITE_OK || recover(SQLITE_CANTOPEN, /*mayTryAgain=*/false);
}

// Together with which file was counted, so that nobody counts it again who finds it still there.
void TallyLedger::countCorruption(const FileIdentity& damaged) {
  const PropertyValue file(std::to_string(damaged.device) + ":" + std::to_string(damaged.inode));
  const auto counted = preferences_.DGWPreferencesGetValue(kCountedFileKey, kCorruptionCountDomain);
  if (counted && *counted == file) return;
  preferences_.DGWPreferencesSetValue(kCountedFileKey, file, kCorruptionCountDomain);
  preferences_.addToInteger(kCorruptionCountKey, 1, kCorruptionCountDomain);
  preferences_.DGWPreferencesSynchronize(kCorruptionCountDomain);
}

// Puts a new database where there is none, or one without tables: all of it at once, so that no
// process ever meets half of it.
int TallyLedger::startNewDatabase() {
  writer_.close();
  const FileLock lock(directory_ + kLockName, Sharing::kGroupOfDirectory);
  if (lock.error() != 0) return lockFailed(lock);
  FileIdentity file;
  if (FindIdentity(path_, file) == 0) {
    TallyDatabase there;
    const int code = there.openForWriting(path_, patience_);
    // Another process was faster, or has damaged it: the caller finds out.
    if (code != SQLITE_OK || !there.isBlank()) return SQLITE_OK;
  }
  return placeNewDatabase();
}

// With the lock held.
int TallyLedger::placeNewDatabase() {
  // What an earlier database left beside it would be played into the new one.
  bool hasLeftOvers = false;
  for (const char* suffix : kTallySideFiles) {
    hasLeftOvers |= unlink((path_ + suffix).c_str()) == 0;
  }
  int error = hasLeftOvers ? SyncDirectory(directory_) : 0;
  if (error == 0) error = WriteWholeFile(path_, NewTallyDatabase(), Sharing::kGroupOfDirectory);
  if (error == 0) return SQLITE_OK;
  fileError_ = ErrnoText(error);
  return SQLITE_CANTOPEN;
}

std::unique_ptr<TLHistory> TallyLedger::openHistory() {
  const std::lock_guard lock(mutex_);
  if (!findPath()) return nullptr;
  for (int attempt = 0; attempt < 2; ++attempt) {
    FileIdentity file;
    if (FindIdentity(path_, file) == ENOENT) return nullptr;
    TallyDatabase reader;
    const int code = reader.openForReading(path_, access_ == Access::kReadOnly, patience_);
    if (code == SQLITE_OK) {
      if (reader.isBlank()) return nullptr;
      return MakeTallyHistory(std::move(reader), [this](TallyDatabase& database, int failure) {
        const FileIdentity read = database.identity();
        const std::string why = database.message(failure);
        handleReadFailure(database, failure);
        FileIdentity file;
        const bool isSound = FindIdentity(path_, file) == 0 && file == read;
        if (!IsDamage(failure) || !isSound || access_ == Access::kReadOnly) return;
        // Nobody was told, and what was being read is lost to its reader.
        log_.error("Cannot read all of the counter store %@, which is sound: %@", path_, why);
      });
    }
    handleReadFailure(reader, code);
    if (!IsDamage(code) || access_ == Access::kReadOnly) break;
  }
  return MakeTallyHistory(TallyDatabase(), {});
}

void TallyLedger::handleReadFailure(TallyDatabase& reader, int code) {
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

}  // namespace quorlet
