// SQLite's handles with owners, for the counter store's database.
#ifndef QUORLET_PLATFORM_LINUX_COUNTERS_SQLITE_H_
#define QUORLET_PLATFORM_LINUX_COUNTERS_SQLITE_H_

#include <sqlite3.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

namespace quorlet {

// How long a process waits for the locks of others. After a wait in vain the next ones are short,
// until one succeeds: whoever stands in the way is likely to stand there still, and a pass with
// many steps must come to its end. Shared by the process's connections; they must not outlive it.
class LockPatience {
 public:
  explicit LockPatience(std::chrono::milliseconds longest) : longest_(longest) {}

  std::chrono::milliseconds longest() const {
    return isSpent_ ? std::min(longest_, kShortWait) : longest_;
  }
  void noteWait(bool inVain) { isSpent_ = inVain; }

 private:
  static constexpr std::chrono::milliseconds kShortWait{500};
  const std::chrono::milliseconds longest_;
  std::atomic<bool> isSpent_ = false;
};

// One connection. Codes are SQLite's extended result codes. Not for two threads at once.
class SqliteDatabase {
 public:
  // `flags`: SQLITE_OPEN_... . A link in the last part of the path is refused.
  [[nodiscard]] int open(const std::string& path, int flags, LockPatience& patience);
  // An empty one that is nobody else's.
  [[nodiscard]] int openInMemory();
  void close() { handle_.reset(); }
  bool isOpen() const { return handle_ != nullptr; }
  sqlite3* handle() const { return handle_.get(); }

  // Runs statements that give no rows.
  [[nodiscard]] int execute(const char* sql);
  // Ends an open transaction without keeping anything.
  void rollback();
  bool inTransaction() const { return sqlite3_get_autocommit(handle_.get()) == 0; }

 private:
  struct Close {
    void operator()(sqlite3* handle) const { sqlite3_close_v2(handle); }
  };
  std::unique_ptr<sqlite3, Close> handle_;
};

// A statement, prepared when it first runs. Must not outlive its connection's last use.
class SqliteStatement {
 public:
  // `sql` must outlive the statement.
  explicit SqliteStatement(const char* sql) : sql_(sql) {}

 private:
  friend class SqliteRun;
  struct Finalize {
    void operator()(sqlite3_stmt* handle) const { sqlite3_finalize(handle); }
  };
  const char* sql_;
  std::unique_ptr<sqlite3_stmt, Finalize> handle_;
};

// One run of a statement; its end lets go of the rows and locks. A statement has one run at a time.
class SqliteRun {
 public:
  // Bound byte strings must outlive the run.
  template <typename... Values>
  SqliteRun(const SqliteDatabase& database, SqliteStatement& statement, const Values&... values)
      : code_(prepare(database, statement)), handle_(statement.handle_.get()) {
    int index = 0;
    if (code_ == SQLITE_OK) (bind(++index, values), ...);
  }
  SqliteRun(const SqliteRun&) = delete;
  SqliteRun& operator=(const SqliteRun&) = delete;
  ~SqliteRun() { sqlite3_reset(handle_); }

  // SQLITE_ROW, SQLITE_DONE, or the error. A schema that the statement does not fit counts as
  // SQLITE_CORRUPT.
  [[nodiscard]] int next() { return code_ == SQLITE_OK ? sqlite3_step(handle_) : code_; }
  // Runs a statement without rows to its end: SQLITE_OK or the error.
  [[nodiscard]] int finish();

  // Columns of the current row; byte strings are valid until the next call of next().
  std::int64_t integer(int column) const { return sqlite3_column_int64(handle_, column); }
  std::string_view bytes(int column) const;

 private:
  static int prepare(const SqliteDatabase& database, SqliteStatement& statement);
  void bind(int index, std::int64_t value);
  void bind(int index, std::string_view bytes);

  int code_;
  sqlite3_stmt* handle_;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_COUNTERS_SQLITE_H_
