// Moving lines between files without losing or doubling one, whenever the process dies:
//
// 1. Staged lines that are to be published get the name .structured.staged.<inode of the log>.
// 2. Every day's new file is staged whole, what it holds already and the lines that it gets, as
//    .structured-<yyyymmdd>.<inode of the log>; the other lines, and behind them the staged ones,
//    are staged as the new log.
// 3. The new log replaces the log. Its inode is another one then: the move counts from here on.
// 4. The staged days' files get their names, and the staged lines are removed.
//
// What is found staged for another inode than the log's has been moved, so 4. is all that is left
// to do; for the log's own inode, days' files are removed, and lines are yet to be published.
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <set>
#include <variant>

#include "platform/linux/base/descriptor.h"
#include "platform/linux/base/files.h"
#include "platform/linux/logs/structured_lines.h"
#include "platform/linux/logs/structured_log.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr std::string_view kStagedDay = ".structured-";
constexpr std::string_view kPublished = ".structured.staged.";
constexpr std::size_t kDayLength = 8;
constexpr std::size_t kMaxDays = 366;  // moved at once, whatever times lines claim

// Lines of one file.
struct Source {
  Descriptor file;
  std::vector<Lines> lines;
};

// A file that is written from its start, before it gets its name.
class StagedFile {
 public:
  // Removes what an earlier move left behind: it may be somebody's link.
  int open(const std::string& path) {
    if (unlink(path.c_str()) != 0 && errno != ENOENT) return errno;
    struct stat status = {};
    return OpenRegularFile(path, O_WRONLY | O_CREAT | O_EXCL, file_, status);
  }
  // Appends the lines' bytes, and a line break where a crash cut the last line off.
  int copy(const Descriptor& from, const Lines& lines) {
    char last = '\n';
    const int error = ReadRange(from.get(), lines.begin, lines.end, [&](std::string_view bytes) {
      last = bytes.back();
      return WriteFully(file_.get(), bytes);
    });
    return error != 0 || last == '\n' ? error : WriteFully(file_.get(), "\n");
  }
  int sync() {
    return Uninterrupted([&] { return fsync(file_.get()); }) == 0 ? 0 : errno;
  }

 private:
  Descriptor file_;
};

}  // namespace

// What is to go where.
struct StructuredLog::Move {
  std::string inode;  // of the log
  Source log;
  Source staged;
  std::set<std::string, std::less<>> days;  // whose lines are moved out of the log
  off_t kept = 0;                           // bytes that stay in the log
  bool isFull = false;                      // not all staged lines have room

  // A power cut may cost the lines that are being published. Syncs keep it from costing those that
  // were in the log before.
  bool losesNothing() const { return log.lines.empty(); }
};

int StructuredLog::beginStaging(Date now) const {
  struct stat status = {};
  if (lstat(directory_.c_str(), &status) != 0) return errno == ENOENT ? 0 : errno;
  const FileLock lock(lockPath());
  if (lock.error() != 0) return lock.error();
  if (const int error = finishMove()) return error;
  std::string inode;
  if (const int error = inodeOfLog(inode)) return error;
  const std::string begun = stagedPath() + "." + inode;
  if (lstat(begun.c_str(), &status) == 0) {
    const int error = replaceLog(now);
    if (error != 0 && error != kLogIsFull) return error;
  }
  return unlink(stagedPath().c_str()) == 0 || errno == ENOENT ? 0 : errno;
}

int StructuredLog::publish(Date now) const {
  struct stat status = {};
  if (lstat(directory_.c_str(), &status) != 0) return errno == ENOENT ? 0 : errno;
  const FileLock lock(lockPath());
  if (lock.error() != 0) return lock.error();
  if (const int error = finishMove()) return error;
  std::string inode;
  if (const int error = inodeOfLog(inode)) return error;
  const std::string begun = stagedPath() + "." + inode;
  int error = 0;
  if (lstat(begun.c_str(), &status) == 0) error = replaceLog(now);
  if (error != 0 && error != kLogIsFull) return error;
  if (lstat(stagedPath().c_str(), &status) != 0) return errno == ENOENT ? error : errno;
  // Lines are published to a log that is there, if only an empty one.
  Descriptor log;
  constexpr int kFlags = O_RDWR | O_CREAT;
  if (const int failure = OpenRegularFile(path(), kFlags, log, status)) return failure;
  const std::string marked = stagedPath() + "." + std::to_string(status.st_ino);
  if (rename(stagedPath().c_str(), marked.c_str()) != 0) return errno;
  const int failure = replaceLog(now);
  return failure != 0 ? failure : error;
}

int StructuredLog::moveOldLines(Date now) const {
  struct stat status = {};
  if (lstat(directory_.c_str(), &status) != 0) return errno == ENOENT ? 0 : errno;
  const FileLock lock(lockPath());
  if (lock.error() != 0) return lock.error();
  if (const int error = finishMove()) return error;
  return replaceLog(now);
}

// Empty when there is no log.
int StructuredLog::inodeOfLog(std::string& inode) const {
  struct stat status = {};
  if (lstat(path().c_str(), &status) == 0) {
    inode = std::to_string(status.st_ino);
  } else if (errno != ENOENT) {
    return errno;
  }
  return 0;
}

// The move, with lines that are to be published when there are any.
int StructuredLog::replaceLog(Date now) const {
  Move move;
  const int missing = planMove(DayOf(Rfc3339(now)), move);
  if (missing != 0) return missing == ENOENT ? 0 : missing;
  if (move.days.empty() && !move.staged.file.isOpen()) return 0;
  int error = stageMove(move);
  if (error == 0 && rename(newLogPath().c_str(), path().c_str()) != 0) error = errno;
  const int unfinished = finishMove();
  if (error == 0) error = unfinished;
  if (error == 0 && move.staged.file.isOpen()) error = makeRoom(0, kMostBytes);
  return error == 0 && move.isFull ? kLogIsFull : error;
}

// ENOENT when there is no log.
int StructuredLog::planMove(std::string_view today, Move& move) const {
  if (const int error = scanLog(today, move)) return error;
  return scanStaged(move);
}

int StructuredLog::scanLog(std::string_view today, Move& move) const {
  struct stat status = {};
  std::vector<Lines>& lines = move.log.lines;
  int error = OpenRegularFile(path(), O_RDONLY | O_NOFOLLOW, move.log.file, status);
  if (error != 0) return error;
  move.inode = std::to_string(status.st_ino);
  error = ScanLines(move.log.file.get(), status.st_size, [&](Lines line) {
    if (line.day.empty() && !lines.empty()) line.day = lines.back().day;
    AddLine(lines, std::move(line));
  });
  if (error != 0) return error;
  for (const Lines& some : lines) {
    if (some.day.empty() || some.day >= today) continue;
    move.days.insert(some.day);
    if (move.days.size() > kMaxDays) move.days.erase(std::prev(move.days.end()));
  }
  for (const Lines& some : lines) {
    if (!move.days.contains(some.day)) move.kept += some.end - some.begin;
  }
  return 0;
}

// Whole lines only: a power cut may have left half a file.
int StructuredLog::scanStaged(Move& move) const {
  struct stat status = {};
  const std::string path = stagedPath() + "." + move.inode;
  const int error = OpenRegularFile(path, O_RDONLY | O_NOFOLLOW, move.staged.file, status);
  if (error != 0) return error == ENOENT ? 0 : error;
  off_t room = kMostBytes - move.kept;
  return ScanLines(move.staged.file.get(), status.st_size, [&](Lines line) {
    const off_t size = line.end - line.begin;
    if (line.day.empty()) return;
    move.isFull |= size > room;
    if (move.isFull) return;
    room -= size;
    AddLine(move.staged.lines, std::move(line));
  });
}

int StructuredLog::stageMove(const Move& move) const {
  for (const std::string& day : move.days) {
    if (const int error = stageDay(move, day)) return error;
  }
  if (const int error = stageLog(move)) return error;
  // The staged names must not be lost once the log has been replaced.
  return move.losesNothing() ? 0 : SyncDirectory(directory_);
}

int StructuredLog::stageDay(const Move& move, const std::string& day) const {
  StagedFile staged;
  const std::string path = directory_ + "/" + std::string(kStagedDay) + day + "." + move.inode;
  if (const int error = staged.open(path)) return error;
  Descriptor present;
  struct stat status = {};
  int error = OpenRegularFile(dayPath(day), O_RDONLY | O_NOFOLLOW, present, status);
  if (error == 0) error = staged.copy(present, {0, status.st_size, day});
  if (error != 0 && error != ENOENT) return error;
  for (const Lines& lines : move.log.lines) {
    if (lines.day != day) continue;
    if (const int failure = staged.copy(move.log.file, lines)) return failure;
  }
  return staged.sync();
}

int StructuredLog::stageLog(const Move& move) const {
  StagedFile staged;
  if (const int error = staged.open(newLogPath())) return error;
  for (const Lines& lines : move.log.lines) {
    if (move.days.contains(lines.day)) continue;
    if (const int error = staged.copy(move.log.file, lines)) return error;
  }
  for (const Lines& lines : move.staged.lines) {
    if (const int error = staged.copy(move.staged.file, lines)) return error;
  }
  return move.losesNothing() ? 0 : staged.sync();
}

int StructuredLog::finishMove() const {
  std::string inode;
  if (const int error = inodeOfLog(inode)) return error;
  const auto names = ReadDirectory(directory_);
  if (const int* error = std::get_if<int>(&names)) return *error;
  for (const std::string& name : std::get<std::vector<std::string>>(names)) {
    const std::string staged = JoinPath(directory_, name);
    std::string_view rest = name;
    int failed = 0;
    if (staged == newLogPath()) {
      failed = unlink(staged.c_str());
    } else if (rest.starts_with(kPublished)) {
      if (rest.substr(kPublished.size()) != inode) failed = unlink(staged.c_str());
    } else if (rest.starts_with(kStagedDay) &&
               rest.find('.', 1) == kStagedDay.size() + kDayLength) {
      rest.remove_prefix(kStagedDay.size());
      const bool counts = rest.substr(kDayLength + 1) != inode;
      failed = counts ? rename(staged.c_str(), dayPath(rest.substr(0, kDayLength)).c_str())
                      : unlink(staged.c_str());
    }
    if (failed != 0) return errno;
  }
  return 0;
}

}  // namespace quorlet
