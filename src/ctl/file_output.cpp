#include "ctl/file_output.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "ctl/messages.h"

namespace quorlet {

FileOutput::FileOutput(Output& standardOutput, const std::string& path)
    : standardOutput_(standardOutput) {
  if (path.empty()) return;
  path_ = std::filesystem::absolute(path).lexically_normal();
  struct stat status = {};
  // Renaming would replace the device or the link, not what it stands for.
  if (::lstat(path_.c_str(), &status) == 0 && !S_ISREG(status.st_mode)) {
    throw Failure("cannot write " + path + ": it is not a file");
  }
  const std::string directory = path_.parent_path();
  if (::access(directory.c_str(), F_OK) != 0) fail(errno);
  if (!IsSafeName(path_.filename().string())) throw Failure("not the name of a file: " + path);
  file_.emplace(directory, path_.filename().string());
  fail(file_->open());
}

bool FileOutput::replaces(const std::string& path) const {
  return file_ && std::filesystem::absolute(path).lexically_normal() == path_;
}

void FileOutput::write(std::string_view bytes) {
  if (file_) {
    fail(file_->write(bytes));
  } else {
    standardOutput_.write(bytes);
  }
}

void FileOutput::finish() {
  if (file_) fail(file_->publish(path_.filename().string()));
}

void FileOutput::fail(int error) const {
  if (error != 0) throw Failure("cannot write " + path_.string() + ": " + ErrnoText(error));
}

}  // namespace quorlet
