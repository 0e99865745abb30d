// The lock that a daily pass holds, so that passes of several processes never overlap.
#ifndef QUORLET_PLATFORM_PASS_LOCK_H_
#define QUORLET_PLATFORM_PASS_LOCK_H_

namespace quorlet {

// Meant for std::lock_guard. The lock is not recursive.
class PassLock {
 public:
  virtual ~PassLock() = default;

  // Waits for the lock. When it cannot be had at all, one error line says so and the pass goes on
  // without it.
  virtual void lock() = 0;
  virtual void unlock() = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_PASS_LOCK_H_
