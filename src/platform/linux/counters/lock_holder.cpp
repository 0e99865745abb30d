#include "platform/linux/counters/lock_holder.h"

#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <cstdio>
#include <sstream>
#include <variant>

#include "platform/linux/base/files.h"

namespace quorlet {
namespace {

constexpr std::size_t kMaxLocksBytes = std::size_t{1} << 20;

std::string NameInLocks(const struct stat& status) {
  char text[64];
  std::snprintf(text, sizeof(text), "%02x:%02x:%llu", major(status.st_dev), minor(status.st_dev),
                static_cast<unsigned long long>(status.st_ino));
  return text;
}

}  // namespace

// A line: "1: POSIX  ADVISORY  WRITE 1234 08:01:5678 120 120"; the end may be "EOF". Whoever waits
// has "->" before the kind.
std::optional<int> LockHolderIn(std::string_view locks, std::string_view file, std::uint64_t byte) {
  std::istringstream lines{std::string(locks)};
  for (std::string line; std::getline(lines, line);) {
    std::istringstream fields(line);
    std::string number, kind, advisory, mode, name, end;
    int process = 0;
    std::uint64_t start = 0;
    if (!(fields >> number >> kind >> advisory >> mode >> process >> name >> start >> end))
      continue;
    if (mode != "WRITE" || name != file || process <= 0 || start > byte) continue;
    std::uint64_t last = byte;
    if (end != "EOF" && !(std::istringstream(end) >> last)) continue;
    if (last >= byte) return process;
  }
  return std::nullopt;
}

std::optional<int> LockHolder(const std::string& path, std::uint64_t byte) {
  struct stat status {};
  if (stat(path.c_str(), &status) != 0) return std::nullopt;
  const auto locks = ReadWholeFile("/proc/locks", kMaxLocksBytes);
  const auto* text = std::get_if<std::string>(&locks);
  return text != nullptr ? LockHolderIn(*text, NameInLocks(status), byte) : std::nullopt;
}

}  // namespace quorlet
