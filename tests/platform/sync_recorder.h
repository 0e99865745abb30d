// Records the calls that make files durable or change their names, and those that list directories,
// and fails the one that a test
// wants to fail. The program that is linked with it calls it instead of the C library, libraries
// included.
#ifndef QUORLET_TESTS_PLATFORM_SYNC_RECORDER_H_
#define QUORLET_TESTS_PLATFORM_SYNC_RECORDER_H_

#include <mutex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace quorlet {

// While it lives, calls on what lies below a directory are recorded, from all threads. One at a
// time.
class SyncRecorder {
 public:
  explicit SyncRecorder(std::string directory);
  SyncRecorder(const SyncRecorder&) = delete;
  SyncRecorder& operator=(const SyncRecorder&) = delete;
  ~SyncRecorder();

  // What was called, in order, failed calls included, as "fsync a", "rename a b" and the like:
  // fsync (fdatasync too), write (pwrite too; calls in a row count as one), truncate, rename, link,
  // unlink and list (opendir). Paths are relative to the directory, which itself is ".".
  std::vector<std::string> calls() const;
  void clear();

  // Each file that got its name by a rename before its bytes were synced; each rename that no sync
  // of its directory followed, but one of a hidden name, which nothing relies on.
  std::vector<std::string> unsafeRenames() const;

  // Makes the `nth` call from now on (1 is the next) whose text, as calls() has it, begins with
  // `start` fail with `error`.
  void fail(std::string_view start, int nth, int error);
  // Makes the `nth` call and every later one fail: as if the process had been killed before it.
  void stopAt(int nth);
  // Whether a call has failed for either.
  bool hasFailed() const;

  // For the replaced functions: notes the call; the errno it is to fail with, or 0.
  static int onDescriptor(std::string_view call, int descriptor);
  static int onPaths(std::string_view call, int directory, const char* path, int otherDirectory = 0,
                     const char* other = nullptr);

 private:
  // `path` relative to the directory; empty for what lies elsewhere.
  std::string relative(const std::string& path) const;
  int note(std::string call);

  const std::string directory_;
  mutable std::mutex mutex_;
  std::vector<std::string> calls_;
  std::string failing_;
  int countdown_ = 0;
  int error_ = 0;
  bool isStopping_ = false;
  bool hasFailed_ = false;
};

}  // namespace quorlet

#endif  // QUORLET_TESTS_PLATFORM_SYNC_RECORDER_H_
