// The tables of the counter store's database, on one connection. What to do about failures is up
// to the ledger; here they are SQLite's result codes.
#ifndef QUORLET_PLATFORM_LINUX_TALLY_DATABASE_H_
#define QUORLET_PLATFORM_LINUX_TALLY_DATABASE_H_

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/counter_store.h"
#include "platform/linux/sqlite.h"

namespace quorlet {

// Which file is at a path, so that a replaced one is noticed.
struct FileIdentity {
  dev_t device = 0;
  ino_t inode = 0;
  bool operator==(const FileIdentity&) const = default;
};
std::optional<FileIdentity> IdentityOf(const std::string& path);

// Whether the file is not a sound database of ours.
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
  // Opens the database at `path`; a missing one is created, without tables until begin().
  [[nodiscard]] int openForWriting(const std::string& path);
  // Opens an existing database to read it. With `untouched` no file beside it is changed or made:
  // where a killed writer left a transaction half done, a private copy outside of the store is
  // read instead.
  [[nodiscard]] int openForReading(const std::string& path, bool untouched);
  void close() { *this = TallyDatabase(); }

  bool isOpen() const { return database_.isOpen(); }
  // Whether there are no tables yet.
  bool isBlank() const { return isBlank_; }
  SqliteDatabase& connection() { return database_; }
  // The file that was opened.
  const FileIdentity& identity() const { return identity_; }
  // What went wrong last, for people.
  std::string message(int code) const;

  // begin() takes the write lock and makes the tables when they are missing. The writes below
  // happen between begin() and commit(), which leaves the transaction open when it fails.
  [[nodiscard]] int begin();
  [[nodiscard]] int commit() { return database_.execute("COMMIT"); }
  void rollback();

  [[nodiscard]] int setScalar(std::string_view key, std::int32_t day, std::int64_t value);
  [[nodiscard]] int addToScalar(std::string_view key, std::int32_t day, std::int64_t value);
  [[nodiscard]] int recordValues(std::string_view key, std::int32_t day,
                                 std::span<const DistributionSample> samples);
  [[nodiscard]] int dropDaysBefore(std::int32_t firstDay);

  // Outside of a transaction: whether dropDaysBefore has anything to drop.
  [[nodiscard]] int hasDaysBefore(std::int32_t firstDay, bool& has);

 private:
  int openFile(const std::string& path, int flags);
  int setUp(const char* settings);
  int openPrivateCopy(const std::string& path);
  int checkTables();
  int findSequence(std::string_view key, std::int32_t day, std::optional<std::int64_t>& sequence);
  int addSequence(std::string_view key, std::int32_t day, std::int64_t& sequence);
  int fillTail(std::int64_t block, std::size_t size, std::uint64_t& before,
               std::span<const DistributionSample>& samples);
  int addBlock(std::int64_t block, std::uint64_t& before,
               std::span<const DistributionSample>& samples);

  SqliteDatabase database_;
  FileIdentity identity_;
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

#endif  // QUORLET_PLATFORM_LINUX_TALLY_DATABASE_H_
