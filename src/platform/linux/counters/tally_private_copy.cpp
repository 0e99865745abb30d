#include "platform/linux/counters/tally_private_copy.h"

#include <stdlib.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <system_error>

namespace quorlet {
namespace {

constexpr int kAttempts = 5;
constexpr std::array kCopied = {"", "-journal", "-wal"};
// Where the write-ahead log says which run of it this is.
constexpr std::size_t kLogHeader = 32;

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

std::string LogHeader(const std::string& path) {
  char bytes[kLogHeader] = {};
  std::ifstream(path + "-wal", std::ios::binary).read(bytes, kLogHeader);
  return {bytes, kLogHeader};
}

// What must stay while the files are copied for the copies to be of one moment. The log may grow:
// what a commit appends while it is read is whole, or left out.
struct Moment {
  explicit Moment(const std::string& path)
      : database(StateOf(path)), journal(StateOf(path + "-journal")), log(LogHeader(path)) {}
  bool operator==(const Moment&) const = default;
  FileState database, journal;
  std::string log;
};

std::string TemporaryDirectory() {
  const char* named = secure_getenv("TMPDIR");
  return named != nullptr && named[0] == '/' ? named : "/tmp";
}

// Copies the files; says what went wrong, or nothing.
std::string CopyFiles(const std::string& databasePath, const std::string& copy) {
  const Moment before(databasePath);
  for (const char* suffix : kCopied) {
    std::error_code error;
    std::filesystem::remove(copy + suffix, error);
    std::filesystem::copy_file(databasePath + suffix, copy + suffix, error);
    const bool isOptional = *suffix != '\0';
    if (error && !(isOptional && error == std::errc::no_such_file_or_directory)) {
      return error.message();
    }
  }
  return before == Moment(databasePath) ? "" : "other processes keep changing it";
}

}  // namespace

TallyPrivateCopy::TallyPrivateCopy(const std::string& databasePath) {
  std::string pattern = TemporaryDirectory() + "/quorlet-XXXXXX";
  if (mkdtemp(pattern.data()) == nullptr) {
    error_ = pattern + ": " + std::generic_category().message(errno);
    return;
  }
  directory_ = pattern;
  const std::string copy = directory_ + "/copy";
  // Another process may just be copying its log back.
  for (int attempt = 0; attempt < kAttempts; ++attempt) {
    error_ = CopyFiles(databasePath, copy);
    if (!error_.empty()) continue;
    path_ = copy;
    return;
  }
}

TallyPrivateCopy::~TallyPrivateCopy() {
  if (directory_.empty()) return;
  std::error_code ignored;
  std::filesystem::remove_all(directory_, ignored);
}

}  // namespace quorlet
