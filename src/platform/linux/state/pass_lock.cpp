#include <optional>

#include "platform/linux/state/services.h"

namespace quorlet {
namespace {

constexpr char kLockPath[] = "/run/quorlet/pass.lock";

class LinuxPassLock : public PassLock {
 public:
  LinuxPassLock(const Root& root, SystemLog& log) : path_(root.path(kLockPath)), log_(log) {}

  bool lock() override {
    lock_.emplace(path_);
    if (lock_->error() == 0) return true;
    log_.error("Cannot lock %@: %@", path_, ErrnoText(lock_->error()));
    lock_.reset();
    return false;
  }
  void unlock() override { lock_.reset(); }

 private:
  const std::string path_;
  SystemLog& log_;
  std::optional<FileLock> lock_;
};

class NoPassLock : public PassLock {
 public:
  bool lock() override { return true; }
  void unlock() override {}
};

}  // namespace

std::unique_ptr<PassLock> MakeLinuxPassLock(const Root& root, Access access, SystemLog& log) {
  if (access == Access::kReadOnly) return std::make_unique<NoPassLock>();
  return std::make_unique<LinuxPassLock>(root, log);
}

}  // namespace quorlet
