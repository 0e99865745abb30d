// Notifications: one file for each name, which holds how often it was posted.
#include "platform/notifications.h"

#include <limits>
#include <variant>

#include "platform/linux/base/paths.h"
#include "platform/linux/service/services.h"
#include "values/digits.h"

namespace quorlet {
namespace {

// The count in a notification's file; 0 when there is none, or something else.
std::uint64_t CountIn(const std::string& path) {
  constexpr std::size_t kLongestCount = 32;
  const auto content = ReadOwnFile(path, kLongestCount);
  const auto* text = std::get_if<std::string>(&content);
  if (text == nullptr) return 0;
  std::string_view digits = *text;
  if (digits.ends_with('\n')) digits.remove_suffix(1);
  return ParseNumber<std::uint64_t>(digits).value_or(0);
}

class LinuxNotifications : public Notifications {
 public:
  LinuxNotifications(const Root& root, SystemLog& log)
      : directory_(root.path(std::string(kServiceDirectory) + "/notify")), log_(log) {}

  void PostNotification(std::string_view name) override {
    if (!IsSafeName(name)) {
      log_.error("Refused the notification name \"%@\"", name.substr(0, 200));
      return;
    }
    // Two posters at once must count to two.
    const FileLock lock(directory_ + "/." + std::string(name) + ".lock");
    const std::string path = directory_ + "/" + std::string(name);
    int error = lock.error();
    if (error == 0) {
      std::uint64_t count = CountIn(path);
      if (count < std::numeric_limits<std::uint64_t>::max()) ++count;
      error = WriteWholeFile(path, std::to_string(count) + "\n");
    }
    if (error != 0) log_.error("Cannot post the notification %@: %@", name, ErrnoText(error));
  }

 private:
  const std::string directory_;
  SystemLog& log_;
};

}  // namespace

std::unique_ptr<Notifications> MakeLinuxNotifications(const Root& root, SystemLog& log) {
  return std::make_unique<LinuxNotifications>(root, log);
}

}  // namespace quorlet
