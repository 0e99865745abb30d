#include "platform/linux/logs/structured_log.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <variant>

#include "platform/linux/base/descriptor.h"
#include "platform/linux/base/files.h"
#include "platform/linux/logs/structured_lines.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr int kAppendFlags = O_RDWR | O_CREAT | O_APPEND;
constexpr std::string_view kDayPrefix = "structured-";
constexpr std::string_view kSuffix = ".jsonl";
constexpr std::size_t kDayLength = 8;

bool IsDay(std::string_view text) {
  return text.size() == kDayLength &&
         std::ranges::all_of(text, [](char c) { return c >= '0' && c <= '9'; });
}

// Appends lines to a file of `size` bytes, behind a line break where its last line has none.
int AppendLines(int file, off_t size, std::string_view lines) {
  char last = '\n';
  if (size > 0 && Uninterrupted([&] { return pread(file, &last, 1, size - 1); }) < 0) return errno;
  std::string bytes(last == '\n' ? "" : "\n");
  bytes.append(lines) += '\n';
  const int error = WriteFully(file, bytes);
  // Half a line, on a full disk, is taken back; if it cannot be, the next line still gets its own.
  if (error != 0 && Uninterrupted([&] { return ftruncate(file, size); }) != 0) return errno;
  return error;
}

}  // namespace

std::string StructuredLog::dayPath(std::string_view day) const {
  return directory_ + "/" + std::string(kDayPrefix) + std::string(day) + std::string(kSuffix);
}

int StructuredLog::append(std::string_view lines, Share share) const {
  const FileLock lock(lockPath());
  if (lock.error() != 0) return lock.error();
  const off_t limit = kMostBytes + (share == Share::kReserved ? kReservedBytes : 0);
  if (const int error = makeRoom(static_cast<off_t>(lines.size()) + 1, limit)) return error;
  Descriptor log;
  struct stat status = {};
  if (const int error = OpenRegularFile(path(), kAppendFlags, log, status)) return error;
  return AppendLines(log.get(), status.st_size, lines);
}

int StructuredLog::stage(std::string_view lines) const {
  const FileLock lock(lockPath());
  if (lock.error() != 0) return lock.error();
  Descriptor staged;
  struct stat status = {};
  if (const int error = OpenRegularFile(stagedPath(), kAppendFlags, staged, status)) return error;
  const off_t size = status.st_size + static_cast<off_t>(lines.size()) + 1;
  return size > kMostBytes ? kLogIsFull : AppendLines(staged.get(), status.st_size, lines);
}

int StructuredLog::sync() const {
  Descriptor log;
  struct stat status = {};
  const int error = OpenRegularFile(path(), O_RDONLY | O_NOFOLLOW, log, status);
  if (error != 0) return error == ENOENT ? 0 : error;
  if (Uninterrupted([&] { return fsync(log.get()); }) != 0) return errno;
  return SyncDirectory(directory_);  // its name may be new
}

// Sizes of all files that are the log's by their names. Only those of days may go.
int StructuredLog::measure(Usage& usage) const {
  const auto names = ReadDirectory(directory_);
  if (const int* error = std::get_if<int>(&names)) return *error;
  for (const std::string& name : std::get<std::vector<std::string>>(names)) {
    if (!name.starts_with("structured") || !name.ends_with(kSuffix)) continue;
    const std::string file = JoinPath(directory_, name);
    struct stat status = {};
    if (lstat(file.c_str(), &status) != 0) {
      if (errno == ENOENT) continue;
      return errno;
    }
    if (!S_ISREG(status.st_mode)) continue;
    usage.total += status.st_size;
    std::string_view day = name;
    day.remove_suffix(kSuffix.size());
    if (!day.starts_with(kDayPrefix) || !IsDay(day.substr(kDayPrefix.size()))) continue;
    usage.days.emplace_back(file, status.st_size);  // names are in byte order, days by age
  }
  return 0;
}

int StructuredLog::makeRoom(off_t bytes, off_t limit) const {
  Usage usage;
  if (const int error = measure(usage)) return error;
  off_t removable = 0;
  for (const auto& day : usage.days) removable += day.second;
  if (usage.total - removable + bytes > limit) return kLogIsFull;
  for (const auto& [file, size] : usage.days) {
    if (usage.total + bytes <= limit) break;
    if (unlink(file.c_str()) != 0 && errno != ENOENT) return errno;
    usage.total -= size;
  }
  return 0;
}

int StructuredLog::dropOldDays(Date now) const {
  struct stat status = {};
  if (lstat(directory_.c_str(), &status) != 0) return errno == ENOENT ? 0 : errno;
  const FileLock lock(lockPath());
  if (lock.error() != 0) return lock.error();
  Usage usage;
  if (const int error = measure(usage)) return error;
  constexpr double kSecondsPerDay = 86400;
  const std::string oldest =
      dayPath(DayOf(Rfc3339({now.secondsSince1970 - kMostDays * kSecondsPerDay})));
  for (const auto& day : usage.days) {
    if (day.first >= oldest) break;
    if (unlink(day.first.c_str()) != 0 && errno != ENOENT) return errno;
  }
  const int error = makeRoom(0, kMostBytes + kReservedBytes);
  return error == kLogIsFull ? 0 : error;
}

}  // namespace quorlet
