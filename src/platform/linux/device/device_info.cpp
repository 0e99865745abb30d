#include "platform/device_info.h"

#include <sys/statvfs.h>

#include <cerrno>
#include <limits>
#include <mutex>

#include "platform/linux/device/services.h"
#include "values/digest.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr char kAnswersPath[] = "/var/db/DeviceInfo.plist";
constexpr char kMachineIdPath[] = "/etc/machine-id";
constexpr std::size_t kMaxMachineIdBytes = 4096;

// Saturating, since nobody vouches for what a file system says.
PropertyValue Bytes(std::uint64_t blocks, std::uint64_t blockSize) {
  constexpr auto kMax = static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());
  const bool fits = blockSize == 0 || blocks <= kMax / blockSize;
  return Int64(static_cast<std::int64_t>(fits ? blocks * blockSize : kMax));
}

class LinuxDeviceInfo : public DeviceInfo {
 public:
  LinuxDeviceInfo(const Root& root, SystemLog& log) : root_(root), log_(log) {}

  std::optional<PropertyValue> DQCopyAnswer(std::string_view question) override {
    std::call_once(read_, [this] { readAnswers(); });
    if (const PropertyValue* answer = answers_.find(question)) return answer->deepCopy();
    if (question == "DiskUsage") return diskUsage();
    if (question == "InverseDeviceID") return inverseDeviceId();
    return std::nullopt;
  }

 private:
  // A file that cannot be read gives no answers, and one error line.
  void readAnswers() {
    const std::string path = root_.path(kAnswersPath);
    const auto bytes = ReadWholeFile(path, kMaxPropertyListBytes);
    if (const int* error = std::get_if<int>(&bytes)) {
      if (*error != ENOENT) log_.error("Cannot read %@: %@", path, ErrnoText(*error));
      return;
    }
    const auto document = ReadPropertyList(std::string_view(std::get<std::string>(bytes)));
    if (const auto* error = std::get_if<PropertyListError>(&document)) {
      log_.error("Cannot read %@: %@", path, error->description);
    } else if (const auto* answers = std::get<PropertyValue>(document).asDictionary()) {
      answers_ = *answers;
    } else {
      log_.error("Cannot read %@: it holds no dictionary", path);
    }
  }

  std::optional<PropertyValue> diskUsage() const {
    struct statvfs status = {};
    if (statvfs(root_.path("/").c_str(), &status) != 0) return std::nullopt;
    return Dictionary{
        {"kDQQDiskUsageTotalDiskCapacity", Bytes(status.f_blocks, status.f_frsize)},
        {"kDQQDiskUsageTotalDataAvailable", Bytes(status.f_bavail, status.f_frsize)},
    };
  }

  std::optional<PropertyValue> inverseDeviceId() const {
    const auto bytes = ReadWholeFile(root_.path(kMachineIdPath), kMaxMachineIdBytes);
    const auto* text = std::get_if<std::string>(&bytes);
    if (text == nullptr) return std::nullopt;
    const std::string_view identifier = std::string_view(*text).substr(0, text->find('\n'));
    const std::string digest = identifier.empty() ? "" : HexDigest(DigestKind::kSha1, identifier);
    return digest.empty() ? std::nullopt : std::optional<PropertyValue>(digest);
  }

  const Root root_;
  SystemLog& log_;
  std::once_flag read_;
  Dictionary answers_;
};

}  // namespace

std::unique_ptr<DeviceInfo> MakeLinuxDeviceInfo(const Root& root, SystemLog& log) {
  return std::make_unique<LinuxDeviceInfo>(root, log);
}

}  // namespace quorlet
