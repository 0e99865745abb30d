#include "ctl/export_sources.h"

#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <filesystem>
#include <set>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/base/paths.h"

namespace quorlet {
namespace {

// A document may take all of the spool; the rest is for its header.
constexpr std::size_t kMaxLogBytes = std::size_t{65} << 20;

bool IsStage(const std::filesystem::path& name) {
  return name == kSpoolStages[0] || name == kSpoolStages[1];
}

// The name before the last "outbox" or "pending" among the directories of a path.
std::optional<std::string> DeviceInPath(const std::string& path) {
  std::error_code error;
  auto directory = std::filesystem::absolute(path, error).lexically_normal().parent_path();
  for (; !error && directory.has_relative_path(); directory = directory.parent_path()) {
    if (!IsStage(directory.filename())) continue;
    const std::string name = directory.parent_path().filename().string();
    return name.empty() ? std::nullopt : std::optional(name);
  }
  return std::nullopt;
}

void VisitFile(const std::string& path, LogVisitor& visitor) {
  const auto bytes = ReadWholeFile(path, kMaxLogBytes);
  if (const int* error = std::get_if<int>(&bytes)) {
    visitor.refuse(path, ErrnoText(*error));
  } else {
    visitor.visit(path, std::get<std::string>(bytes), DeviceInPath(path));
  }
}

void VisitDirectory(const std::string& directory, LogVisitor& visitor) {
  const auto names = ReadDirectory(directory);
  if (const int* error = std::get_if<int>(&names)) {
    visitor.refuse(directory, ErrnoText(*error));
    return;
  }
  for (const std::string& name : std::get<std::vector<std::string>>(names)) {
    if (!visitor.wantsMore()) return;
    if (name.starts_with('.')) continue;
    const std::string path = JoinPath(directory, name);
    struct stat status = {};
    const bool isKnown = ::lstat(path.c_str(), &status) == 0;
    if (isKnown && S_ISDIR(status.st_mode)) {
      VisitDirectory(path, visitor);
      continue;
    }
    // Links to directories could lead around in circles.
    struct stat target = {};
    const bool isLink = isKnown && S_ISLNK(status.st_mode);
    if (isLink && ::stat(path.c_str(), &target) == 0 && S_ISDIR(target.st_mode)) continue;
    VisitFile(path, visitor);
  }
}

// The log of that name, wherever it has got to; ENOENT when it has been taken.
std::pair<std::string, std::variant<std::string, int>> ReadFromSpool(const Root& root,
                                                                     const std::string& name) {
  std::string path;
  // A log that leaves the first directory after it was looked for there is in the second.
  for (const std::string_view stage : kSpoolStages) {
    path = root.path(std::string(kSpoolDirectory) + "/" + std::string(stage) + "/" + name);
    auto bytes = ReadOwnFile(path, kMaxLogBytes);
    const int* error = std::get_if<int>(&bytes);
    if (error == nullptr || *error != ENOENT) return {path, std::move(bytes)};
  }
  return {path, ENOENT};
}

}  // namespace

void VisitSpool(const Root& root, LogVisitor& visitor) {
  std::set<std::string> all;
  for (const std::string_view stage : kSpoolStages) {
    const std::string directory =
        root.path(std::string(kSpoolDirectory) + "/" + std::string(stage));
    auto names = ReadDirectory(directory);
    if (const int* error = std::get_if<int>(&names)) {
      visitor.refuse(directory, ErrnoText(*error));
      continue;
    }
    for (std::string& name : std::get<std::vector<std::string>>(names)) {
      if (!name.starts_with('.')) all.insert(std::move(name));
    }
  }
  for (const std::string& name : all) {
    if (!visitor.wantsMore()) return;
    const auto [path, bytes] = ReadFromSpool(root, name);
    const int* error = std::get_if<int>(&bytes);
    if (error == nullptr) {
      visitor.visit(path, std::get<std::string>(bytes), std::nullopt);
    } else if (*error != ENOENT && *error != EISDIR) {
      visitor.refuse(path, ErrnoText(*error));
    }
  }
}

void VisitPath(const std::string& path, LogVisitor& visitor) {
  struct stat status = {};
  if (::stat(path.c_str(), &status) != 0) {
    visitor.refuse(path, ErrnoText(errno));
  } else if (S_ISDIR(status.st_mode)) {
    VisitDirectory(path, visitor);
  } else {
    VisitFile(path, visitor);
  }
}

}  // namespace quorlet
