#include "platform/linux/base/logging_root.h"

#include <cerrno>
#include <utility>
#include <variant>

namespace quorlet {

std::vector<std::string> LoggingRoot::names(const std::string& directory) const {
  auto read = ReadDirectory(directory);
  if (auto* names = std::get_if<std::vector<std::string>>(&read)) return std::move(*names);
  const int error = std::get<int>(read);
  // The device or process that it belongs to may just have gone.
  if (error != ENODEV && error != ESRCH) {
    log_->error("Cannot read %@: %@", directory, ErrnoText(error));
  }
  return {};
}

}  // namespace quorlet
