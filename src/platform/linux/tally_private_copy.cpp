#include "platform/linux/tally_private_copy.h"

#include <stdlib.h>
#include <sys/stat.h>

#include <array>
#include <cstdint>
#include <filesystem>
#include <system_error>

namespace quorlet {
namespace {

constexpr int kAttempts = 3;

// Tells two states of a file apart; all 0 when it is missing.
struct FileState {
  std::uint64_t inode = 0;
  std::int64_t size = 0, seconds = 0, nanoseconds = 0;
  bool operator==(const FileState&) const = default;
};

FileState StateOf(const std::string& path) {
  struct stat status {};
  if (stat(path.c_str(), &status) != 0) return {};
  return {status.st_ino, status.st_size, status.st_mtim.tv_sec, status.st_mtim.tv_nsec};
}

std::string TemporaryDirectory() {
  const char* named = secure_getenv("TMPDIR");
  return named != nullptr && named[0] == '/' ? named : "/tmp";
}

// Copies both files. Returns whether they are of one moment.
bool CopyBoth(const std::string& databasePath, const std::string& copy) {
  const std::string journalPath = databasePath + "-journal";
  const std::array before = {StateOf(databasePath), StateOf(journalPath)};
  constexpr auto kReplace = std::filesystem::copy_options::overwrite_existing;
  std::error_code error;
  std::filesystem::copy_file(databasePath, copy, kReplace, error);
  if (error) return false;
  std::filesystem::copy_file(journalPath, copy + "-journal", kReplace, error);
  return !error && before == std::array{StateOf(databasePath), StateOf(journalPath)};
}

}  // namespace

TallyPrivateCopy::TallyPrivateCopy(const std::string& databasePath) {
  std::string pattern = TemporaryDirectory() + "/quorlet-XXXXXX";
  if (mkdtemp(pattern.data()) == nullptr) return;
  directory_ = pattern;
  const std::string copy = directory_ + "/copy";
  // Another process may just be finishing what the killed one left.
  for (int attempt = 0; attempt < kAttempts && path_.empty(); ++attempt) {
    if (CopyBoth(databasePath, copy)) path_ = copy;
  }
}

TallyPrivateCopy::~TallyPrivateCopy() {
  if (directory_.empty()) return;
  std::error_code ignored;
  std::filesystem::remove_all(directory_, ignored);
}

}  // namespace quorlet
