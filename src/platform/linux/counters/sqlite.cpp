#include "platform/linux/counters/sqlite.h"

#include <unistd.h>

#include <chrono>
#include <thread>

namespace quorlet {
namespace {

// SQLite's own handler sleeps ever longer, and then starves among writers that come again at once.
constexpr std::chrono::milliseconds kWaitStep{1};
// Larger strings and rows than any of ours are a sign of damage; they are not allocated.
constexpr int kLongestValue = 1 << 20;

// Called while another connection holds the lock; 0 gives up.
int WaitForLock(void* context, int calls) {
  LockPatience& patience = *static_cast<LockPatience*>(context);
  thread_local std::chrono::steady_clock::time_point deadline;
  const auto now = std::chrono::steady_clock::now();
  if (calls == 0) deadline = now + patience.longest();
  if (now >= deadline) {
    patience.noteWait(/*inVain=*/true);
    return 0;
  }
  std::this_thread::sleep_for(kWaitStep);
  return 1;
}

// SQLite syncs the directory when it first syncs a journal or log that it might have had to create.
// Ours stays between transactions; one that is there needs no creating.
int OpenExistingLog(sqlite3_vfs*, const char* name, sqlite3_file* file, int flags, int* outFlags) {
  sqlite3_vfs* system = sqlite3_vfs_find(nullptr);
  const bool mayCreate = (flags & SQLITE_OPEN_CREATE) != 0;
  if ((flags & SQLITE_OPEN_WAL) != 0 && mayCreate && access(name, F_OK) == 0) {
    const int code = system->xOpen(system, name, file, flags & ~SQLITE_OPEN_CREATE, outFlags);
    if (code == SQLITE_OK) return code;
  }
  return system->xOpen(system, name, file, flags, outFlags);
}

// The system's file access with that one difference.
const char* FileAccess() {
  static sqlite3_vfs access = [] {
    sqlite3_vfs copy = *sqlite3_vfs_find(nullptr);
    copy.zName = "quorlet";
    copy.xOpen = OpenExistingLog;
    return copy;
  }();
  static const int registered = sqlite3_vfs_register(&access, /*makeDflt=*/0);
  return registered == SQLITE_OK ? access.zName : nullptr;
}

}  // namespace

int SqliteDatabase::open(const std::string& path, int flags, LockPatience& patience) {
  sqlite3* handle = nullptr;
  // A relative path must not be taken for a URI.
  const std::string name = path.starts_with('/') ? path : "./" + path;
  const int code = sqlite3_open_v2(
      name.c_str(), &handle, flags | SQLITE_OPEN_NOMUTEX | SQLITE_OPEN_NOFOLLOW, FileAccess());
  handle_.reset(handle);
  if (code != SQLITE_OK) {
    handle_.reset();
    return code;
  }
  sqlite3_extended_result_codes(handle, 1);
  sqlite3_busy_handler(handle, WaitForLock, &patience);
  sqlite3_limit(handle, SQLITE_LIMIT_LENGTH, kLongestValue);
  // The file may have been edited by anyone: nothing that it brings along is run.
  sqlite3_db_config(handle, SQLITE_DBCONFIG_DEFENSIVE, 1, nullptr);
  sqlite3_db_config(handle, SQLITE_DBCONFIG_ENABLE_TRIGGER, 0, nullptr);
  sqlite3_db_config(handle, SQLITE_DBCONFIG_ENABLE_VIEW, 0, nullptr);
  sqlite3_db_config(handle, SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0, nullptr);
  return SQLITE_OK;
}

int SqliteDatabase::openInMemory() {
  sqlite3* handle = nullptr;
  const int code =
      sqlite3_open_v2(":memory:", &handle,
                      SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX, nullptr);
  handle_.reset(handle);
  return code;
}

int SqliteDatabase::execute(const char* sql) {
  return sqlite3_exec(handle_.get(), sql, nullptr, nullptr, nullptr);
}

void SqliteDatabase::rollback() {
  if (inTransaction()) static_cast<void>(execute("ROLLBACK"));
}

int SqliteRun::prepare(const SqliteDatabase& database, SqliteStatement& statement) {
  if (statement.handle_) return SQLITE_OK;
  sqlite3_stmt* handle = nullptr;
  const int code = sqlite3_prepare_v3(database.handle(), statement.sql_, -1,
                                      SQLITE_PREPARE_PERSISTENT, &handle, nullptr);
  statement.handle_.reset(handle);
  return code == SQLITE_ERROR ? SQLITE_CORRUPT : code;
}

int SqliteRun::finish() {
  const int code = next();
  return code == SQLITE_DONE || code == SQLITE_ROW ? SQLITE_OK : code;
}

std::string_view SqliteRun::bytes(int column) const {
  // The order matters: asking for the blob settles its size.
  const void* data = sqlite3_column_blob(handle_, column);
  const int size = sqlite3_column_bytes(handle_, column);
  if (data == nullptr) return {};
  return {static_cast<const char*>(data), static_cast<std::size_t>(size)};
}

void SqliteRun::bind(int index, std::int64_t value) {
  const int code = sqlite3_bind_int64(handle_, index, value);
  if (code != SQLITE_OK) code_ = code;
}

void SqliteRun::bind(int index, std::string_view bytes) {
  // A null pointer would bind NULL, not an empty string.
  const char* data = bytes.data() == nullptr ? "" : bytes.data();
  const int code = sqlite3_bind_blob64(handle_, index, data, bytes.size(), SQLITE_STATIC);
  if (code != SQLITE_OK) code_ = code;
}

}  // namespace quorlet
