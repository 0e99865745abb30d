#include "platform/kernel_parameters.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdint>
#include <cstring>
#include <limits>
#include <map>
#include <optional>
#include <variant>
#include <vector>

#include "platform/linux/descriptor.h"
#include "platform/linux/services.h"

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
    std::string_view line = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(text.size(), line.size() + 1));
    if (!line.starts_with(name)) continue;
    line.remove_prefix(name.size());
    line.remove_prefix(std::min(line.size(), line.find_first_not_of(' ')));
    std::uint64_t kilobytes = 0;
    const auto [end, error] = std::from_chars(line.data(), line.data() + line.size(), kilobytes);
    const bool isWhole =
        error == std::errc() && std::string_view(end, line.data() + line.size()) == " kB";
    if (!isWhole || kilobytes > std::numeric_limits<std::uint64_t>::max() / 1024) break;
    return kilobytes * 1024;
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
    if (error == EISDIR) return takeFromQueue(path, buffer, length);
    if (error == ENOENT && name == "vm.swapusage") return readSwapUsage(buffer, length);
    return error;
  }

  bool removeTaken(std::string_view name) override {
    const std::string directory = root_.path(kDirectory) + std::string(name);
    const auto found = taken_.find(directory);
    if (found == taken_.end() || access_ == Access::kReadOnly) return true;
    bool allRemoved = true;
    std::erase_if(found->second, [&](const std::string& path) {
      if (unlink(path.c_str()) == 0 || errno == ENOENT) return true;
      log_.error("Cannot remove %@: %@", path, ErrnoText(errno));
      allRemoved = false;
      return false;
    });
    return allRemoved;
  }

 private:
  // Hands out the first file that was not handed out before; it is removed later. One that is
  // larger than any event is moved out of the way, or it would stand before the others for ever.
  int takeFromQueue(const std::string& directory, std::span<std::byte> buffer,
                    std::size_t& length) {
    const auto names = ReadDirectory(directory);
    if (const int* error = std::get_if<int>(&names)) return *error;
    std::vector<std::string>& taken = taken_[directory];
    for (const std::string& name : std::get<std::vector<std::string>>(names)) {
      struct stat status = {};
      const std::string path = JoinPath(directory, name);
      // Hidden names are files that their writer has not finished.
      if (name.starts_with('.') || std::ranges::find(taken, path) != taken.end()) continue;
      if (lstat(path.c_str(), &status) != 0 || !S_ISREG(status.st_mode)) continue;
      const int error = ReadInto(path, buffer, length);
      if (error == 0) taken.push_back(path);
      if (error == ENOMEM && status.st_size > kLargestEvent) refuse(directory, name);
      return error;
    }
    return ENOENT;
  }

  void refuse(const std::string& directory, const std::string& name) {
    if (access_ == Access::kReadOnly) return;
    const std::string path = JoinPath(directory, name);
    const std::string aside = JoinPath(directory, "." + name + ".refused");
    const int error = rename(path.c_str(), aside.c_str()) == 0 ? 0 : errno;
    log_.error("The event %@ is larger than any; %@", path,
               error == 0 ? "it was moved aside" : "it cannot be moved aside: " + ErrnoText(error));
  }

  int readSwapUsage(std::span<std::byte> buffer, std::size_t& length) const {
    const auto bytes = ReadWholeFile(root_.kernelPath("/proc/meminfo"), kMaxMemoryInfoBytes);
    const auto* text = std::get_if<std::string>(&bytes);
    if (text == nullptr) return ENOENT;
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
  std::map<std::string, std::vector<std::string>, std::less<>> taken_;  // by queue
};

}  // namespace

std::unique_ptr<KernelParameters> MakeLinuxKernelParameters(const Root& root, Access access,
                                                            SystemLog& log) {
  return std::make_unique<LinuxKernelParameters>(root, access, log);
}

}  // namespace quorlet
