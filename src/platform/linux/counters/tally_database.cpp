// scalars    one row for each day and key
// sequences  one row for each distribution: its day, its key, and the number of its blocks' series
// blocks     the packed values (tally_blocks.h), identified by series and position
//
// notes      what the program itself has to remember in one transaction with the counters, in parts
//
// Rows of one day lie together in key order, which is how the daily pass reads them.
//
// A write-ahead log: a commit is one sync, and readers and writers do not wait for each other. The
// log stays beside the database and is emptied when it has grown, not whenever the last user
// leaves: most writers record one thing and end.
#include "platform/linux/counters/tally_database.h"

#include <stdlib.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <limits>
#include <memory>
#include <utility>
#include <vector>

#include "platform/linux/base/files.h"
#include "platform/linux/counters/tally_blocks.h"
#include "platform/linux/counters/tally_private_copy.h"

namespace quorlet {
namespace {

// What the file says about itself: "QTly", and the version of the tables below.
constexpr std::int64_t kApplicationId = 0x51546c79;
constexpr std::int64_t kTablesVersion = 1;
constexpr char kCreateTables[] =
    "PRAGMA page_size = 4096;"
    "CREATE TABLE scalars(day INTEGER NOT NULL, key BLOB NOT NULL, value INTEGER NOT NULL,"
    " PRIMARY KEY(day, key)) WITHOUT ROWID;"
    "CREATE TABLE sequences(day INTEGER NOT NULL, key BLOB NOT NULL, id INTEGER NOT NULL,"
    " PRIMARY KEY(day, key)) WITHOUT ROWID;"
    "CREATE TABLE blocks(id INTEGER PRIMARY KEY, samples BLOB NOT NULL);"
    "PRAGMA application_id = 0x51546c79;"
    "PRAGMA user_version = 1;";
// A database of an earlier release gets this table with its first note.
constexpr char kCreateNotes[] =
    "CREATE TABLE IF NOT EXISTS notes(name BLOB NOT NULL, part INTEGER NOT NULL,"
    " value BLOB NOT NULL, PRIMARY KEY(name, part)) WITHOUT ROWID;";
// A note may be larger than a value may be.
constexpr std::size_t kNotePart = std::size_t{1} << 19;

// FULL is what makes a commit durable: the log is synced before it returns. EXTRA is the same, and
// keeps the promise where an old journal could not be given up yet because somebody reads.
// 256 pages of log are a millisecond's reading for whoever opens the database first.
constexpr char kWriterSettings[] =
    "PRAGMA cache_size = -2048;"
    "PRAGMA cell_size_check = ON;"
    "PRAGMA secure_delete = OFF;"
    "PRAGMA synchronous = EXTRA;"
    "PRAGMA wal_autocheckpoint = 256;"
    "PRAGMA journal_size_limit = 1048576;";
static_assert(kTallyPageSize == 4096);
constexpr char kWriteAheadLog[] = "PRAGMA journal_mode = WAL;";
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

// What the start of a database says. Read through the connection: a descriptor of our own would,
// when closed, take all of this process's locks on the file with it.
struct FileHeader {
  bool isDatabase = false;
  bool isEmpty = false;
  bool hasWholePages = false;
  // How it is to be written: with a rollback journal (1) or with a write-ahead log (2).
  unsigned char format = 0;
};

FileHeader HeaderOf(SqliteDatabase& database) {
  constexpr std::string_view kMagic("SQLite format 3\0", 16);
  constexpr int kWriteFormat = 18, kReadFormat = 19;
  sqlite3_file* file = nullptr;
  char bytes[20] = {};
  sqlite3_int64 size = 0;
  sqlite3_file_control(database.handle(), "main", SQLITE_FCNTL_FILE_POINTER, &file);
  if (file == nullptr || file->pMethods == nullptr) return {};
  if (file->pMethods->xFileSize(file, &size) != SQLITE_OK) return {};
  if (size == 0) return {.isEmpty = true};
  const bool hasWholePages = size % static_cast<sqlite3_int64>(kTallyPageSize) == 0;
  if (file->pMethods->xRead(file, bytes, sizeof(bytes), 0) != SQLITE_OK) return {};
  const auto format = static_cast<unsigned char>(bytes[kWriteFormat]);
  const bool isKnown = (format == 1 || format == 2) && bytes[kReadFormat] == bytes[kWriteFormat];
  return {.isDatabase = isKnown && std::string_view(bytes, kMagic.size()) == kMagic,
          .hasWholePages = hasWholePages,
          .format = format};
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

int FindIdentity(const std::string& path, FileIdentity& identity) {
  struct stat status {};
  if (lstat(path.c_str(), &status) != 0) return errno;
  identity = {status.st_dev, status.st_ino};
  return 0;
}

std::string NewTallyDatabase() {
  // How a database says that a write-ahead log belongs to it; in memory there is none to set up.
  constexpr std::size_t kWriteFormat = 18, kReadFormat = 19;
  SqliteDatabase database;
  if (database.openInMemory() != SQLITE_OK) return "";
  if (database.execute(kCreateTables) != SQLITE_OK) return "";
  if (database.execute(kCreateNotes) != SQLITE_OK) return "";
  sqlite3_int64 size = 0;
  unsigned char* bytes = sqlite3_serialize(database.handle(), "main", &size, 0);
  if (bytes == nullptr) return "";
  std::string text(reinterpret_cast<const char*>(bytes), static_cast<std::size_t>(size));
  sqlite3_free(bytes);
  text.at(kWriteFormat) = text.at(kReadFormat) = 2;
  return text;
}

bool IsDamage(int code) {
  const int kind = code & 0xff;
  // Too big are only rows that nobody wrote: what is written is checked before.
  return kind == SQLITE_CORRUPT || kind == SQLITE_NOTADB || kind == SQLITE_TOOBIG;
}

bool IsMoved(int code) { return code == SQLITE_READONLY_DBMOVED; }

std::string TallyDatabase::message(int code) const {
  if (!refusal_.empty()) return refusal_;
  // The connection knows more only about what it has reported itself.
  if (isOpen() && sqlite3_extended_errcode(database_.handle()) == code) {
    return sqlite3_errmsg(database_.handle());
  }
  return sqlite3_errstr(code);
}

int TallyDatabase::refuse(std::string why) {
  refusal_ = std::move(why);
  return SQLITE_CANTOPEN;
}

// Neither the database nor a file beside it may be anything that others have a hand in: a link, a
// second name of some other file, a FIFO that would be waited for.
int TallyDatabase::checkFiles(const std::string& path) {
  struct stat status {};
  if (lstat(path.c_str(), &status) != 0) return refuse(ErrnoText(errno));
  identity_ = {status.st_dev, status.st_ino};
  const auto isOurs = [](const struct stat& file) {
    return S_ISREG(file.st_mode) && file.st_nlink == 1;
  };
  if (!isOurs(status)) return refuse("it is not a file with one name");
  for (const char* suffix : kTallySideFiles) {
    if (lstat((path + suffix).c_str(), &status) == 0) {
      if (!isOurs(status)) return refuse(path + suffix + " is not a file with one name");
    } else if (errno != ENOENT) {
      return refuse(ErrnoText(errno));
    }
  }
  return SQLITE_OK;
}

int TallyDatabase::openFile(const std::string& path, LockPatience& patience) {
  close();
  path_ = path;
  // SQLite refuses links in every part of the path; directories may be links.
  const std::size_t name = path.rfind('/') + 1;
  const std::unique_ptr<char, decltype(&free)> directory(
      realpath(path.substr(0, name).c_str(), nullptr), &free);
  if (directory == nullptr) return refuse(ErrnoText(errno));
  if (const int code = checkFiles(path); code != SQLITE_OK) return code;
  const std::string resolved = JoinPath(directory.get(), path.substr(name));
  if (const int code = database_.open(resolved, SQLITE_OPEN_READWRITE, patience);
      code != SQLITE_OK) {
    return code;
  }
  // The log stays when the last connection closes, and is not copied back then: see above.
  int on = 1;
  sqlite3_file_control(database_.handle(), "main", SQLITE_FCNTL_PERSIST_WAL, &on);
  sqlite3_db_config(database_.handle(), SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 1, nullptr);
  // With a log beside it SQLite may not even look at the file's own first page. That is right where
  // a power cut tore the page while the log was being copied back: the log still has it.
  const FileHeader header = HeaderOf(database_);
  if (header.isEmpty || header.isDatabase) return SQLITE_OK;
  struct stat log {};
  const bool hasLog = stat((path + kTallySideFiles[0]).c_str(), &log) == 0 && log.st_size > 0;
  return hasLog && header.hasWholePages ? SQLITE_OK : SQLITE_NOTADB;
}

int TallyDatabase::setUp(const char* settings) {
  int code = database_.execute(settings);
  if (code == SQLITE_OK) code = checkTables();
  // The statements are right: one that the file does not allow is the file's fault.
  return code == SQLITE_ERROR ? SQLITE_NOTADB : code;
}

int TallyDatabase::openForWriting(const std::string& path, LockPatience& patience) {
  int code = openFile(path, patience);
  if (code == SQLITE_OK) code = setUp(kWriterSettings);
  if (code != SQLITE_OK || isBlank_ || HeaderOf(database_).format != 1) return code;
  // A database of an earlier release. While somebody reads it, it stays as it is.
  code = database_.execute(kWriteAheadLog);
  return (code & 0xff) == SQLITE_BUSY ? SQLITE_OK : code;
}

int TallyDatabase::openForReading(const std::string& path, bool untouched, LockPatience& patience) {
  if (untouched) return openPrivateCopy(path, patience);
  int code = openFile(path, patience);
  if (code == SQLITE_OK) code = setUp(kReaderSettings);
  const int kind = code & 0xff;
  const bool mayNotWrite = kind == SQLITE_READONLY || kind == SQLITE_CANTOPEN;
  return mayNotWrite && refusal_.empty() ? openPrivateCopy(path, patience) : code;
}

int TallyDatabase::openPrivateCopy(const std::string& path, LockPatience& patience) {
  close();
  FileIdentity original;
  if (const int error = FindIdentity(path, original)) return refuse(ErrnoText(error));
  const TallyPrivateCopy copy(path);
  if (copy.path().empty()) return refuse("no copy of it can be made: " + copy.error());
  int code = openFile(copy.path(), patience);
  path_ = path;
  identity_ = original;
  return code == SQLITE_OK ? setUp(kCopySettings) : code;
}

int TallyDatabase::read(const char* query, std::int64_t& value) {
  SqliteStatement statement(query);
  SqliteRun run(database_, statement);
  const int code = run.next();
  if (code == SQLITE_ROW) value = run.integer(0);
  return code == SQLITE_ROW ? SQLITE_OK : code;
}

// Whose tables the file holds, seen in one read transaction.
int TallyDatabase::checkTables() {
  std::int64_t applicationId = 0, tablesVersion = 0, tableCount = 0;
  int code = database_.execute("BEGIN");
  if (code == SQLITE_OK) code = read("SELECT count(*) FROM sqlite_schema", tableCount);
  if (code == SQLITE_OK) code = read("PRAGMA application_id", applicationId);
  if (code == SQLITE_OK) code = read("PRAGMA user_version", tablesVersion);
  database_.rollback();
  if (code != SQLITE_OK) return code;
  isBlank_ = applicationId == 0 && tablesVersion == 0 && tableCount == 0;
  const bool isOurs = applicationId == kApplicationId && tablesVersion == kTablesVersion;
  return isBlank_ || isOurs ? SQLITE_OK : SQLITE_NOTADB;
}

int TallyDatabase::begin() {
  const int code = database_.execute("BEGIN IMMEDIATE");
  if (code != SQLITE_OK) return code;
  // While we waited, another process may have found the database damaged and moved it aside.
  FileIdentity named;
  const bool isNamed = FindIdentity(path_, named) == 0 && named == identity_;
  return isNamed ? SQLITE_OK : SQLITE_READONLY_DBMOVED;
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

int TallyDatabase::keysOfDay(
    std::int32_t day,
    const std::function<bool(std::string_view, std::optional<std::uint64_t>)>& handler) {
  SqliteStatement scalars("SELECT key FROM scalars WHERE day = ?1");
  SqliteStatement sequences(
      "SELECT key, (SELECT substr(samples, 1, 12) FROM blocks WHERE blocks.id BETWEEN"
      " sequences.id * 1048576 AND sequences.id * 1048576 + 1048575 ORDER BY blocks.id DESC LIMIT "
      "1)"
      " FROM sequences WHERE day = ?1");
  static_assert(kBlocksPerSequence == 1048576 && kBlockHeaderSize == 12);
  int code = SQLITE_OK;
  {
    SqliteRun run(database_, scalars, std::int64_t{day});
    while ((code = run.next()) == SQLITE_ROW) {
      if (!handler(run.bytes(0), std::nullopt)) return SQLITE_OK;
    }
    if (code != SQLITE_DONE) return code;
  }
  SqliteRun run(database_, sequences, std::int64_t{day});
  while ((code = run.next()) == SQLITE_ROW) {
    const auto last = ReadBlockHeader(run.bytes(1), std::numeric_limits<std::uint32_t>::max());
    std::uint64_t count = 0;
    if (!last || __builtin_add_overflow(last->before, last->count, &count)) return SQLITE_CORRUPT;
    if (!handler(run.bytes(0), count)) return SQLITE_OK;
  }
  return code == SQLITE_DONE ? SQLITE_OK : code;
}

int TallyDatabase::hasDaysBefore(std::int32_t firstDay, bool& has) {
  has = false;
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

int TallyDatabase::dropCounters() {
  return database_.execute("DELETE FROM scalars; DELETE FROM sequences; DELETE FROM blocks;");
}

int TallyDatabase::setNote(std::string_view name, const std::optional<std::string>& value) {
  if (const int code = database_.execute(kCreateNotes); code != SQLITE_OK) return code;
  SqliteStatement remove("DELETE FROM notes WHERE name = ?1");
  SqliteStatement put("INSERT INTO notes(name, part, value) VALUES(?1, ?2, ?3)");
  int code = SqliteRun(database_, remove, name).finish();
  if (!value) return code;
  std::string_view rest = *value;
  for (std::int64_t part = 0; code == SQLITE_OK && (part == 0 || !rest.empty()); ++part) {
    const std::string_view bytes = rest.substr(0, kNotePart);
    code = SqliteRun(database_, put, name, part, bytes).finish();
    rest.remove_prefix(bytes.size());
  }
  return code;
}

int TallyDatabase::readNote(std::string_view name, std::optional<std::string>& value) {
  value.reset();
  std::int64_t tables = 0;
  int code = read("SELECT count(*) FROM sqlite_schema WHERE name = 'notes'", tables);
  if (code != SQLITE_OK || tables == 0) return code;
  SqliteStatement query("SELECT value FROM notes WHERE name = ?1 ORDER BY part");
  SqliteRun run(database_, query, name);
  while ((code = run.next()) == SQLITE_ROW) {
    if (!value) value.emplace();
    value->append(run.bytes(0));
  }
  return code == SQLITE_DONE ? SQLITE_OK : code;
}

int TallyDatabase::examine(bool values) {
  {
    SqliteStatement check("PRAGMA quick_check(1)");
    SqliteRun run(database_, check);
    const int code = run.next();
    if (code != SQLITE_ROW) return code == SQLITE_DONE ? SQLITE_CORRUPT : code;
    if (run.bytes(0) != "ok") return SQLITE_CORRUPT;
  }
  // What quick_check takes for granted: that every sequence has its blocks.
  std::int64_t lost = 0;
  int code = read(
      "SELECT EXISTS(SELECT 1 FROM sequences WHERE id < 0 OR id >= 4398046511104"
      " OR NOT EXISTS(SELECT 1 FROM blocks WHERE blocks.id = sequences.id * 1048576))",
      lost);
  if (code == SQLITE_OK && lost != 0) code = SQLITE_CORRUPT;
  return code == SQLITE_OK && values ? checkValues() : code;
}

// Every block of every sequence, as a reader would see it.
int TallyDatabase::checkValues() {
  static_assert(kLastSequence == 4398046511103 && kBlocksPerSequence == 1048576);
  SqliteStatement query("SELECT id, samples FROM blocks ORDER BY id");
  SqliteRun run(database_, query);
  std::vector<DistributionSample> samples;
  std::int64_t next = -1;
  std::uint64_t before = 0;
  int code = SQLITE_OK;
  while ((code = run.next()) == SQLITE_ROW) {
    const std::int64_t block = run.integer(0);
    if (block % kBlocksPerSequence == 0) {
      before = 0;
    } else if (block != next) {
      return SQLITE_CORRUPT;
    }
    if (!UnpackBlock(run.bytes(1), before, samples)) return SQLITE_CORRUPT;
    before += samples.size();
    next = block + 1;
  }
  return code == SQLITE_DONE ? SQLITE_OK : code;
}

}  // namespace quorlet
