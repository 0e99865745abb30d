#include "platform/crash_support.h"

#include <sys/random.h>
#include <sys/stat.h>
#include <sys/utsname.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <span>
#include <variant>
#include <vector>

#include "platform/linux/base/descriptor.h"
#include "platform/linux/base/paths.h"
#include "platform/linux/base/property_json.h"
#include "platform/linux/logs/services.h"
#include "platform/linux/logs/structured_log.h"
#include "values/digits.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr char kMachineId[] = "/etc/machine-id";
constexpr char kProductName[] = "/sys/devices/virtual/dmi/id/product_name";
constexpr char kUnknown[] = "unknown";
constexpr int kOldestLog = 5;
constexpr std::int32_t kEccEvent = 172;  // has a share of the structured log of its own
constexpr std::size_t kMaxTextBytes = 4096;

// Only the owner of a log writes it; a link is not followed to somebody else's file.
bool IsFile(const std::string& path, bool mayBeEmpty) {
  struct stat status = {};
  return lstat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode) &&
         (mayBeEmpty || status.st_size > 0);
}

// Renames LOG.4 to LOG.5 and so on down to LOG to LOG.1; 0 or the errno. It starts at the first
// number that is free, so that a rotation that was cut short is completed, not repeated.
int Rotate(const std::string& log) {
  const auto numbered = [&](int number) {
    return number == 0 ? log : log + "." + std::to_string(number);
  };
  int last = 1;
  while (last < kOldestLog && IsFile(numbered(last), true)) ++last;
  for (int number = last; number > 0; --number) {
    if (rename(numbered(number - 1).c_str(), numbered(number).c_str()) != 0) return errno;
  }
  return 0;
}

// The first line of a small file; empty when there is none.
std::string FirstLine(const std::string& path) {
  const auto bytes = ReadWholeFile(path, kMaxTextBytes);
  const auto* text = std::get_if<std::string>(&bytes);
  return text != nullptr ? text->substr(0, text->find('\n')) : std::string();
}

// 16 random bytes that say of themselves that they are random: version 4, variant 1.
std::array<std::byte, kUuidBytes> RandomUuid() {
  std::array<std::byte, kUuidBytes> uuid = {};
  std::span<std::byte> rest = uuid;
  while (!rest.empty()) {
    const ssize_t count = Uninterrupted([&] { return getrandom(rest.data(), rest.size(), 0); });
    if (count <= 0) break;  // not on a kernel that has the call
    rest = rest.subspan(static_cast<std::size_t>(count));
  }
  uuid[6] = (uuid[6] & std::byte{0x0F}) | std::byte{0x40};
  uuid[8] = (uuid[8] & std::byte{0x3F}) | std::byte{0x80};
  return uuid;
}

class LinuxCrashSupport : public CrashSupport {
 public:
  LinuxCrashSupport(const Root& root, Access access, Clock& clock, OSVersion& osVersion,
                    SystemLog& log)
      : root_(root),
        structuredLog_(root.path(kStructuredLogDirectory)),
        supportLogs_(root.path(kSupportLogDirectory)),
        access_(access),
        clock_(clock),
        osVersion_(osVersion),
        log_(log) {}

  bool logEntries(std::int32_t type, std::span<const Dictionary> entries) override {
    if (access_ == Access::kReadOnly || entries.empty()) return entries.empty();
    const std::string time = Rfc3339(clock_.now());
    std::string lines;
    for (const Dictionary& entry : entries) {
      if (!lines.empty()) lines += '\n';
      lines += JsonLine({{"type", type}, {"time", time}, {"data", PropertyJson(entry)}});
    }
    const auto share =
        type == kEccEvent ? StructuredLog::Share::kReserved : StructuredLog::Share::kCommon;
    return succeeds(isStaging_ ? structuredLog_.stage(lines) : structuredLog_.append(lines, share),
                    "Cannot add entries to");
  }

  bool syncStructuredData() override {
    if (access_ == Access::kReadOnly) return false;
    return succeeds(isStaging_ ? EBUSY : structuredLog_.sync(), "Cannot sync");
  }

  bool stageEntries() override {
    isStaging_ = access_ == Access::kReadWrite &&
                 succeeds(structuredLog_.beginStaging(clock_.now()), "Cannot stage entries for");
    return isStaging_;
  }

  bool publishStagedEntries() override {
    isStaging_ = false;
    return access_ == Access::kReadOnly ||
           succeeds(structuredLog_.publish(clock_.now()), "Cannot add the staged entries to");
  }

  void FSDumpAllOldStructuredDataLogs() override {
    if (access_ == Access::kReadOnly) return;
    const Date now = clock_.now();
    const bool isMoved = succeeds(structuredLog_.moveOldLines(now), "Cannot move the old lines of");
    if (isMoved) succeeds(structuredLog_.dropOldDays(now), "Cannot drop old days of");
    isFullTold_ = false;  // the pass's use of the log ends here
  }

  void rollCarewellLogs() override {
    if (access_ == Access::kReadOnly) return;
    const auto names = ReadDirectory(supportLogs_);
    if (const int* error = std::get_if<int>(&names)) {
      log_.error("Cannot read %@: %@", supportLogs_, ErrnoText(*error));
      return;
    }
    for (const std::string& name : std::get<std::vector<std::string>>(names)) {
      const std::string log = supportLogs_ + "/" + name;
      if (name.starts_with('.') || !name.ends_with(".log") || !IsFile(log, false)) continue;
      if (const int error = Rotate(log)) {
        log_.error("Cannot rotate %@: %@", log, ErrnoText(error));
      }
    }
  }

  std::string GetSysIDWithDescription() override {
    const std::string id = FirstLine(root_.path(kMachineId));
    return id.empty() ? kUnknown : id;
  }

  std::string GetHardwareModel() override {
    const std::string product = FirstLine(root_.kernelPath(kProductName));
    if (!product.empty()) return product;
    utsname machine = {};
    return uname(&machine) == 0 ? machine.machine : kUnknown;
  }

  std::string GetSystemVersion() override { return OSVersionText(osVersion_); }

  std::string GetIncidentID() override { return UuidText(RandomUuid()); }

 private:
  // Tells of an error; that the log is full, once a pass.
  bool succeeds(int error, std::string_view failure) {
    if (error == StructuredLog::kLogIsFull) {
      if (!isFullTold_) {
        log_.error("%@ is full (%u MiB with its older days): entries are left out",
                   structuredLog_.path(), StructuredLog::kMostBytes >> 20);
      }
      isFullTold_ = true;
    } else if (error != 0) {
      log_.error("%@ %@: %@", failure, structuredLog_.path(), ErrnoText(error));
    }
    return error == 0;
  }

  const Root root_;
  StructuredLog structuredLog_;
  const std::string supportLogs_;
  const Access access_;
  Clock& clock_;
  OSVersion& osVersion_;
  SystemLog& log_;
  bool isStaging_ = false;
  bool isFullTold_ = false;
};

}  // namespace

std::unique_ptr<CrashSupport> MakeLinuxCrashSupport(const Root& root, Access access, Clock& clock,
                                                    OSVersion& osVersion, SystemLog& log) {
  return std::make_unique<LinuxCrashSupport>(root, access, clock, osVersion, log);
}

}  // namespace quorlet
