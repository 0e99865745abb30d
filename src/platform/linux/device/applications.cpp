// Installed applications: *.desktop files, also those in subdirectories.
#include "platform/applications.h"

#include <sys/stat.h>

#include <algorithm>

#include "platform/linux/device/services.h"

namespace quorlet {
namespace {

struct ApplicationDirectory {
  const char* path;
  ApplicationBundleType type;
};

constexpr ApplicationDirectory kDirectories[] = {
    {"/usr/share/applications", ApplicationBundleType::SystemApplicationBundleType},
    {"/usr/local/share/applications", ApplicationBundleType::UserApplicationBundleType},
    {"/var/lib/flatpak/exports/share/applications",
     ApplicationBundleType::UserApplicationBundleType},
    {"/var/mobile/.local/share/applications", ApplicationBundleType::UserApplicationBundleType},
};

constexpr std::size_t kMaxFileBytes = 1UL << 20;
constexpr int kMaxDepth = 8;  // of subdirectories

std::string_view Trimmed(std::string_view text) {
  constexpr std::string_view kBlanks = " \t\r";
  const std::size_t begin = text.find_first_not_of(kBlanks);
  if (begin == std::string_view::npos) return {};
  return text.substr(begin, text.find_last_not_of(kBlanks) - begin + 1);
}

// Whether the desktop entry is an application. One that is hidden counts as deleted, by the
// format's own definition; one that menus do not display is installed all the same.
bool IsApplication(std::string_view text) {
  bool inEntry = false;
  bool isApplication = false;
  while (!text.empty()) {
    const std::string_view rawLine = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(text.size(), rawLine.size() + 1));
    const std::string_view line = Trimmed(rawLine);
    if (line.starts_with('[')) {
      if (inEntry) break;
      inEntry = line == "[Desktop Entry]";
      continue;
    }
    const std::size_t equals = line.find('=');
    if (!inEntry || equals == std::string_view::npos) continue;
    const std::string_view key = Trimmed(line.substr(0, equals));
    const std::string_view value = Trimmed(line.substr(equals + 1));
    if (key == "Type") isApplication = value == "Application";
  }
  return isApplication;
}

class LinuxApplications : public Applications {
 public:
  LinuxApplications(const Root& root, SystemLog& log) : root_(root), log_(log) {}

  bool EnumerateApplicationBundles(
      const std::function<void(ApplicationBundleType)>& visit) override {
    bool isComplete = true;
    for (const ApplicationDirectory& directory : kDirectories) {
      const auto found = [&] { visit(directory.type); };
      isComplete &= search(root_.path(directory.path), 0, found);
    }
    return isComplete;
  }

 private:
  bool search(const std::string& directory, int depth, const std::function<void()>& found) {
    const auto names = ReadDirectory(directory);
    if (const int* error = std::get_if<int>(&names)) {
      log_.error("The applications are not counted: cannot read %@: %@", directory,
                 ErrnoText(*error));
      return false;
    }
    bool isComplete = true;
    for (const std::string& name : std::get<std::vector<std::string>>(names)) {
      if (name.starts_with('.')) continue;
      const std::string path = JoinPath(directory, name);
      struct stat status = {};
      // Entries may be links to where an application lies; directories are not followed through
      // links, which may lead in circles.
      if (name.ends_with(".desktop")) {
        const auto text = ReadWholeFile(path, kMaxFileBytes);
        const auto* entry = std::get_if<std::string>(&text);
        if (entry != nullptr && IsApplication(*entry)) found();
      } else if (depth < kMaxDepth && lstat(path.c_str(), &status) == 0 &&
                 S_ISDIR(status.st_mode)) {
        isComplete &= search(path, depth + 1, found);
      }
    }
    return isComplete;
  }

  const Root root_;
  SystemLog& log_;
};

}  // namespace

std::unique_ptr<Applications> MakeLinuxApplications(const Root& root, SystemLog& log) {
  return std::make_unique<LinuxApplications>(root, log);
}

}  // namespace quorlet
