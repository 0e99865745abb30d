#include "platform/kernel_parameters.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <functional>
#include <limits>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/base/descriptor.h"
#include "platform/linux/base/kernel_text.h"
#include "platform/linux/device/services.h"
#include "values/digits.h"

namespace quorlet {
namespace {

constexpr char kDirectory[] = "/var/db/kernel/";
constexpr off_t kLargestEvent = 72;
constexpr std::size_t kMaxMemoryInfoBytes = 256UL << 10;

// The value of "vm.swapusage".
struct SwapUsage {
  std::uint64_t total = 0;  // bytes
  std::uint64_t available = 0;
  std::uint64_t used = 0;
  std::uint32_t pageSize = 0;
  std::uint32_t encrypted = 0;
};
static_assert(sizeof(SwapUsage) == 32);

// The bytes that a line such as "SwapTotal:        2097148 kB" of /proc/meminfo says.
std::optional<std::uint64_t> MemoryInfoBytes(std::string_view text, std::string_view name) {
  while (!text.empty()) {
    std::string_view line = TakeLine(text);
    if (!line.starts_with(name)) continue;
    line.remove_prefix(name.size());
    line.remove_prefix(std::min(line.size(), line.find_first_not_of(' ')));
    if (!line.ends_with(" kB")) break;
    const auto kilobytes = ParseNumber<std::uint64_t>(line.substr(0, line.size() - 3));
    if (!kilobytes || *kilobytes > std::numeric_limits<std::uint64_t>::max() / 1024) break;
    return *kilobytes * 1024;
  }
  return std::nullopt;
}

int CopyOut(const void* bytes, std::size_t size, std::span<std::byte> buffer, std::size_t& length) {
  if (size > buffer.size()) return ENOMEM;
  if (size != 0) std::memcpy(buffer.data(), bytes, size);
  length = size;
  return 0;
}

int ReadInto(const std::string& path, std::span<std::byte> buffer, std::size_t& length) {
  const auto bytes = ReadWholeFile(path, buffer.size());
  if (const int* error = std::get_if<int>(&bytes)) return *error == EFBIG ? ENOMEM : *error;
  const auto& text = std::get<std::string>(bytes);
  return CopyOut(text.data(), text.size(), buffer, length);
}

// A file of a queue, as it was when it was handed out.
struct TakenFile {
  std::string name;
  dev_t device = 0;
  ino_t inode = 0;
  timespec changed = {};

  TakenFile(std::string fileName, const struct stat& status)
      : name(std::move(fileName)),
        device(status.st_dev),
        inode(status.st_ino),
        changed(status.st_ctim) {}
  bool isThe(const struct stat& status) const {
    return device == status.st_dev && inode == status.st_ino &&
           changed.tv_sec == status.st_ctim.tv_sec && changed.tv_nsec == status.st_ctim.tv_nsec;
  }
};

using Names = std::vector<std::string>;

// Whether the name is that of a refused file.
bool IsRefused(const std::string& name) {
  return name.starts_with('.') && name.find(".refused") != std::string::npos;
}

class LinuxKernelParameters : public KernelParameters {
 public:
  LinuxKernelParameters(const Root& root, Access access, SystemLog& log)
      : root_(root), access_(access), log_(log) {}

  int sysctlbyname(std::string_view name, std::span<std::byte> buffer,
                   std::size_t& length) override {
    if (!IsSafeName(name)) {
      log_.error("Refused the kernel parameter name \"%@\"", name);
      return ENOENT;
    }
    const std::string path = root_.path(kDirectory) + std::string(name);
    const int error = ReadInto(path, buffer, length);
    if (error == EISDIR) return takeFromQueue(name, path, buffer, length);
    if (error == ENOENT && name == "vm.swapusage") return readSwapUsage(buffer, length);
    return error;
  }

  bool removeTaken(std::string_view name) override {
    const auto found = taken_.find(name);
    if (found == taken_.end()) return true;
    const std::string directory = root_.path(kDirectory) + std::string(name);
    std::erase_if(found->second, [&](const TakenFile& file) {
      const std::string path = JoinPath(directory, file.name);
      struct stat status = {};
      // Another file may have the name by now.
      const bool isThere = lstat(path.c_str(), &status) == 0 && file.isThe(status);
      if (access_ == Access::kReadOnly || !isThere || unlink(path.c_str()) == 0) return true;
      log_.error("Cannot remove %@: %@", path, ErrnoText(errno));
      return false;
    });
    return found->second.empty();
  }

  void returnTaken(std::string_view name) override {
    const auto found = taken_.find(name);
    if (found != taken_.end()) taken_.erase(found);
  }

 private:
  // Hands out the first file that was not handed out yet.
  int takeFromQueue(std::string_view queue, const std::string& directory,
                    std::span<std::byte> buffer, std::size_t& length) {
    // What cannot be removed later would be handed out by every pass.
    if (access_ == Access::kReadWrite &&
        faccessat(AT_FDCWD, directory.c_str(), W_OK | X_OK, AT_EACCESS) != 0) {
      return errno;
    }
    const auto names = ReadDirectory(directory);
    if (const int* error = std::get_if<int>(&names)) return *error;
    std::vector<TakenFile>& taken = taken_[std::string(queue)];
    for (const std::string& name : std::get<Names>(names)) {
      // Hidden names are files that their writer has not finished, and refused ones.
      if (name.starts_with('.') || std::ranges::find(taken, name, &TakenFile::name) != taken.end())
        continue;
      Descriptor file;
      struct stat status = {};
      const std::string path = JoinPath(directory, name);
      int error = OpenRegularFile(path, O_RDONLY | O_NOFOLLOW, file, status);
      const bool isNoFile = error == ELOOP || error == EISDIR || error == EINVAL || error == ENXIO;
      if (isNoFile || error == ENOENT) continue;  // or it has just gone
      if (error == 0) error = readEvent(file, status.st_size, buffer, length);
      if (error == 0) taken.emplace_back(name, status);
      if (error == ENOMEM && status.st_size > kLargestEvent) {
        refuse(directory, name, std::get<Names>(names));
      }
      return error;
    }
    return ENOENT;
  }

  static int readEvent(const Descriptor& file, off_t size, std::span<std::byte> buffer,
                       std::size_t& length) {
    if (static_cast<std::size_t>(size) > buffer.size()) return ENOMEM;
    std::size_t filled = 0;
    while (filled < static_cast<std::size_t>(size)) {
      const auto rest = buffer.subspan(filled, static_cast<std::size_t>(size) - filled);
      const ssize_t count =
          Uninterrupted([&] { return ::read(file.get(), rest.data(), rest.size()); });
      if (count < 0) return errno;
      if (count == 0) break;
      filled += static_cast<std::size_t>(count);
    }
    length = filled;
    return 0;
  }

  // Moves a file that is no event out of the others' way, or it would stand before them for ever.
  // Beside many that were refused before, it goes for good.
  void refuse(const std::string& directory, const std::string& name, const Names& present) {
    if (access_ == Access::kReadOnly) return;
    constexpr std::ptrdiff_t kMostRefused = 16;
    constexpr std::size_t kMostNameBytes = 200;
    const std::string path = JoinPath(directory, name);
    std::string free = "." + name.substr(0, kMostNameBytes) + ".refused";
    const std::string stem = free + ".";
    for (int number = 2; std::ranges::find(present, free) != present.end(); ++number) {
      free = stem + std::to_string(number);
    }
    const bool isRoom = std::ranges::count_if(present, IsRefused) < kMostRefused;
    const int failed =
        isRoom ? rename(path.c_str(), JoinPath(directory, free).c_str()) : unlink(path.c_str());
    log_.error("%@ is larger than any event; %@", path,
               failed != 0 ? "it stays in the way: " + ErrnoText(errno)
               : isRoom    ? "it is now " + free
                           : "it was removed, as others were kept before");
  }

  int readSwapUsage(std::span<std::byte> buffer, std::size_t& length) const {
    const auto bytes = ReadWholeFile(root_.kernelPath("/proc/meminfo"), kMaxMemoryInfoBytes);
    if (const int* error = std::get_if<int>(&bytes)) return *error;
    const std::string* text = std::get_if<std::string>(&bytes);
    const auto total = MemoryInfoBytes(*text, "SwapTotal:");
    const auto available = MemoryInfoBytes(*text, "SwapFree:");
    if (!total || !available) return ENOENT;
    const SwapUsage usage{.total = *total,
                          .available = *available,
                          .used = *total - std::min(*total, *available),
                          .pageSize = static_cast<std::uint32_t>(sysconf(_SC_PAGESIZE))};
    return CopyOut(&usage, sizeof usage, buffer, length);
  }

  const Root root_;
  const Access access_;
  SystemLog& log_;
  std::map<std::string, std::vector<TakenFile>, std::less<>> taken_;  // by queue
};

}  // namespace

std::unique_ptr<KernelParameters> MakeLinuxKernelParameters(const Root& root, Access access,
                                                            SystemLog& log) {
  return std::make_unique<LinuxKernelParameters>(root, access, log);
}

}  // namespace quorlet
