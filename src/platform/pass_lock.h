// The lock that a daily pass holds, so that passes of several processes never overlap.
#ifndef QUORLET_PLATFORM_PASS_LOCK_H_
#define QUORLET_PLATFORM_PASS_LOCK_H_

namespace quorlet {

// Not recursive.
class PassLock {
 public:
  virtual ~PassLock() = default;

  // Waits for the lock. False, after one error line, when it cannot be had at all.
  [[nodiscard]] virtual bool lock() = 0;
  virtual void unlock() = 0;
};

// Holds the lock, if it could be had, while it lives.
class PassHold {
 public:
  explicit PassHold(PassLock& lock) : lock_(lock), isHeld_(lock.lock()) {}
  PassHold(const PassHold&) = delete;
  PassHold& operator=(const PassHold&) = delete;
  ~PassHold() {
    if (isHeld_) lock_.unlock();
  }
  bool isHeld() const { return isHeld_; }

 private:
  PassLock& lock_;
  const bool isHeld_;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_PASS_LOCK_H_
