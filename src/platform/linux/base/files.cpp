#include "platform/linux/base/files.h"

#include <dirent.h>
#include <stdlib.h>
#include <sys/file.h>

#include <algorithm>
#include <memory>
#include <system_error>
#include <tuple>
#include <utility>

#include "platform/linux/base/descriptor.h"

namespace quorlet {
namespace {

constexpr mode_t kDirectoryMode = 0750;
constexpr mode_t kFileMode = 0640;
constexpr std::size_t kReadStep = 65536;

std::string ParentDirectory(const std::string& path) {
  const std::size_t nameEnd = path.find_last_not_of('/');
  if (nameEnd == std::string::npos) return "/";
  const std::size_t slash = path.rfind('/', nameEnd);
  if (slash == std::string::npos) return ".";
  const std::size_t parentEnd = path.find_last_not_of('/', slash);
  return parentEnd == std::string::npos ? "/" : path.substr(0, parentEnd + 1);
}

std::string FileName(const std::string& path) { return path.substr(path.rfind('/') + 1); }

bool IsDirectory(const std::string& path) {
  struct stat status = {};
  return stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

// Whether `path` still names the open file.
bool StillNames(const std::string& path, const struct stat& open) {
  struct stat named = {};
  return lstat(path.c_str(), &named) == 0 && named.st_dev == open.st_dev &&
         named.st_ino == open.st_ino;
}

int OpenLocked(const std::string& path, Descriptor& opened, struct stat& status, Sharing sharing) {
  if (const int error = OpenRegularFile(path, O_RDWR | O_CREAT, opened, status, sharing)) {
    return error;
  }
  return Uninterrupted([&] { return flock(opened.get(), LOCK_EX); }) == 0 ? 0 : errno;
}

// Gives what has just been created at `path` its mode, and what root has created the owner and
// group of the directory around it.
int AdoptNew(const Descriptor& created, const std::string& path, mode_t mode, Sharing sharing) {
  struct stat around = {};
  if (stat(ParentDirectory(path).c_str(), &around) != 0) return errno;
  constexpr mode_t kHandsGroupOn = S_ISGID | S_IWGRP;
  const bool isShared =
      sharing == Sharing::kGroupOfDirectory && (around.st_mode & kHandsGroupOn) == kHandsGroupOn;
  if (fchmod(created.get(), mode | (isShared ? S_IWGRP : 0U)) != 0) return errno;
  if (geteuid() != 0 || (around.st_uid == 0 && around.st_gid == getegid())) return 0;
  // Where root may not give files away, they are still better made than not.
  return fchown(created.get(), around.st_uid, around.st_gid) == 0 || errno == EPERM ? 0 : errno;
}

}  // namespace

void OccupyStandardStreams() {
  for (const int stream : {0, 1, 2}) {
    if (fcntl(stream, F_GETFD) != -1) continue;
    [[maybe_unused]] const int opened = open("/dev/null", stream == 0 ? O_WRONLY : O_RDONLY);
  }
}

int OpenRegularFile(const std::string& path, int flags, Descriptor& opened, struct stat& status,
                    Sharing sharing) {
  const bool writes = (flags & O_ACCMODE) != O_RDONLY;
  // O_NONBLOCK means nothing to a regular file; it keeps a FIFO from stopping the program.
  flags |= O_CLOEXEC | O_NONBLOCK | O_NOCTTY | (writes ? O_NOFOLLOW : 0);
  const auto openWith = [&](int with) {
    return Descriptor(Uninterrupted([&] { return open(path.c_str(), with, kFileMode); }));
  };
  // A file that is there keeps its mode and owner, so creating is a step of its own.
  Descriptor descriptor;
  const bool isNewOnly = (flags & O_EXCL) != 0;
  while (true) {
    if (!isNewOnly) descriptor = openWith(flags & ~O_CREAT);
    if (descriptor.isOpen()) break;
    if (!isNewOnly && (errno != ENOENT || (flags & O_CREAT) == 0)) return errno;
    descriptor = openWith(flags | O_EXCL);
    if (descriptor.isOpen()) {
      if (const int error = AdoptNew(descriptor, path, kFileMode, sharing)) return error;
      break;
    }
    if (isNewOnly || errno != EEXIST) return errno;  // EEXIST: another process was faster
  }
  if (fstat(descriptor.get(), &status) != 0) return errno;
  if (!S_ISREG(status.st_mode)) return S_ISDIR(status.st_mode) ? EISDIR : EINVAL;
  // A second name of some other file, which is not ours to write.
  if (writes && status.st_nlink > 1) return EMLINK;
  opened = std::move(descriptor);
  return 0;
}

int WriteFully(int descriptor, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t written =
        Uninterrupted([&] { return write(descriptor, bytes.data(), bytes.size()); });
    if (written < 0) return errno;
    if (written == 0) return EIO;
    bytes.remove_prefix(static_cast<std::size_t>(written));
  }
  return 0;
}

int SyncDirectory(const std::string& directory) {
  const Descriptor descriptor(
      Uninterrupted([&] { return open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC); }));
  if (!descriptor.isOpen()) return errno;
  if (fsync(descriptor.get()) == 0) return 0;
  return errno == EINVAL ? 0 : errno;  // a file system that has nothing to sync
}

Root::Root(std::string_view directory) {
  const std::size_t end = directory.find_last_not_of('/');
  if (end != std::string_view::npos) prefix_ = directory.substr(0, end + 1);
}

Root Root::FromEnvironment() {
  const char* directory = secure_getenv("QUORLET_ROOT");
  return Root(directory != nullptr ? directory : "");
}

std::string Root::kernelPath(std::string_view absolutePath) const {
  const std::string_view tree = absolutePath.substr(0, absolutePath.find('/', 1));
  return IsDirectory(path(tree)) ? path(absolutePath) : std::string(absolutePath);
}

bool IsSafeName(std::string_view name) {
  return !name.empty() && name.size() <= 200 && name.front() != '.' &&
         std::ranges::none_of(name, [](char c) {
           return c == '/' || static_cast<unsigned char>(c) < 0x20 || c == 0x7f;
         });
}

int MakeDirectories(const std::string& directory) {
  const char* path = directory.c_str();
  if (mkdir(path, kDirectoryMode) != 0) {
    if (errno == EEXIST) return IsDirectory(directory) ? 0 : ENOTDIR;
    if (errno != ENOENT) return errno;
    const std::string parent = ParentDirectory(directory);
    if (parent.size() >= directory.size()) return ENOENT;
    if (const int error = MakeDirectories(parent)) return error;
    // Another process may have been faster.
    if (mkdir(path, kDirectoryMode) != 0) return errno == EEXIST ? 0 : errno;
  }
  const Descriptor created(
      Uninterrupted([&] { return open(path, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC); }));
  if (!created.isOpen()) return errno;
  // The mode is fixed, whatever the process masks.
  if (const int error = AdoptNew(created, directory, kDirectoryMode, Sharing::kOwner)) return error;
  // What is made durable inside must not be lost with its directory; where the parent cannot even
  // be read there is nothing to be done about it.
  (void)SyncDirectory(ParentDirectory(directory));
  return 0;
}

namespace {

std::variant<std::string, int> ReadFile(const std::string& path, std::size_t limit, int flags) {
  limit = std::min(limit, std::string().max_size() / 2);  // so that nothing below wraps
  Descriptor file;
  struct stat status = {};
  if (const int error = OpenRegularFile(path, O_RDONLY | flags, file, status)) return error;
  const auto announced = static_cast<std::size_t>(std::max<off_t>(status.st_size, 0));
  if (announced > limit) return EFBIG;
  // Files in /proc announce no size, and any file may have grown: read on to the end. One byte
  // more than expected tells the end without another buffer.
  std::string bytes;
  std::size_t length = 0;
  std::size_t step = announced == 0 ? kReadStep : announced + 1;
  while (true) {
    if (length > limit) return EFBIG;
    bytes.resize(length + std::min(step, limit + 1 - length));
    const ssize_t count = Uninterrupted(
        [&] { return read(file.get(), bytes.data() + length, bytes.size() - length); });
    if (count < 0) return errno;
    if (count == 0) break;
    length += static_cast<std::size_t>(count);
    step = kReadStep;
  }
  bytes.resize(length);
  return bytes;
}

}  // namespace

std::variant<std::string, int> ReadWholeFile(const std::string& path, std::size_t limit) {
  return ReadFile(path, limit, 0);
}

std::variant<std::string, int> ReadOwnFile(const std::string& path, std::size_t limit) {
  return ReadFile(path, limit, O_NOFOLLOW);
}

AtomicFile::AtomicFile(std::string directory, std::string_view temporaryStem, Sharing sharing)
    : directory_(std::move(directory)), sharing_(sharing) {
  if (IsSafeName(temporaryStem)) {
    temporaryPath_ = directory_ + "/." + std::string(temporaryStem) + ".tmp";
  }
}

AtomicFile::~AtomicFile() {
  if (descriptor_ < 0) return;
  unlink(temporaryPath_.c_str());  // while the lock is held: nobody else's file has this name
  close(descriptor_);
}

int AtomicFile::open() {
  if (temporaryPath_.empty() || descriptor_ >= 0) return EINVAL;
  if (const int error = MakeDirectories(directory_)) return error;
  while (true) {
    Descriptor file;
    struct stat status = {};
    const int error = OpenLocked(temporaryPath_, file, status, sharing_);
    // A name that somebody else has given to one of his files: only the name goes.
    const bool isForeign = error == EMLINK || error == ELOOP;
    if (isForeign && unlink(temporaryPath_.c_str()) == 0) continue;
    if (error != 0) return error;
    // Whoever held the lock before may have published or removed this very file.
    if (!StillNames(temporaryPath_, status)) continue;
    descriptor_ = file.release();
    return Uninterrupted([&] { return ftruncate(descriptor_, 0); }) == 0 ? 0 : errno;
  }
}

int AtomicFile::write(std::string_view bytes) {
  return descriptor_ < 0 ? EBADF : WriteFully(descriptor_, bytes);
}

int AtomicFile::publish(const std::string& name) {
  if (descriptor_ < 0) return EBADF;
  if (Uninterrupted([&] { return fsync(descriptor_); }) != 0) return errno;
  if (rename(temporaryPath_.c_str(), (directory_ + "/" + name).c_str()) != 0) return errno;
  close(std::exchange(descriptor_, -1));
  return SyncDirectory(directory_);
}

int WriteWholeFile(const std::string& path, std::string_view bytes, Sharing sharing) {
  const std::string name = FileName(path);
  AtomicFile file(ParentDirectory(path), name, sharing);
  if (const int error = file.open()) return error;
  if (const int error = file.write(bytes)) return error;
  return file.publish(name);
}

FileLock::FileLock(const std::string& path, Sharing sharing) {
  error_ = MakeDirectories(ParentDirectory(path));
  if (error_ != 0) return;
  Descriptor file;
  struct stat status = {};
  error_ = OpenLocked(path, file, status, sharing);
  if (error_ == 0) descriptor_ = file.release();
}

FileLock::~FileLock() {
  if (descriptor_ >= 0) close(descriptor_);
}

std::string JoinPath(const std::string& directory, std::string_view name) {
  std::string path;
  path.reserve(directory.size() + 1 + name.size());
  return path.append(directory).append("/").append(name);
}

std::variant<std::vector<std::string>, int> ReadDirectory(const std::string& directory) {
  std::vector<std::string> names;
  const std::unique_ptr<DIR, int (*)(DIR*)> stream(opendir(directory.c_str()), &closedir);
  if (stream == nullptr && errno == ENOENT) return names;
  if (stream == nullptr) return errno;
  errno = 0;
  while (const dirent* entry = readdir(stream.get())) {
    const std::string_view name = entry->d_name;
    if (name != "." && name != "..") names.emplace_back(name);
    errno = 0;
  }
  if (errno != 0) return errno;
  std::ranges::sort(names);
  return names;
}

int MoveAsideAsDamaged(const std::string& path, std::string& aside) {
  constexpr int kMostKept = 9;
  timespec oldest{};
  for (int number = 1; number <= kMostKept; ++number) {
    std::string name = path + ".damaged";
    if (number > 1) name += "." + std::to_string(number);
    struct stat status = {};
    if (lstat(name.c_str(), &status) != 0) {
      if (errno != ENOENT) return errno;
      aside = std::move(name);
      break;
    }
    const timespec& time = status.st_ctim;
    const bool isOlder =
        std::tie(time.tv_sec, time.tv_nsec) < std::tie(oldest.tv_sec, oldest.tv_nsec);
    if (number == 1 || isOlder) {
      oldest = time;
      aside = std::move(name);
    }
  }
  return rename(path.c_str(), aside.c_str()) == 0 ? 0 : errno;
}

std::string ErrnoText(int error) { return std::generic_category().message(error); }

}  // namespace quorlet
