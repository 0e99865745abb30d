#include "platform/sync_recorder.h"

#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <sys/types.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <set>

namespace quorlet {
namespace {

std::atomic<SyncRecorder*> active = nullptr;

std::string PathOf(int descriptor) {
  std::array<char, 4096> path;
  const std::string link = "/proc/self/fd/" + std::to_string(descriptor);
  const ssize_t length = readlink(link.c_str(), path.data(), path.size());
  return length > 0 ? std::string(path.data(), static_cast<std::size_t>(length)) : std::string();
}

std::string Absolute(int directory, const char* path) {
  if (path == nullptr || *path == '/' || directory == AT_FDCWD) return path != nullptr ? path : "";
  return PathOf(directory) + "/" + path;
}

// The words of a call: what, which, and for a rename whereto.
std::array<std::string, 3> WordsOf(const std::string& call) {
  const std::size_t first = call.find(' ');
  const std::size_t second = call.find(' ', first + 1);
  if (second == std::string::npos) return {call.substr(0, first), call.substr(first + 1), ""};
  return {call.substr(0, first), call.substr(first + 1, second - first - 1),
          call.substr(second + 1)};
}

std::string DirectoryOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  return slash == std::string::npos ? "." : path.substr(0, slash);
}

}  // namespace

SyncRecorder::SyncRecorder(std::string directory) : directory_(std::move(directory)) {
  active = this;
}
SyncRecorder::~SyncRecorder() { active = nullptr; }

std::vector<std::string> SyncRecorder::calls() const {
  const std::lock_guard hold(mutex_);
  return calls_;
}

void SyncRecorder::clear() {
  const std::lock_guard hold(mutex_);
  calls_.clear();
}

std::vector<std::string> SyncRecorder::unsafeRenames() const {
  std::vector<std::string> unsafe;
  std::set<std::string> unsynced;
  std::vector<std::array<std::string, 3>> renames;  // without a sync of their directory so far
  for (const std::string& call : calls()) {
    const auto words = WordsOf(call);
    if (words[0] == "write" || words[0] == "truncate") unsynced.insert(words[1]);
    if (words[0] == "fsync") {
      unsynced.erase(words[1]);
      std::erase_if(renames, [&](const auto& it) { return DirectoryOf(it[2]) == words[1]; });
    }
    if (words[0] != "rename") continue;
    if (unsynced.erase(words[1]) != 0) unsafe.push_back(call);
    if (words[2][words[2].rfind('/') + 1] != '.') renames.push_back(words);
  }
  for (const auto& words : renames) unsafe.push_back(words[0] + " " + words[1] + " " + words[2]);
  return unsafe;
}

void SyncRecorder::fail(std::string_view start, int nth, int error) {
  const std::lock_guard hold(mutex_);
  failing_ = start;
  countdown_ = nth;
  error_ = error;
  hasFailed_ = isStopping_ = false;
}

void SyncRecorder::stopAt(int nth) {
  fail("", nth, EIO);
  const std::lock_guard hold(mutex_);
  isStopping_ = true;
}

bool SyncRecorder::hasFailed() const {
  const std::lock_guard hold(mutex_);
  return hasFailed_;
}

std::string SyncRecorder::relative(const std::string& path) const {
  if (path == directory_) return ".";
  if (!path.starts_with(directory_) || path[directory_.size()] != '/') return "";
  return path.substr(directory_.size() + 1);
}

int SyncRecorder::note(std::string call) {
  const std::lock_guard hold(mutex_);
  const bool fails = (countdown_ > 0 && call.starts_with(failing_) && --countdown_ == 0) ||
                     (isStopping_ && hasFailed_);
  hasFailed_ |= fails;
  if (!call.starts_with("write ") || calls_.empty() || calls_.back() != call) {
    calls_.push_back(std::move(call));
  }
  return fails ? error_ : 0;
}

int SyncRecorder::onDescriptor(std::string_view call, int descriptor) {
  SyncRecorder* recorder = active;
  if (recorder == nullptr) return 0;
  const int before = errno;
  const std::string path = recorder->relative(PathOf(descriptor));
  const int error = path.empty() ? 0 : recorder->note(std::string(call) + " " + path);
  errno = before;
  return error;
}

int SyncRecorder::onPaths(std::string_view call, int directory, const char* path,
                          int otherDirectory, const char* other) {
  SyncRecorder* recorder = active;
  if (recorder == nullptr) return 0;
  const int before = errno;
  std::string text = recorder->relative(Absolute(directory, path));
  const std::string to = recorder->relative(Absolute(otherDirectory, other));
  int error = 0;
  if (!text.empty()) {
    text.insert(0, std::string(call) + " ");
    error = recorder->note(to.empty() ? text : text + " " + to);
  }
  errno = before;
  return error;
}

namespace {

// Calls the function that this program has replaced, unless it is to fail.
template <typename Result, typename... Arguments>
Result Forward(int error, const char* name, Arguments... arguments) {
  if (error != 0) {
    errno = error;
    return -1;
  }
  using Function = Result (*)(Arguments...);
  const auto next = reinterpret_cast<Function>(dlsym(RTLD_NEXT, name));
  return next(arguments...);
}

}  // namespace
}  // namespace quorlet

// NOLINTBEGIN: the C library's own declarations.
using quorlet::Forward;
using quorlet::SyncRecorder;

extern "C" {

int fsync(int file) {
  return Forward<int>(SyncRecorder::onDescriptor("fsync", file), "fsync", file);
}
int fdatasync(int file) {
  return Forward<int>(SyncRecorder::onDescriptor("fsync", file), "fdatasync", file);
}
int ftruncate(int file, off_t size) noexcept {
  return Forward<int>(SyncRecorder::onDescriptor("truncate", file), "ftruncate", file, size);
}
int ftruncate64(int file, off64_t size) noexcept {
  return Forward<int>(SyncRecorder::onDescriptor("truncate", file), "ftruncate64", file, size);
}
ssize_t write(int file, const void* bytes, size_t size) {
  return Forward<ssize_t>(SyncRecorder::onDescriptor("write", file), "write", file, bytes, size);
}
ssize_t pwrite(int file, const void* bytes, size_t size, off_t at) {
  return Forward<ssize_t>(SyncRecorder::onDescriptor("write", file), "pwrite", file, bytes, size,
                          at);
}
ssize_t pwrite64(int file, const void* bytes, size_t size, off64_t at) {
  return Forward<ssize_t>(SyncRecorder::onDescriptor("write", file), "pwrite64", file, bytes, size,
                          at);
}
int rename(const char* from, const char* to) noexcept {
  return Forward<int>(SyncRecorder::onPaths("rename", AT_FDCWD, from, AT_FDCWD, to), "rename", from,
                      to);
}
int renameat(int fromDirectory, const char* from, int toDirectory, const char* to) noexcept {
  return Forward<int>(SyncRecorder::onPaths("rename", fromDirectory, from, toDirectory, to),
                      "renameat", fromDirectory, from, toDirectory, to);
}
int link(const char* from, const char* to) noexcept {
  return Forward<int>(SyncRecorder::onPaths("link", AT_FDCWD, from, AT_FDCWD, to), "link", from,
                      to);
}
int unlink(const char* path) noexcept {
  return Forward<int>(SyncRecorder::onPaths("unlink", AT_FDCWD, path), "unlink", path);
}
DIR* opendir(const char* path) {
  if (const int error = SyncRecorder::onPaths("list", AT_FDCWD, path)) {
    errno = error;
    return nullptr;
  }
  return reinterpret_cast<DIR* (*)(const char*)>(dlsym(RTLD_NEXT, "opendir"))(path);
}
int unlinkat(int directory, const char* path, int flags) noexcept {
  return Forward<int>(SyncRecorder::onPaths("unlink", directory, path), "unlinkat", directory, path,
                      flags);
}

}  // extern "C"
// NOLINTEND
