// scalars    one row for each day and key
// sequences  one row for each distribution: its day, its key, and the number of its blocks' series
// blocks     the packed values (tally_blocks.h), identified by series and position
//
// Rows of one day lie together in key order, which is how the daily pass reads them.
//
// A rollback journal, not a write-ahead log: most writers are processes that record one thing and
// end, each of which would have to empty the log again, and a reader leaves no file behind.
#include "platform/linux/tally_database.h"

#include <sys/stat.h>

#include <algorithm>
#include <limits>

#include "platform/linux/descriptor.h"
#include "platform/linux/tally_blocks.h"
#include "platform/linux/tally_private_copy.h"

namespace quorlet {
namespace {

// What the file says about itself: "QTly", and the version of the tables below.
constexpr std::int64_t kApplicationId = 0x51546c79;
constexpr std::int64_t kTablesVersion = 1;
constexpr char kCreateTables[] =
    "CREATE TABLE scalars(day INTEGER NOT NULL, key BLOB NOT NULL, value INTEGER NOT NULL,"
    " PRIMARY KEY(day, key)) WITHOUT ROWID;"
    "CREATE TABLE sequences(day INTEGER NOT NULL, key BLOB NOT NULL, id INTEGER NOT NULL,"
    " PRIMARY KEY(day, key)) WITHOUT ROWID;"
    "CREATE TABLE blocks(id INTEGER PRIMARY KEY, samples BLOB NOT NULL);"
    "PRAGMA application_id = 0x51546c79;"
    "PRAGMA user_version = 1;";

constexpr char kWriterSettings[] =
    "PRAGMA page_size = 4096;"
    "PRAGMA cache_size = -2048;"
    "PRAGMA cell_size_check = ON;"
    "PRAGMA secure_delete = OFF;"
    "PRAGMA journal_mode = TRUNCATE;"
    "PRAGMA synchronous = NORMAL;";
static_assert(kTallyPageSize == 4096);
constexpr char kReaderSettings[] =
    "PRAGMA cache_size = -1024;"
    "PRAGMA cell_size_check = ON;";
// For a private copy, where nothing needs to last.
constexpr char kCopySettings[] =
    "PRAGMA cache_size = -1024;"
    "PRAGMA cell_size_check = ON;"
    "PRAGMA synchronous = OFF;";

std::int64_t FirstBlock(std::int64_t sequence) { return sequence * kBlocksPerSequence; }
std::int64_t LastBlock(std::int64_t sequence) {
  return FirstBlock(sequence) + kBlocksPerSequence - 1;
}

// How the file says it is to be written and read (bytes 18 and 19 of a database): 1 with a rollback
// journal, 2 with a write-ahead log. A new file has neither.
struct FileFormat {
  unsigned char writing = 1;
  unsigned char reading = 1;
};

FileFormat FormatOf(SqliteDatabase& database) {
  sqlite3_file* file = nullptr;
  unsigned char bytes[2];
  sqlite3_file_control(database.handle(), "main", SQLITE_FCNTL_FILE_POINTER, &file);
  if (file == nullptr || file->pMethods == nullptr) return {};
  if (file->pMethods->xRead(file, bytes, sizeof(bytes), 18) != SQLITE_OK) return {};
  return {bytes[0], bytes[1]};
}

class BlobHandle {
 public:
  BlobHandle() = default;
  BlobHandle(const BlobHandle&) = delete;
  BlobHandle& operator=(const BlobHandle&) = delete;
  ~BlobHandle() { sqlite3_blob_close(blob_); }
  [[nodiscard]] int open(SqliteDatabase& database, std::int64_t block) {
    return sqlite3_blob_open(database.handle(), "main", "blocks", "samples", block, 1, &blob_);
  }
  [[nodiscard]] int read(char* bytes, std::size_t size) {
    return sqlite3_blob_read(blob_, bytes, static_cast<int>(size), 0);
  }
  // The caller has checked that the range lies in the block.
  [[nodiscard]] int write(const std::string& bytes, std::size_t offset) {
    return sqlite3_blob_write(blob_, bytes.data(), static_cast<int>(bytes.size()),
                              static_cast<int>(offset));
  }

 private:
  sqlite3_blob* blob_ = nullptr;
};

}  // namespace

std::optional<FileIdentity> IdentityOf(const std::string& path) {
  struct stat status {};
  if (stat(path.c_str(), &status) != 0) return std::nullopt;
  return FileIdentity{status.st_dev, status.st_ino};
}

bool IsDamage(int code) {
  const int kind = code & 0xff;
  // Too big are only rows that nobody wrote: what is written is checked before.
  return kind == SQLITE_CORRUPT || kind == SQLITE_NOTADB || kind == SQLITE_TOOBIG;
}

bool IsMoved(int code) { return code == SQLITE_READONLY_DBMOVED; }

std::string TallyDatabase::message(int code) const {
  // The connection knows more only about what it has reported itself.
  if (isOpen() && sqlite3_extended_errcode(database_.handle()) == code) {
    return sqlite3_errmsg(database_.handle());
  }
  return sqlite3_errstr(code);
}

int TallyDatabase::openFile(const std::string& path, int flags) {
  close();
  struct stat status {};
  const bool exists = stat(path.c_str(), &status) == 0;
  // Opening a FIFO might wait forever.
  if (exists && !S_ISREG(status.st_mode)) return SQLITE_CANTOPEN;
  if (const int code = database_.open(path, flags); code != SQLITE_OK) return code;
  // Looked at before the file was opened: if it was replaced in between, the old identity only
  // makes the next user open it once more.
  if (exists) {
    identity_ = {status.st_dev, status.st_ino};
  } else if (const std::optional<FileIdentity> created = IdentityOf(path)) {
    identity_ = *created;
  }
  // SQLite would take any other format for one that may only be read.
  return FormatOf(database_).writing <= 2 ? SQLITE_OK : SQLITE_NOTADB;
}

int TallyDatabase::setUp(const char* settings) {
  int code = database_.execute(settings);
  if (code == SQLITE_OK) code = checkTables();
  // The statements are right: one that the file does not allow is the file's fault.
  return code == SQLITE_ERROR ? SQLITE_NOTADB : code;
}

int TallyDatabase::openForWriting(const std::string& path) {
  // SQLite would make the file readable for everybody. What goes wrong here it finds out as well.
  const Descriptor made(open(path.c_str(), O_RDONLY | O_CREAT | O_CLOEXEC | O_NONBLOCK, 0640));
  const int code = openFile(path, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE);
  return code == SQLITE_OK ? setUp(kWriterSettings) : code;
}

int TallyDatabase::openForReading(const std::string& path, bool untouched) {
  int code = openFile(path, untouched ? SQLITE_OPEN_READONLY : SQLITE_OPEN_READWRITE);
  if (code != SQLITE_OK) return code;
  // Somebody switched to a write-ahead log, with which even reading makes files. (A writer switches
  // back.)
  if (untouched && FormatOf(database_).reading == 2) return SQLITE_CANTOPEN;
  code = setUp(kReaderSettings);
  return untouched && code == SQLITE_READONLY_ROLLBACK ? openPrivateCopy(path) : code;
}

int TallyDatabase::openPrivateCopy(const std::string& path) {
  const TallyPrivateCopy copy(path);
  if (copy.path().empty()) return SQLITE_CANTOPEN;
  const FileIdentity original = identity_;
  const int code = openFile(copy.path(), SQLITE_OPEN_READWRITE);
  identity_ = original;
  return code == SQLITE_OK ? setUp(kCopySettings) : code;
}

// Whose tables the file holds, seen in one read transaction: another process may just be making
// them.
int TallyDatabase::checkTables() {
  SqliteStatement application("PRAGMA application_id");
  SqliteStatement version("PRAGMA user_version");
  SqliteStatement tables("SELECT count(*) FROM sqlite_schema");
  const auto read = [this](SqliteStatement& statement, std::int64_t& value) {
    SqliteRun run(database_, statement);
    const int code = run.next();
    if (code == SQLITE_ROW) value = run.integer(0);
    return code == SQLITE_ROW ? SQLITE_OK : code;
  };
  const bool joins = database_.inTransaction();
  std::int64_t applicationId = 0, tablesVersion = 0, tableCount = 0;
  int code = joins ? SQLITE_OK : database_.execute("BEGIN");
  if (code == SQLITE_OK) code = read(tables, tableCount);
  if (code == SQLITE_OK) code = read(application, applicationId);
  if (code == SQLITE_OK) code = read(version, tablesVersion);
  if (!joins) database_.rollback();
  if (code != SQLITE_OK) return code;
  isBlank_ = applicationId == 0 && tablesVersion == 0 && tableCount == 0;
  const bool isOurs = applicationId == kApplicationId && tablesVersion == kTablesVersion;
  return isBlank_ || isOurs ? SQLITE_OK : SQLITE_NOTADB;
}

int TallyDatabase::begin() {
  int code = database_.execute("BEGIN IMMEDIATE");
  if (code == SQLITE_OK && isBlank_) {
    code = checkTables();
    if (code == SQLITE_OK && isBlank_) code = database_.execute(kCreateTables);
  }
  return code;
}

void TallyDatabase::rollback() {
  database_.rollback();
  // The tables may be gone again; begin() looks.
  isBlank_ = true;
}

int TallyDatabase::setScalar(std::string_view key, std::int32_t day, std::int64_t value) {
  return SqliteRun(database_, putScalar_, std::int64_t{day}, key, value).finish();
}

int TallyDatabase::addToScalar(std::string_view key, std::int32_t day, std::int64_t value) {
  return SqliteRun(database_, addScalar_, std::int64_t{day}, key, value).finish();
}

int TallyDatabase::findSequence(std::string_view key, std::int32_t day,
                                std::optional<std::int64_t>& sequence) {
  SqliteRun run(database_, findSequence_, std::int64_t{day}, key);
  const int code = run.next();
  if (code == SQLITE_DONE) return SQLITE_OK;
  if (code != SQLITE_ROW) return code;
  sequence = run.integer(0);
  return *sequence >= 0 && *sequence <= kLastSequence ? SQLITE_OK : SQLITE_CORRUPT;
}

int TallyDatabase::addSequence(std::string_view key, std::int32_t day, std::int64_t& sequence) {
  {
    SqliteRun run(database_, lastBlock_);
    const int code = run.next();
    if (code != SQLITE_ROW) return code;
    // No block at all reads as 0, which leaves sequence 0 unused.
    const std::int64_t last = run.integer(0) / kBlocksPerSequence;
    if (last < 0 || last >= kLastSequence) return SQLITE_CORRUPT;
    sequence = last + 1;
  }
  return SqliteRun(database_, putSequence_, std::int64_t{day}, key, sequence).finish();
}

int TallyDatabase::recordValues(std::string_view key, std::int32_t day,
                                std::span<const DistributionSample> samples) {
  if (samples.empty()) return SQLITE_OK;
  std::optional<std::int64_t> found;
  if (const int code = findSequence(key, day, found); code != SQLITE_OK) return code;
  std::int64_t block = 0;
  std::uint64_t before = 0;
  if (found) {
    std::size_t size = 0;
    {
      SqliteRun run(database_, tailBlock_, FirstBlock(*found), LastBlock(*found));
      const int code = run.next();
      // A sequence has at least one block.
      if (code != SQLITE_ROW) return code == SQLITE_DONE ? SQLITE_CORRUPT : code;
      block = run.integer(0);
      size = static_cast<std::size_t>(run.integer(1));
    }
    if (const int code = fillTail(block, size, before, samples); code != SQLITE_OK) return code;
    ++block;
  } else {
    std::int64_t sequence = 0;
    if (const int code = addSequence(key, day, sequence); code != SQLITE_OK) return code;
    block = FirstBlock(sequence);
  }
  for (; !samples.empty(); ++block) {
    // The last number stays free, so that the next block never counts to the next sequence.
    if ((block + 1) % kBlocksPerSequence == 0) return SQLITE_FULL;
    if (const int code = addBlock(block, before, samples); code != SQLITE_OK) return code;
  }
  return SQLITE_OK;
}

// Puts as many samples as fit into the block, of `size` bytes, and takes them off `samples`;
// `before` becomes the number of values up to the end of the block.
int TallyDatabase::fillTail(std::int64_t block, std::size_t size, std::uint64_t& before,
                            std::span<const DistributionSample>& samples) {
  const std::optional<std::size_t> capacity = BlockCapacity(size);
  if (!capacity) return SQLITE_CORRUPT;
  BlobHandle blob;
  int code = blob.open(database_, block);
  if (code != SQLITE_OK) return code;
  scratch_.resize(kBlockHeaderSize);
  if (code = blob.read(scratch_.data(), kBlockHeaderSize); code != SQLITE_OK) return code;
  std::optional<BlockHeader> header = ReadBlockHeader(scratch_, *capacity);
  if (!header || __builtin_add_overflow(header->before, header->count, &before)) {
    return SQLITE_CORRUPT;
  }
  const auto added = samples.first(std::min(samples.size(), *capacity - header->count));
  if (added.empty()) return SQLITE_OK;
  scratch_.clear();
  AppendPackedSamples(scratch_, added);
  code = blob.write(scratch_, BlockSize(header->count));
  if (code != SQLITE_OK) return code;
  header->count += static_cast<std::uint32_t>(added.size());
  before += added.size();
  scratch_.clear();
  AppendBlockHeader(scratch_, *header);
  samples = samples.subspan(added.size());
  return blob.write(scratch_, 0);
}

int TallyDatabase::addBlock(std::int64_t block, std::uint64_t& before,
                            std::span<const DistributionSample>& samples) {
  const std::size_t capacity = NextBlockCapacity(before, samples.size());
  const auto added = samples.first(std::min(samples.size(), capacity));
  scratch_.clear();
  AppendBlockHeader(scratch_, {before, static_cast<std::uint32_t>(added.size())});
  AppendPackedSamples(scratch_, added);
  scratch_.resize(BlockSize(capacity));
  before += added.size();
  samples = samples.subspan(added.size());
  return SqliteRun(database_, putBlock_, block, std::string_view(scratch_)).finish();
}

int TallyDatabase::hasDaysBefore(std::int32_t firstDay, bool& has) {
  has = false;
  if (isBlank_) {
    if (const int code = checkTables(); code != SQLITE_OK || isBlank_) return code;
  }
  SqliteStatement query(
      "SELECT EXISTS(SELECT 1 FROM scalars WHERE day < ?1)"
      " OR EXISTS(SELECT 1 FROM sequences WHERE day < ?1)");
  SqliteRun run(database_, query, std::int64_t{firstDay});
  const int code = run.next();
  if (code != SQLITE_ROW) return code;
  has = run.integer(0) != 0;
  return SQLITE_OK;
}

int TallyDatabase::dropDaysBefore(std::int32_t firstDay) {
  SqliteStatement scalars("DELETE FROM scalars WHERE day < ?1");
  SqliteStatement old("SELECT id FROM sequences WHERE day < ?1");
  SqliteStatement blocks("DELETE FROM blocks WHERE id BETWEEN ?1 AND ?2");
  SqliteStatement sequences("DELETE FROM sequences WHERE day < ?1");
  const std::int64_t day = firstDay;
  int code = SqliteRun(database_, scalars, day).finish();
  if (code != SQLITE_OK) return code;
  {
    SqliteRun run(database_, old, day);
    while ((code = run.next()) == SQLITE_ROW) {
      const std::int64_t sequence = run.integer(0);
      if (sequence < 0 || sequence > kLastSequence) return SQLITE_CORRUPT;
      code = SqliteRun(database_, blocks, FirstBlock(sequence), LastBlock(sequence)).finish();
      if (code != SQLITE_OK) return code;
    }
  }
  if (code != SQLITE_DONE) return code;
  return SqliteRun(database_, sequences, day).finish();
}

}  // namespace quorlet
