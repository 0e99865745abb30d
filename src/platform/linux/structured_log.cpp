// Moving lines between files without losing or doubling one, whenever the process dies:
//
// 1. Every day's new file is staged whole, what it holds already and the lines that it gets, as
//    .structured-<yyyymmdd>.<inode of the log>; the other lines are staged as the new log.
// 2. The new log replaces the log. Its inode is another one then: the move counts from here on.
// 3. The staged days' files get their names.
//
// Publishing staged lines: their file is renamed to .structured.staged.<inode>.<size> of the log,
// the lines are appended, and the file is removed. Whoever finds it so named cuts the same log back
// to that size and appends again; another log has them already, since only a log without that file
// beside it is replaced.
//
// Files found staged are given their names when the log has another inode by then, and removed when
// it has not.
#include "platform/linux/structured_log.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <functional>
#include <nlohmann/json.hpp>
#include <set>
#include <variant>
#include <vector>

#include "platform/linux/descriptor.h"
#include "platform/linux/files.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr std::string_view kStagedPrefix = ".structured-";
constexpr std::size_t kDayLength = 8;
constexpr std::size_t kMaxDays = 366;             // moved at once, whatever times lines claim
constexpr std::size_t kMaxLineBytes = 1UL << 20;  // of a line whose time is looked at
constexpr std::size_t kChunkBytes = 64UL << 10;

// Neighbouring lines that go to the same place.
struct Lines {
  off_t begin = 0;
  off_t end = 0;
  std::string day;  // yyyymmdd; empty when it is not known
};

// The day of an RFC 3339 time in UTC as yyyymmdd, or empty.
std::string DayOf(std::string_view time) {
  constexpr std::string_view kShape = "dddd-dd-ddTdd:dd:dd";
  if (time.size() <= kShape.size() || !time.ends_with('Z')) return "";
  std::string digits;
  for (std::size_t i = 0; i < kShape.size(); ++i) {
    const bool isDigit = time[i] >= '0' && time[i] <= '9';
    if (kShape[i] == 'd' ? !isDigit : time[i] != kShape[i]) return "";
    if (isDigit && i < 10) digits += time[i];
  }
  const int number = std::stoi(digits);
  const std::chrono::year_month_day date(
      std::chrono::year(number / 10000),
      std::chrono::month(static_cast<unsigned>(number) / 100 % 100),
      std::chrono::day(static_cast<unsigned>(number) % 100));
  return date.ok() ? digits : "";
}

std::string DayOfLine(std::string_view line) {
  if (line.size() > kMaxLineBytes) return "";
  const auto entry = nlohmann::json::parse(line, nullptr, /*allow_exceptions=*/false);
  if (!entry.is_object()) return "";
  const auto time = entry.find("time");
  if (time == entry.end() || !time->is_string()) return "";
  return DayOf(time->get_ref<const std::string&>());
}

// Calls `take` with the bytes of [begin, end) of a file, or to its end, in order.
int ReadRange(int descriptor, off_t begin, off_t end,
              const std::function<int(std::string_view)>& take) {
  std::array<char, kChunkBytes> chunk;
  while (begin < end) {
    const auto wanted = std::min(chunk.size(), static_cast<std::size_t>(end - begin));
    const ssize_t count =
        Uninterrupted([&] { return pread(descriptor, chunk.data(), wanted, begin); });
    if (count < 0) return errno;
    if (count == 0) return EIO;
    if (const int error = take({chunk.data(), static_cast<std::size_t>(count)})) return error;
    begin += count;
  }
  return 0;
}

// A file that is written from its start, before it gets its name.
class StagedFile {
 public:
  int open(const std::string& path) {
    struct stat status = {};
    return OpenRegularFile(path, O_WRONLY | O_CREAT | O_TRUNC | O_NOFOLLOW, file_, status);
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

// The file's lines; only the start of a long line is kept in memory.
int ScanLines(int descriptor, off_t size, std::vector<Lines>& all) {
  std::string line;
  off_t lineBegin = 0;
  off_t position = 0;
  const auto endLine = [&] {
    std::string day = DayOfLine(line);
    if (day.empty() && !all.empty()) day = all.back().day;
    if (all.empty() || all.back().day != day) all.push_back({lineBegin, position, day});
    all.back().end = position;
    lineBegin = position;
    line.clear();
  };
  const int error = ReadRange(descriptor, 0, size, [&](std::string_view bytes) {
    while (!bytes.empty()) {
      const std::string_view part = bytes.substr(0, bytes.find('\n'));
      line += part.substr(0, kMaxLineBytes + 1 - std::min(line.size(), kMaxLineBytes + 1));
      const bool ends = part.size() < bytes.size();
      bytes.remove_prefix(part.size() + (ends ? 1 : 0));
      position += static_cast<off_t>(part.size() + (ends ? 1 : 0));
      if (ends) endLine();
    }
    return 0;
  });
  if (error == 0 && position > lineBegin) endLine();
  return error;
}

}  // namespace

// What is to go where.
struct StructuredLog::Move {
  Descriptor log;
  std::string inode;
  std::vector<Lines> lines;
  std::set<std::string, std::less<>> days;  // whose lines are moved
};

std::string StructuredLog::dayPath(std::string_view day) const {
  return directory_ + "/structured-" + std::string(day) + ".jsonl";
}

int StructuredLog::append(std::string_view line) const {
  const FileLock lock(lockPath());
  if (lock.error() != 0) return lock.error();
  Descriptor log;
  struct stat status = {};
  constexpr int kFlags = O_RDWR | O_CREAT | O_APPEND | O_NOFOLLOW;
  if (const int error = OpenRegularFile(path(), kFlags, log, status)) return error;
  char last = '\n';
  if (status.st_size > 0 &&
      Uninterrupted([&] { return pread(log.get(), &last, 1, status.st_size - 1); }) < 0) {
    return errno;
  }
  std::string bytes(last == '\n' ? "" : "\n");
  bytes.append(line) += '\n';
  const int error = WriteFully(log.get(), bytes);
  // Half a line, on a full disk, is taken back; if it cannot be, the next line still gets its own.
  if (error != 0 && ftruncate(log.get(), status.st_size) != 0) return errno;
  return error;
}

int StructuredLog::openLog(Descriptor& log, off_t& size) const {
  struct stat status = {};
  constexpr int kFlags = O_RDWR | O_CREAT | O_APPEND | O_NOFOLLOW;
  const int error = OpenRegularFile(path(), kFlags, log, status);
  size = status.st_size;
  return error;
}

int StructuredLog::sync() const {
  Descriptor log;
  off_t size = 0;
  if (const int error = openLog(log, size)) return error;
  if (Uninterrupted([&] { return fsync(log.get()); }) != 0) return errno;
  // The log may be new, and staged lines that were put into it must not be put there again.
  return SyncDirectory(directory_);
}

int StructuredLog::beginStaging() const {
  const FileLock lock(lockPath());
  if (lock.error() != 0) return lock.error();
  // What was being published is published first: it counts.
  if (const int error = publishMarked()) return error;
  return unlink(stagedPath().c_str()) == 0 || errno == ENOENT ? 0 : errno;
}

int StructuredLog::stageLine(std::string_view line) const {
  const FileLock lock(lockPath());
  if (lock.error() != 0) return lock.error();
  Descriptor staged;
  struct stat status = {};
  constexpr int kFlags = O_WRONLY | O_CREAT | O_APPEND | O_NOFOLLOW;
  if (const int error = OpenRegularFile(stagedPath(), kFlags, staged, status)) return error;
  const int error = WriteFully(staged.get(), std::string(line) + '\n');
  if (error != 0 && ftruncate(staged.get(), status.st_size) != 0) return errno;
  return error;
}

int StructuredLog::publishStaged() const {
  const FileLock lock(lockPath());
  if (lock.error() != 0) return lock.error();
  if (const int error = publishMarked()) return error;
  struct stat status = {};
  if (lstat(stagedPath().c_str(), &status) != 0) return errno == ENOENT ? 0 : errno;
  Descriptor log;
  off_t size = 0;
  if (const int error = openLog(log, size)) return error;
  if (fstat(log.get(), &status) != 0) return errno;
  const std::string marked =
      stagedPath() + "." + std::to_string(status.st_ino) + "." + std::to_string(size);
  if (rename(stagedPath().c_str(), marked.c_str()) != 0) return errno;
  return publishMarked();
}

// Brings a publication that has begun to its end.
int StructuredLog::publishMarked() const {
  const auto names = ReadDirectory(directory_);
  if (const int* error = std::get_if<int>(&names)) return *error;
  const std::string prefix = stagedPath().substr(directory_.size() + 1) + ".";
  for (const std::string& name : std::get<std::vector<std::string>>(names)) {
    if (!name.starts_with(prefix)) continue;
    const std::string marked = JoinPath(directory_, name);
    unsigned long long inode = 0;
    unsigned long long size = 0;
    if (std::sscanf(name.c_str() + prefix.size(), "%llu.%llu", &inode, &size) != 2) continue;
    Descriptor log;
    off_t length = 0;
    struct stat status = {};
    if (const int error = openLog(log, length)) return error;
    if (fstat(log.get(), &status) != 0) return errno;
    if (status.st_ino == inode) {
      const off_t start = std::min(length, static_cast<off_t>(size));
      if (const int error = appendStaged(marked, log, start)) return error;
    }
    if (unlink(marked.c_str()) != 0) return errno;
  }
  return 0;
}

// Appends the lines of `marked` to the first `size` bytes of the log. Nothing is synced: a power
// cut may lose the lines, or bring the file back, which doubles nothing. What is logged later and
// has to last is synced with the directory, and so with the file's removal.
int StructuredLog::appendStaged(const std::string& marked, const Descriptor& log,
                                off_t size) const {
  Descriptor staged;
  struct stat status = {};
  if (const int error = OpenRegularFile(marked, O_RDONLY | O_NOFOLLOW, staged, status)) {
    return error;
  }
  if (Uninterrupted([&] { return ftruncate(log.get(), size); }) != 0) return errno;
  char last = '\n';
  if (size > 0 && Uninterrupted([&] { return pread(log.get(), &last, 1, size - 1); }) < 0) {
    return errno;
  }
  int error = last == '\n' ? 0 : WriteFully(log.get(), "\n");
  if (error == 0) {
    error = ReadRange(staged.get(), 0, status.st_size,
                      [&](std::string_view bytes) { return WriteFully(log.get(), bytes); });
  }
  return error;
}

int StructuredLog::moveOldLines(Date now) {
  struct stat status = {};
  if (lstat(path().c_str(), &status) != 0) return errno == ENOENT ? 0 : errno;
  const FileLock lock(lockPath());
  if (lock.error() != 0) return lock.error();
  if (const int error = finishMove()) return error;
  // The log that lines are being published to must not be replaced before they are in it.
  if (const int error = publishMarked()) return error;
  Move move;
  if (const int error = planMove(DayOf(Rfc3339(now)), move)) return error;
  if (move.days.empty()) return 0;
  int error = stage(move);
  if (error == 0 && rename(newLogPath().c_str(), path().c_str()) != 0) error = errno;
  const int unfinished = finishMove();
  return error != 0 ? error : unfinished;
}

int StructuredLog::planMove(std::string_view today, Move& move) const {
  struct stat status = {};
  if (const int error = OpenRegularFile(path(), O_RDONLY | O_NOFOLLOW, move.log, status)) {
    return error;
  }
  move.inode = std::to_string(status.st_ino);
  if (const int error = ScanLines(move.log.get(), status.st_size, move.lines)) return error;
  for (const Lines& lines : move.lines) {
    if (lines.day.empty() || lines.day >= today) continue;
    move.days.insert(lines.day);
    if (move.days.size() > kMaxDays) move.days.erase(std::prev(move.days.end()));
  }
  return 0;
}

int StructuredLog::stage(const Move& move) const {
  for (const std::string& day : move.days) {
    if (const int error = stageDay(move, day)) return error;
  }
  if (const int error = stageLog(move)) return error;
  // The staged names must not be lost once the log has been replaced.
  return SyncDirectory(directory_);
}

int StructuredLog::stageDay(const Move& move, const std::string& day) const {
  const std::string path = directory_ + "/" + std::string(kStagedPrefix) + day + "." + move.inode;
  StagedFile staged;
  if (const int error = staged.open(path)) return error;
  Descriptor present;
  struct stat status = {};
  int error = OpenRegularFile(dayPath(day), O_RDONLY | O_NOFOLLOW, present, status);
  if (error == 0) error = staged.copy(present, {0, status.st_size, day});
  if (error != 0 && error != ENOENT) return error;
  for (const Lines& lines : move.lines) {
    if (lines.day != day) continue;
    if (const int failure = staged.copy(move.log, lines)) return failure;
  }
  return staged.sync();
}

int StructuredLog::stageLog(const Move& move) const {
  StagedFile staged;
  if (const int error = staged.open(newLogPath())) return error;
  for (const Lines& lines : move.lines) {
    if (move.days.contains(lines.day)) continue;
    if (const int error = staged.copy(move.log, lines)) return error;
  }
  return staged.sync();
}

int StructuredLog::finishMove() const {
  struct stat status = {};
  if (lstat(path().c_str(), &status) != 0) return errno;
  const std::string inode = std::to_string(status.st_ino);
  const auto names = ReadDirectory(directory_);
  if (const int* error = std::get_if<int>(&names)) return *error;
  for (const std::string& name : std::get<std::vector<std::string>>(names)) {
    const std::string staged = directory_ + "/" + name;
    if (staged == newLogPath() && unlink(staged.c_str()) != 0) return errno;
    std::string_view rest = name;
    if (!rest.starts_with(kStagedPrefix)) continue;
    rest.remove_prefix(kStagedPrefix.size());
    if (rest.find('.') != kDayLength) continue;
    const bool counts = rest.substr(kDayLength + 1) != inode;
    const int failed = counts ? rename(staged.c_str(), dayPath(rest.substr(0, kDayLength)).c_str())
                              : unlink(staged.c_str());
    if (failed != 0) return errno;
  }
  return 0;
}

}  // namespace quorlet
