// Files below the platform's root: names, whole-file reads and writes, directories, locks.
//
// Every absolute path of the system lies below the root directory. Errors are errno values, 0 is
// success.
#ifndef QUORLET_PLATFORM_LINUX_BASE_FILES_H_
#define QUORLET_PLATFORM_LINUX_BASE_FILES_H_

#include <cstddef>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/linux/base/descriptor.h"

namespace quorlet {

// The directory that stands for "/" of the system.
class Root {
 public:
  explicit Root(std::string_view directory);
  // QUORLET_ROOT, ignored in a privileged program; "/" when it is unset or empty.
  static Root FromEnvironment();

  // Whether the root is the machine's own "/".
  bool isMachine() const { return prefix_.empty(); }
  // `absolutePath` (starts with "/") below the root.
  std::string path(std::string_view absolutePath) const {
    return prefix_ + std::string(absolutePath);
  }
  // The same for a path in /proc or /sys: below the root when the tree ("/proc" or "/sys") exists
  // there, otherwise the machine's own.
  std::string kernelPath(std::string_view absolutePath) const;

 private:
  std::string prefix_;  // no trailing slash
};

// Whether `name` may become part of a path: 1 to 200 bytes, no leading ".", no "/", no control
// byte.
bool IsSafeName(std::string_view name);

// Creates `directory` and its missing parents with mode 0750; what root creates belongs to the
// owner and group of the directory above.
[[nodiscard]] int MakeDirectories(const std::string& directory);

// All bytes of a regular file of at most `limit` bytes, or the errno (EFBIG when it is larger).
// Never waits on a FIFO or device.
[[nodiscard]] std::variant<std::string, int> ReadWholeFile(const std::string& path,
                                                           std::size_t limit);
// The same for a file in a directory that we write to, where a link is refused with ELOOP: whoever
// else may write there must not choose what is read.
[[nodiscard]] std::variant<std::string, int> ReadOwnFile(const std::string& path,
                                                         std::size_t limit);

// A file that appears under its name complete or not at all: written to a hidden temporary name in
// the same directory (which is created), synced, renamed, and the directory synced. What a writer
// that was killed left behind is reused by the next one of the same `temporaryStem`, so nothing
// half-written piles up; writers of one stem wait for each other.
class AtomicFile {
 public:
  // `temporaryStem` must be a safe name; ".<stem>.tmp" is the temporary name.
  AtomicFile(std::string directory, std::string_view temporaryStem,
             Sharing sharing = Sharing::kOwner);
  AtomicFile(const AtomicFile&) = delete;
  AtomicFile& operator=(const AtomicFile&) = delete;
  // Removes the temporary file unless publish() succeeded.
  ~AtomicFile();

  [[nodiscard]] int open();
  [[nodiscard]] int write(std::string_view bytes);
  // Gives the file its final `name` in the directory, replacing what has it.
  [[nodiscard]] int publish(const std::string& name);

 private:
  std::string directory_;
  std::string temporaryPath_;
  Sharing sharing_;
  int descriptor_ = -1;
};

// AtomicFile in one step: replaces the file at `path` with `bytes`.
[[nodiscard]] int WriteWholeFile(const std::string& path, std::string_view bytes,
                                 Sharing sharing = Sharing::kOwner);

// An exclusive lock on a lock file, which is created (with its directory) and stays; held until
// destruction, released by the kernel when the process dies.
class FileLock {
 public:
  explicit FileLock(const std::string& path, Sharing sharing = Sharing::kOwner);
  FileLock(const FileLock&) = delete;
  FileLock& operator=(const FileLock&) = delete;
  ~FileLock();

  // 0 when the lock is held, otherwise the errno of what failed.
  int error() const { return error_; }

 private:
  int descriptor_ = -1;
  int error_ = 0;
};

// "directory/name"; `name` must have been checked.
std::string JoinPath(const std::string& directory, std::string_view name);

// The names in a directory in byte order, without "." and "..", or the errno; none where there is
// no such directory.
[[nodiscard]] std::variant<std::vector<std::string>, int> ReadDirectory(
    const std::string& directory);

// Moves the file at `path` aside as "<path>.damaged", or as ".damaged.2" to ".damaged.9" where that
// is taken; the oldest of them goes when all are. Writes the new name to `aside`. 0 or the errno.
[[nodiscard]] int MoveAsideAsDamaged(const std::string& path, std::string& aside);

// The text of an errno value.
std::string ErrnoText(int error);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_BASE_FILES_H_
