// A root whose directories are listed with a log.
#ifndef QUORLET_PLATFORM_LINUX_BASE_LOGGING_ROOT_H_
#define QUORLET_PLATFORM_LINUX_BASE_LOGGING_ROOT_H_

#include <string>
#include <vector>

#include "platform/linux/base/files.h"
#include "platform/system_log.h"

namespace quorlet {

class LoggingRoot : public Root {
 public:
  // `log` must outlive the root and its copies.
  LoggingRoot(const Root& root, SystemLog& log) : Root(root), log_(&log) {}

  // The names in a directory, in byte order: none where there is no such directory, and, after an
  // error line, where it cannot be read.
  std::vector<std::string> names(const std::string& directory) const;

 private:
  SystemLog* log_;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_BASE_LOGGING_ROOT_H_
