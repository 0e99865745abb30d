#include "ctl/install_checks.h"

#include <fcntl.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>

#include "platform/linux/base/paths.h"
#include "platform/names.h"

namespace quorlet {
namespace {

constexpr char kTimer[] = "quorlet-daily.timer";
constexpr char kServiceUnit[] = "quorlet.socket";
constexpr char kRecordUnit[] = "quorlet-record.socket";
constexpr auto kUnitDirectories = std::to_array<const char*>(
    {"/etc/systemd/system/", "/run/systemd/system/", "/usr/local/lib/systemd/system/",
     "/usr/lib/systemd/system/", "/lib/systemd/system/"});
constexpr auto kWrittenTo =
    std::to_array<const char*>({kPreferencesDirectory, kSpoolDirectory, kStructuredLogDirectory,
                                kSupportLogDirectory, kServiceDirectory});

bool IsKind(const std::string& path, mode_t kind) {
  struct stat status {};
  return ::stat(path.c_str(), &status) == 0 && (status.st_mode & S_IFMT) == kind;
}

bool RunsSystemd(const Root& root) { return IsKind(root.path("/run/systemd/system"), S_IFDIR); }

bool HasUnit(const Root& root, const std::string& unit) {
  for (const char* directory : kUnitDirectories) {
    if (::access(root.path(directory + unit).c_str(), F_OK) == 0) return true;
  }
  return false;
}

// Links to units may be absolute, and so dangle in a root that is not the machine's.
bool IsEnabled(const Root& root, const std::string& target, const std::string& unit) {
  struct stat status {};
  const std::string link = root.path("/etc/systemd/system/" + target + ".wants/" + unit);
  return ::lstat(link.c_str(), &status) == 0;
}

std::string UserName(uid_t user) {
  const passwd* entry = ::getpwuid(user);
  return entry != nullptr ? entry->pw_name : "#" + std::to_string(user);
}

// The directory itself, or the first one above that is there: that is where it would be made.
std::string FirstThere(std::string directory) {
  struct stat status {};
  while (directory.size() > 1 && ::stat(directory.c_str(), &status) != 0 && errno == ENOENT) {
    directory.resize(std::max<std::size_t>(directory.rfind('/'), 1));
  }
  return directory;
}

std::string SocketState(const Root& root, const std::string& name, const char* unit) {
  const std::string path = root.path(std::string(kServiceDirectory) + "/" + name);
  if (IsKind(path, S_IFSOCK)) return "at " + path;
  return HasUnit(root, unit) ? std::string("by ") + unit : "";
}

}  // namespace

Finding CheckRootDirectory(const Root& root) {
  return Ok(root.isMachine() ? "/, the machine's own" : root.path(""));
}

Finding CheckPermissions(const Root& root) {
  for (const char* written : kWrittenTo) {
    const std::string directory = FirstThere(root.path(written));
    if (::faccessat(AT_FDCWD, directory.c_str(), R_OK | W_OK | X_OK, AT_EACCESS) == 0) continue;
    const int error = errno;
    struct stat status {};
    const bool isKnown = ::stat(directory.c_str(), &status) == 0;
    const std::string text = "cannot use " + directory + ": " + ErrnoText(error);
    if (error == EROFS) return Error(text, "mount -o remount,rw " + directory);
    if (isKnown && status.st_uid != ::geteuid() && ::geteuid() != 0) {
      const std::string owner = UserName(status.st_uid);
      return Warning(text + ", which is " + owner + "'s",
                     (status.st_uid == 0 ? "sudo" : "sudo -u " + owner) + " quorletctl status");
    }
    return Error(text, "chmod u+rwx " + directory);
  }
  return Ok("all that is written to can be written");
}

Finding CheckService(const Root& root) {
  const std::string service = SocketState(root, kServiceName, kServiceUnit);
  const std::string record = SocketState(root, "statsd", kRecordUnit);
  const std::string both = "named service " + (service.empty() ? "not there" : service) +
                           ", recording socket " + (record.empty() ? "not there" : record);
  if (!service.empty()) return Ok(both);
  return Warning(
      both, RunsSystemd(root) ? std::string("systemctl enable --now ") + kServiceUnit : "quorlet");
}

Finding CheckUnits(const Root& root) {
  if (!RunsSystemd(root)) {
    return Ok("systemd does not run here: something else must run \"quorlet -d\" each day");
  }
  const std::string enable = std::string("systemctl enable --now ") + kTimer;
  if (!HasUnit(root, kTimer)) {
    return Warning(std::string(kTimer) + " is not installed", "apt install quorlet");
  }
  if (!IsEnabled(root, "timers.target", kTimer)) {
    return Warning(std::string(kTimer) + " is installed, but not enabled", enable);
  }
  return Ok(std::string(kTimer) + " is installed and enabled");
}

}  // namespace quorlet
