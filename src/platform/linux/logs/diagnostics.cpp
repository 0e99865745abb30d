// Logs for submission: files in /var/mobile/Library/Logs/Diagwell.
//
// pending/<log name>-<UTC yyyymmddThhmmssZ>-<n>.log is one line of JSON (type, name, created,
// os_version and, when given, metadata), then the body to the end of the file. Submitting moves the
// files to outbox/. Names in both are given, counted and removed with ".lock" held; hidden names
// are nobody's logs.
#include "platform/diagnostics.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <limits>
#include <tuple>
#include <variant>
#include <vector>

#include "platform/linux/base/descriptor.h"
#include "platform/linux/base/paths.h"
#include "platform/linux/base/property_json.h"
#include "platform/linux/logs/services.h"
#include "platform/names.h"

namespace quorlet {
namespace {

// A log on disk.
struct StoredLog {
  std::int64_t seconds = 0;  // last modified
  std::int64_t nanoseconds = 0;
  std::string name;
  std::string path;
  std::uint64_t size = 0;
  auto age() const { return std::tie(seconds, nanoseconds, name); }
};

// The logs in a directory; 0 or the errno that keeps them from being known.
int FindLogs(const std::string& directory, std::vector<StoredLog>& logs) {
  const auto names = ReadDirectory(directory);
  if (const int* error = std::get_if<int>(&names)) return *error;
  for (const std::string& name : std::get<std::vector<std::string>>(names)) {
    const std::string path = JoinPath(directory, name);
    struct stat status = {};
    if (name.starts_with('.')) continue;
    if (lstat(path.c_str(), &status) != 0) {
      if (errno == ENOENT) continue;
      // It is there all the same; as the newest log it goes last.
      status = {};
      status.st_mtim.tv_sec = std::numeric_limits<time_t>::max();
    }
    if (S_ISDIR(status.st_mode)) continue;
    logs.push_back({status.st_mtim.tv_sec, status.st_mtim.tv_nsec, name, path,
                    static_cast<std::uint64_t>(std::max<off_t>(status.st_size, 0))});
  }
  return 0;
}

// Removes every file of a directory, unfinished ones too; 0 or the errno.
int RemoveFiles(const std::string& directory) {
  const auto names = ReadDirectory(directory);
  if (const int* error = std::get_if<int>(&names)) return *error;
  int failure = 0;
  const auto& files = std::get<std::vector<std::string>>(names);
  for (const std::string& name : files) {
    if (unlink(JoinPath(directory, name).c_str()) != 0 && errno != ENOENT) failure = errno;
  }
  if (failure != 0 || files.empty()) return failure;
  return SyncDirectory(directory);
}

// "20260304T050607Z"
std::string FileNameTime(Date date) {
  std::string text = Rfc3339(date);
  std::erase_if(text, [](char c) { return c == '-' || c == ':'; });
  return text;
}

// What cannot be looked at may be there.
bool Exists(const std::string& path) {
  struct stat status = {};
  return lstat(path.c_str(), &status) == 0 || errno != ENOENT;
}

// The body's way into the file; remembers why it failed and refuses what no quota could hold.
class FileOutput : public LogOutput {
 public:
  explicit FileOutput(AtomicFile& file) : file_(file) {}

  bool write(std::string_view bytes) override {
    if (error_ == 0) error_ = bytes.size() > kSpoolQuotaBytes - size_ ? EFBIG : file_.write(bytes);
    if (error_ != 0) return false;
    size_ += bytes.size();
    return true;
  }
  int error() const { return error_; }
  std::uint64_t size() const { return size_; }

 private:
  AtomicFile& file_;
  std::uint64_t size_ = 0;
  int error_ = 0;
};

class LinuxDiagnostics : public Diagnostics {
 public:
  LinuxDiagnostics(const Root& root, Access access, Clock& clock, Preferences& preferences,
                   OSVersion& osVersion, SystemLog& log)
      : directory_(root.path(kSpoolDirectory)),
        pending_(root.path(kPendingDirectory)),
        outbox_(root.path(kOutboxDirectory)),
        access_(access),
        clock_(clock),
        preferences_(preferences),
        osVersion_(osVersion),
        log_(log) {}

  bool DiagnosticLogSubmissionEnabled() override {
    bool found = false;
    return preferences_.DGWPreferencesGetBoolValue(kSubmissionEnabled, kConsentDomain, found);
  }

  std::string DGWOSVersion() override { return OSVersionText(osVersion_); }

  std::optional<PropertyValue> DGWGetDATaskingValue(std::string_view name) override {
    return preferences_.DGWPreferencesGetValue(name, "nuvex.da");
  }

  bool writeLog(const LogRequest& request, const LogWriter& writer) override {
    if (!DiagnosticLogSubmissionEnabled()) {
      log_.info("Submission is not enabled: the log %@ is not written", request.name);
      return false;
    }
    std::string reason;
    if (!IsSafeName(request.name)) {
      reason = "the name is refused";
    } else if (access_ == Access::kReadOnly) {
      reason = "no file may be changed";
    } else {
      reason = write(request, writer);
    }
    if (!reason.empty()) log_.error("Cannot write the log %@: %@", request.name, reason);
    return reason.empty();
  }

  bool hasLog(const std::string& fileName) override {
    return IsSafeName(fileName) &&
           (Exists(JoinPath(pending_, fileName)) || Exists(JoinPath(outbox_, fileName)));
  }

  bool removeLogs(std::span<const std::string> fileNames) override {
    const FileLock lock(lockPath());
    int error = lock.error();
    for (const std::string& directory : {pending_, outbox_}) {
      bool isChanged = false;
      for (const std::string& name : fileNames) {
        if (error != 0 || !IsSafeName(name)) continue;
        const bool isGone = unlink(JoinPath(directory, name).c_str()) == 0;
        if (!isGone && errno != ENOENT) error = errno;
        isChanged |= isGone;
      }
      if (isChanged && error == 0) error = SyncDirectory(directory);
    }
    if (error != 0) log_.error("Cannot remove logs from %@: %@", directory_, ErrnoText(error));
    return error == 0;
  }

  bool removeAllLogs() override {
    const FileLock lock(lockPath());
    int error = lock.error();
    for (const std::string& directory : {pending_, outbox_}) {
      if (error == 0) error = RemoveFiles(directory);
    }
    if (error != 0) log_.error("Cannot remove the logs of %@: %@", directory_, ErrnoText(error));
    return error == 0;
  }

  void SubmitDiagnosticLogs() override {
    if (!DiagnosticLogSubmissionEnabled()) {
      log_.info("Submission is not enabled: no log is submitted");
      return;
    }
    if (access_ == Access::kReadOnly) return;
    std::vector<StoredLog> logs;
    int error = FindLogs(pending_, logs);
    if (error == 0 && logs.empty()) return;
    const FileLock lock(lockPath());
    logs.clear();
    if (error == 0) error = lock.error();
    if (error == 0) error = MakeDirectories(outbox_);
    if (error == 0) error = FindLogs(pending_, logs);
    if (error != 0) {
      log_.error("Cannot submit the logs in %@: %@", pending_, ErrnoText(error));
      return;
    }
    for (const StoredLog& log : logs) {
      const std::string target = outbox_ + "/" + log.name;
      // Names are new in both directories; a file of that name is not ours to replace.
      const int moved = Exists(target)                                  ? EEXIST
                        : rename(log.path.c_str(), target.c_str()) == 0 ? 0
                                                                        : errno;
      if (moved != 0) log_.error("Cannot submit the log %@: %@", log.name, ErrnoText(moved));
    }
    // The names arrive before they leave, whatever reaches the disk first.
    if (SyncDirectory(outbox_) != 0 || SyncDirectory(pending_) != 0) {
      log_.error("Cannot make the submitted logs in %@ durable", outbox_);
    }
  }

 private:
  std::string lockPath() const { return directory_ + "/.lock"; }

  // Writes the log; returns why that failed, or nothing.
  std::string write(const LogRequest& request, const LogWriter& writer) {
    const std::string name(request.name);
    const Date created = clock_.now();
    nlohmann::ordered_json header = {{"type", request.typeCode},
                                     {"name", name},
                                     {"created", Rfc3339(created)},
                                     {"os_version", DGWOSVersion()}};
    if (request.metadata) header["metadata"] = PropertyJson(*request.metadata);

    AtomicFile file(pending_, name);
    if (const int error = file.open()) return ErrnoText(error);
    FileOutput output(file);
    const bool written = output.write(JsonLine(header) + "\n") && writer(output);
    if (output.error() != 0) return ErrnoText(output.error());
    if (!written) return "its writer failed";

    const FileLock lock(lockPath());
    if (lock.error() != 0) return ErrnoText(lock.error());
    if (std::string why = makeRoom(output.size()); !why.empty()) return why;
    const std::string fileName = newName(name + "-" + FileNameTime(created) + "-");
    if (request.beforePublication) request.beforePublication(fileName);
    if (const int error = file.publish(fileName)) {
      unlink((pending_ + "/" + fileName).c_str());  // it may be there, but not durable
      return ErrnoText(error);
    }
    return "";
  }

  // A name that is new in pending/ and in outbox/.
  std::string newName(const std::string& stem) const {
    // No second has as many logs: where nothing can be looked at, the search ends all the same.
    constexpr std::uint64_t kMost = 1000;
    for (std::uint64_t number = 1;; ++number) {
      std::string name = stem + std::to_string(number) + ".log";
      const bool isNew = !Exists(pending_ + "/" + name) && !Exists(outbox_ + "/" + name);
      if (isNew || number == kMost) return name;
    }
  }

  // Removes the oldest logs until one of `size` bytes fits; says why it does not, or nothing.
  std::string makeRoom(std::uint64_t size) {
    std::vector<StoredLog> logs;
    for (const std::string& directory : {pending_, outbox_}) {
      if (const int error = FindLogs(directory, logs)) return ErrnoText(error);
    }
    std::ranges::sort(logs, {}, &StoredLog::age);
    std::uint64_t total = size;
    for (const StoredLog& log : logs) total += log.size;
    for (const StoredLog& log : logs) {
      if (total <= kSpoolQuotaBytes) break;
      if (unlink(log.path.c_str()) != 0) {
        log_.error("Cannot remove the old log %@: %@", log.path, ErrnoText(errno));
        continue;
      }
      log_.info("Removed the old log %@ to make room", log.path);
      total -= log.size;
    }
    return total <= kSpoolQuotaBytes ? "" : "there is no room for it";
  }

  const std::string directory_;
  const std::string pending_;
  const std::string outbox_;
  const Access access_;
  Clock& clock_;
  Preferences& preferences_;
  OSVersion& osVersion_;
  SystemLog& log_;
};

}  // namespace

std::unique_ptr<Diagnostics> MakeLinuxDiagnostics(const Root& root, Access access, Clock& clock,
                                                  Preferences& preferences, OSVersion& osVersion,
                                                  SystemLog& log) {
  return std::make_unique<LinuxDiagnostics>(root, access, clock, preferences, osVersion, log);
}

}  // namespace quorlet
