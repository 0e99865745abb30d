#include <array>
#include <utility>

#include "platform/linux/base/shell_assignments.h"
#include "platform/linux/device/services.h"

namespace quorlet {
namespace {

constexpr std::array kPaths = {"/etc/os-release", "/usr/lib/os-release"};
constexpr std::size_t kMaxBytes = 256UL << 10;

constexpr char kProductName[] = "ProductName";
constexpr char kProductVersion[] = "ProductVersion";
constexpr char kProductBuildVersion[] = "ProductBuildVersion";

struct Field {
  const char* key;
  std::array<const char*, 3> names;  // the first one that has a value counts
};

constexpr Field kFields[] = {
    {kProductName, {"NAME"}},
    {kProductVersion, {"VERSION_ID"}},
    {kProductBuildVersion, {"BUILD_ID", "IMAGE_VERSION", "VERSION_ID"}},
};

Dictionary VersionDictionary(const ShellAssignments& assignments) {
  Dictionary version;
  for (const Field& field : kFields) {
    for (const char* name : field.names) {
      const auto found = name != nullptr ? assignments.find(name) : assignments.end();
      if (found == assignments.end() || found->second.empty()) continue;
      version[field.key] = found->second;
      break;
    }
  }
  return version;
}

class LinuxOSVersion : public OSVersion {
 public:
  LinuxOSVersion(const Root& root, SystemLog& log) : root_(root), log_(log) {}

  std::optional<Dictionary> CopySystemVersionDictionary() override {
    if (!read_) version_ = read();
    read_ = true;
    return version_ ? std::optional(version_->deepCopy()) : std::nullopt;
  }

 private:
  std::optional<Dictionary> read() {
    for (const char* path : kPaths) {
      const auto text = ReadWholeFile(root_.path(path), kMaxBytes);
      if (const int* error = std::get_if<int>(&text)) {
        if (*error != ENOENT) log_.error("Cannot read %@: %@", path, ErrnoText(*error));
        continue;
      }
      Dictionary version = VersionDictionary(ParseShellAssignments(std::get<std::string>(text)));
      if (!version.empty()) return version;
      log_.error("%@ does not name the OS version", path);
    }
    return std::nullopt;
  }

  const Root root_;
  SystemLog& log_;
  bool read_ = false;
  std::optional<Dictionary> version_;
};

}  // namespace

std::unique_ptr<OSVersion> MakeLinuxOSVersion(const Root& root, SystemLog& log) {
  return std::make_unique<LinuxOSVersion>(root, log);
}

}  // namespace quorlet
