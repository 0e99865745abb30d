#include "platform/kernel_parameters.h"

#include <sys/file.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdint>
#include <cstring>
#include <limits>
#include <optional>

#include "platform/linux/descriptor.h"
#include "platform/linux/services.h"

namespace quorlet {
namespace {

constexpr char kDirectory[] = "/var/db/kernel/";
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

 private:
  // Takes the first file. One that does not fit the buffer is removed all the same, or it would
  // stand before the others for ever. The lock on the directory keeps two processes from taking
  // the same one.
  int takeFromQueue(const std::string& directory, std::span<std::byte> buffer,
                    std::size_t& length) {
    const Descriptor queue(
        Uninterrupted([&] { return open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC); }));
    if (!queue.isOpen() || Uninterrupted([&] { return flock(queue.get(), LOCK_EX); }) != 0) {
      return errno;
    }
    for (const std::string& name : ListDirectory(directory)) {
      struct stat status = {};
      const std::string path = JoinPath(directory, name);
      // Hidden names are files that their writer has not finished.
      if (name.starts_with('.') || lstat(path.c_str(), &status) != 0 || !S_ISREG(status.st_mode)) {
        continue;
      }
      const int error = ReadInto(path, buffer, length);
      if ((error != 0 && error != ENOMEM) || access_ == Access::kReadOnly) return error;
      // An entry that cannot be removed is not handed out, or it would be handed out for ever.
      return unlink(path.c_str()) == 0 ? error : errno;
    }
    return ENOENT;
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
};

}  // namespace

std::unique_ptr<KernelParameters> MakeLinuxKernelParameters(const Root& root, Access access,
                                                            SystemLog& log) {
  return std::make_unique<LinuxKernelParameters>(root, access, log);
}

}  // namespace quorlet
