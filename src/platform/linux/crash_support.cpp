#include "platform/crash_support.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstdio>

#include "platform/linux/property_json.h"
#include "platform/linux/services.h"
#include "platform/linux/structured_log.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr char kStructuredLogs[] = "/var/mobile/Library/Logs/FaultScribe";
constexpr char kSupportLogs[] = "/var/mobile/Library/Logs/Carewell";
constexpr int kOldestLog = 5;

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

class LinuxCrashSupport : public CrashSupport {
 public:
  LinuxCrashSupport(const Root& root, Access access, Clock& clock, SystemLog& log)
      : structuredLog_(root.path(kStructuredLogs)),
        supportLogs_(root.path(kSupportLogs)),
        access_(access),
        clock_(clock),
        log_(log) {}

  void FSLogStructuredData(std::int32_t type, const Dictionary& entry) override {
    if (access_ == Access::kReadOnly) return;
    const nlohmann::ordered_json line = {
        {"type", type}, {"time", Rfc3339(clock_.now())}, {"data", PropertyJson(entry)}};
    if (const int error = structuredLog_.append(JsonLine(line))) {
      log_.error("Cannot add an entry of type %d to %@: %@", type, structuredLog_.path(),
                 ErrnoText(error));
    }
  }

  void FSDumpAllOldStructuredDataLogs() override {
    if (access_ == Access::kReadOnly) return;
    if (const int error = structuredLog_.moveOldLines(clock_.now())) {
      log_.error("Cannot move the old lines of %@: %@", structuredLog_.path(), ErrnoText(error));
    }
  }

  void rollCarewellLogs() override {
    if (access_ == Access::kReadOnly) return;
    for (const std::string& name : ListDirectory(supportLogs_)) {
      const std::string log = supportLogs_ + "/" + name;
      if (name.starts_with('.') || !name.ends_with(".log") || !IsFile(log, false)) continue;
      if (const int error = Rotate(log)) {
        log_.error("Cannot rotate %@: %@", log, ErrnoText(error));
      }
    }
  }

 private:
  StructuredLog structuredLog_;
  const std::string supportLogs_;
  const Access access_;
  Clock& clock_;
  SystemLog& log_;
};

}  // namespace

std::unique_ptr<CrashSupport> MakeLinuxCrashSupport(const Root& root, Access access, Clock& clock,
                                                    SystemLog& log) {
  return std::make_unique<LinuxCrashSupport>(root, access, clock, log);
}

}  // namespace quorlet
