// A root directory of its own for one test, removed with everything in it.
#ifndef QUORLET_TESTS_FAKES_TEMP_ROOT_H_
#define QUORLET_TESTS_FAKES_TEMP_ROOT_H_

#include <stdlib.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <string_view>
#include <system_error>
#include <vector>

#include "platform/linux/base/files.h"

namespace quorlet {

class TempRoot {
 public:
  TempRoot() {
    std::string pattern = (std::filesystem::temp_directory_path() / "quorlet-test-XXXXXX").string();
    if (mkdtemp(pattern.data()) == nullptr) std::abort();
    directory_ = pattern;
  }
  TempRoot(const TempRoot&) = delete;
  TempRoot& operator=(const TempRoot&) = delete;
  ~TempRoot() {
    std::error_code ignored;
    std::filesystem::remove_all(directory_, ignored);
  }

  const std::string& directory() const { return directory_; }
  Root root() const { return Root(directory_); }
  // Where `absolutePath` of the system lies.
  std::string path(std::string_view absolutePath) const {
    return directory_ + std::string(absolutePath);
  }

  bool exists(std::string_view absolutePath) const {
    return std::filesystem::exists(std::filesystem::symlink_status(path(absolutePath)));
  }
  // The file's bytes; empty when it is missing.
  std::string read(std::string_view absolutePath) const {
    std::ifstream file(path(absolutePath), std::ios::binary);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
  }
  // Writes the file and the directories above it.
  void write(std::string_view absolutePath, std::string_view bytes) const {
    const std::filesystem::path target = path(absolutePath);
    std::filesystem::create_directories(target.parent_path());
    std::ofstream file(target, std::ios::binary);
    file.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
    if (!file.flush()) std::abort();
  }
  // The names in a directory in byte order, hidden ones included.
  std::vector<std::string> list(std::string_view absolutePath) const {
    auto names = ReadDirectory(path(absolutePath));
    return std::get<std::vector<std::string>>(std::move(names));
  }

 private:
  std::string directory_;
};

}  // namespace quorlet

#endif  // QUORLET_TESTS_FAKES_TEMP_ROOT_H_
