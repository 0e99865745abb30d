// Output of a command that may go into a file.
#ifndef QUORLET_CTL_FILE_OUTPUT_H_
#define QUORLET_CTL_FILE_OUTPUT_H_

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include "ctl/output.h"
#include "platform/linux/base/files.h"

namespace quorlet {

// A file that appears, whole, when all is written, or standard output. What fails is thrown as
// Failure.
class FileOutput {
 public:
  // `path` empty: standard output. What is there already is replaced when it is a file.
  FileOutput(Output& standardOutput, const std::string& path);

  bool isFile() const { return file_.has_value(); }
  // Whether `path` is the file that this one replaces.
  bool replaces(const std::string& path) const;

  void write(std::string_view bytes);
  bool ok() const { return standardOutput_.ok(); }
  void finish();

 private:
  void fail(int error) const;

  Output& standardOutput_;
  std::filesystem::path path_;
  std::optional<AtomicFile> file_;
};

}  // namespace quorlet

#endif  // QUORLET_CTL_FILE_OUTPUT_H_
