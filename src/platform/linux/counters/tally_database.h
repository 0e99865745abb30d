// The tables of the counter store's database, on one connection. What to do about failures is up
// to the ledger; here they are SQLite's result codes.
#ifndef QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_DATABASE_H_
#define QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_DATABASE_H_

#include <sys/types.h>

#include <array>
#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/counter_store.h"
#include "platform/linux/counters/sqlite.h"

namespace quorlet {

// Which file is at a path, so that a replaced one is noticed.
struct FileIdentity {
  dev_t device = 0;
  ino_t inode = 0;
  bool operator==(const FileIdentity&) const = default;
};
// What is at `path`: 0 and its identity, ENOENT when there is nothing, or the errno that keeps it
// from being known.
[[nodiscard]] int FindIdentity(const std::string& path, FileIdentity& identity);

// The database's own files beside it.
inline constexpr std::array<const char*, 3> kTallySideFiles = {"-wal", "-shm", "-journal"};

// The bytes of a new database with its tables and no rows; empty when there is no memory for it.
std::string NewTallyDatabase();

// Whether the code says that the file is not a sound database of ours. That may be a passing
// error's doing: a second look, by examine(), decides.
bool IsDamage(int code);
// Whether the file was moved away under the connection, so that nothing was written.
bool IsMoved(int code);

// Keys longer than this are refused.
inline constexpr std::size_t kLongestTallyKey = 65536;

// The block of number n (from 0) of sequence s has the identifier s * kBlocksPerSequence + n.
inline constexpr std::int64_t kBlocksPerSequence = 1 << 20;
inline constexpr std::int64_t kLastSequence = (std::int64_t{1} << 42) - 1;

class TallyDatabase {
 public:
  // Opens the database at `path`, which must exist. It may turn out to be blank: without tables.
  [[nodiscard]] int openForWriting(const std::string& path, LockPatience& patience);
  // Opens an existing database to read it. With `untouched`, or where this process may not write, a
  // private copy outside of the store is read: even reading makes files beside the database.
  [[nodiscard]] int openForReading(const std::string& path, bool untouched, LockPatience& patience);
  void close() { *this = TallyDatabase(); }

  bool isOpen() const { return database_.isOpen(); }
  // Whether there are no tables.
  bool isBlank() const { return isBlank_; }
  SqliteDatabase& connection() { return database_; }
  // The file that was opened.
  const FileIdentity& identity() const { return identity_; }
  // What went wrong last, for people.
  std::string message(int code) const;

  // begin() takes the write lock; SQLITE_READONLY_DBMOVED when another file has the name by then.
  // The writes below happen between begin() and commit(), which leaves the transaction open when it
  // fails. What was committed is durable.
  [[nodiscard]] int begin();
  [[nodiscard]] int commit() { return database_.execute("COMMIT"); }
  void rollback() { database_.rollback(); }
  // Copies what the write-ahead log holds into the database, as far as nobody reads it just now.
  void copyBack() { static_cast<void>(database_.execute("PRAGMA wal_checkpoint(PASSIVE)")); }

  [[nodiscard]] int setScalar(std::string_view key, std::int32_t day, std::int64_t value);
  [[nodiscard]] int addToScalar(std::string_view key, std::int32_t day, std::int64_t value);
  [[nodiscard]] int recordValues(std::string_view key, std::int32_t day,
                                 std::span<const DistributionSample> samples);
  [[nodiscard]] int dropDaysBefore(std::int32_t firstDay);
  // Drops every scalar and distribution; the notes stay.
  [[nodiscard]] int dropCounters();
  // Replaces the note of that name, or removes it when there is no value.
  [[nodiscard]] int setNote(std::string_view name, const std::optional<std::string>& value);

  // The note of that name, or nothing; inside or outside of a transaction.
  [[nodiscard]] int readNote(std::string_view name, std::optional<std::string>& value);
  // The keys of a day, scalars' first, each with the number of its values (nothing for a scalar),
  // until `handler` answers false.
  [[nodiscard]] int keysOfDay(
      std::int32_t day,
      const std::function<bool(std::string_view, std::optional<std::uint64_t>)>& handler);
  // Outside of a transaction: whether dropDaysBefore has anything to drop.
  [[nodiscard]] int hasDaysBefore(std::int32_t firstDay, bool& has);
  // Looks for damage: of the file's structure and of what ties its tables together; with `values`,
  // of every block of values too. SQLITE_OK when it is sound.
  [[nodiscard]] int examine(bool values);

 private:
  int refuse(std::string why);
  int checkFiles(const std::string& path);
  int openFile(const std::string& path, LockPatience& patience);
  int setUp(const char* settings);
  int openPrivateCopy(const std::string& path, LockPatience& patience);
  int checkTables();
  int read(const char* query, std::int64_t& value);
  int checkValues();
  int findSequence(std::string_view key, std::int32_t day, std::optional<std::int64_t>& sequence);
  int addSequence(std::string_view key, std::int32_t day, std::int64_t& sequence);
  int fillTail(std::int64_t block, std::size_t size, std::uint64_t& before,
               std::span<const DistributionSample>& samples);
  int addBlock(std::int64_t block, std::uint64_t& before,
               std::span<const DistributionSample>& samples);

  SqliteDatabase database_;
  std::string path_;
  FileIdentity identity_;
  std::string refusal_;
  bool isBlank_ = false;
  std::string scratch_;

  // SQLite would turn a sum that overflows into a real.
  SqliteStatement addScalar_{
      "INSERT INTO scalars(day, key, value) VALUES(?1, ?2, ?3) ON CONFLICT(day, key) DO UPDATE"
      " SET value = CASE"
      " WHEN ?3 > 0 AND value > 9223372036854775807 - ?3 THEN 9223372036854775807"
      " WHEN ?3 < 0 AND value < -9223372036854775807 - 1 - ?3 THEN -9223372036854775807 - 1"
      " ELSE value + ?3 END"};
  SqliteStatement putScalar_{"REPLACE INTO scalars(day, key, value) VALUES(?1, ?2, ?3)"};
  SqliteStatement findSequence_{"SELECT id FROM sequences WHERE day = ?1 AND key = ?2"};
  SqliteStatement putSequence_{"INSERT INTO sequences(day, key, id) VALUES(?1, ?2, ?3)"};
  SqliteStatement lastBlock_{"SELECT max(id) FROM blocks"};
  SqliteStatement tailBlock_{
      "SELECT id, length(samples) FROM blocks WHERE id BETWEEN ?1 AND ?2 ORDER BY id DESC LIMIT 1"};
  SqliteStatement putBlock_{"INSERT INTO blocks(id, samples) VALUES(?1, ?2)"};
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_DATABASE_H_
