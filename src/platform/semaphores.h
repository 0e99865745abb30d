// Counting semaphores with a timed wait.
#ifndef QUORLET_PLATFORM_SEMAPHORES_H_
#define QUORLET_PLATFORM_SEMAPHORES_H_

#include <chrono>
#include <memory>

namespace quorlet {

// Shared by the threads that wait and signal; lives as long as any of them holds it.
class Semaphore {
 public:
  virtual ~Semaphore() = default;
  virtual void signal() = 0;
  // Takes one count, waiting for it for at most `limit`. False when the time ran out.
  virtual bool wait(std::chrono::nanoseconds limit) = 0;
};

class Semaphores {
 public:
  virtual ~Semaphores() = default;
  // A new semaphore with count 0.
  virtual std::shared_ptr<Semaphore> create() = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_SEMAPHORES_H_
