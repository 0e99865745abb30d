// Where the logs of an export come from: this root's spool, or files and directories.
#ifndef QUORLET_CTL_EXPORT_SOURCES_H_
#define QUORLET_CTL_EXPORT_SOURCES_H_

#include <optional>
#include <string>

#include "platform/linux/base/files.h"

namespace quorlet {

// What is told of the files found, one after another.
class LogVisitor {
 public:
  virtual ~LogVisitor() = default;
  // A file's bytes. `device`: the name in its path, "<name>/outbox/" or "<name>/pending/"; nothing
  // for a file of the spool.
  virtual void visit(const std::string& path, const std::string& bytes,
                     const std::optional<std::string>& device) = 0;
  // A file or directory that cannot be read, and why.
  virtual void refuse(const std::string& path, const std::string& why) = 0;
  // Whether to go on.
  virtual bool wantsMore() const = 0;
};

// Every log of the root's spool, in byte order of the names. One that is moved from pending to
// outbox meanwhile is told once; one that an uploader takes meanwhile is left out.
void VisitSpool(const Root& root, LogVisitor& visitor);

// A file, or a directory with all that is below it, in byte order of the names in each. Hidden
// names are left out, and so are links to directories.
void VisitPath(const std::string& path, LogVisitor& visitor);

}  // namespace quorlet

#endif  // QUORLET_CTL_EXPORT_SOURCES_H_
