#include "platform/environment.h"

#include <sys/stat.h>
#include <time.h>

#include <algorithm>
#include <cerrno>
#include <limits>

#include "platform/linux/device/services.h"

namespace quorlet {
namespace {

constexpr char kContainers[] = "/var/lib/quorlet/";

class LinuxEnvironment : public Environment {
 public:
  LinuxEnvironment(const Root& root, DeviceInfo& deviceInfo, SystemLog& log)
      : root_(root), deviceInfo_(deviceInfo), log_(log) {}

  std::optional<FileStatus> stat(std::string_view path) override {
    struct stat status = {};
    if (!IsPath(path) || ::stat(hostPath(path).c_str(), &status) != 0) return std::nullopt;
    return FileStatus{static_cast<std::uint64_t>(std::max<off_t>(status.st_size, 0))};
  }

  std::optional<std::string> readFile(std::string_view path, std::size_t limit) override {
    if (!IsPath(path)) return std::nullopt;
    auto bytes = ReadWholeFile(hostPath(path), limit);
    if (auto* text = std::get_if<std::string>(&bytes)) return std::move(*text);
    return std::nullopt;
  }

  std::optional<std::string> SystemGroupContainerPath(std::string_view identifier,
                                                      std::uint64_t& error) override {
    if (!IsSafeName(identifier)) {
      log_.error("Refused the container identifier \"%@\"", identifier);
      error = EINVAL;
      return std::nullopt;
    }
    std::string path = kContainers + std::string(identifier);
    struct stat status = {};
    const bool examined = ::stat(root_.path(path).c_str(), &status) == 0;
    if (examined && S_ISDIR(status.st_mode)) return path;
    error = static_cast<std::uint64_t>(examined ? ENOTDIR : errno);
    return std::nullopt;
  }

  bool CheckMultiUserMode(std::int32_t& mode) override {
    const auto answer = deviceInfo_.DQCopyAnswer("MultiUserMode");
    const Number* number = answer ? answer->asNumber() : nullptr;
    if (number == nullptr || number->isReal()) return false;
    using Limits = std::numeric_limits<std::int32_t>;
    mode = static_cast<std::int32_t>(
        std::clamp<std::int64_t>(number->toInt64(), Limits::min(), Limits::max()));
    return true;
  }

  // Nanoseconds; time spent suspended does not count, as the figure is the CPU's uptime.
  std::uint64_t TickClockNow() override {
    timespec time = {};
    clock_gettime(CLOCK_MONOTONIC, &time);
    return static_cast<std::uint64_t>(time.tv_sec) * 1'000'000'000U +
           static_cast<std::uint64_t>(time.tv_nsec);
  }

  int TickTimebase(std::uint32_t& numerator, std::uint32_t& denominator) override {
    numerator = 1;
    denominator = 1;
    return 0;
  }

 private:
  static bool IsPath(std::string_view path) {
    return path.starts_with('/') && path.find('\0') == std::string_view::npos;
  }

  std::string hostPath(std::string_view path) const {
    const bool isKernels = path.starts_with("/proc/") || path.starts_with("/sys/");
    return isKernels ? root_.kernelPath(path) : root_.path(path);
  }

  const Root root_;
  DeviceInfo& deviceInfo_;
  SystemLog& log_;
};

}  // namespace

std::unique_ptr<Environment> MakeLinuxEnvironment(const Root& root, DeviceInfo& deviceInfo,
                                                  SystemLog& log) {
  return std::make_unique<LinuxEnvironment>(root, deviceInfo, log);
}

}  // namespace quorlet
