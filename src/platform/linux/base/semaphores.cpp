// Semaphores of the kernel. Their waits are given as a length of time; those of the standard
// library end at a point of its clock, and never end where that clock is shifted (as in a rehearsal
// of the days to come) while the kernel's is not.
#include "platform/linux/base/semaphores.h"

#include <poll.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <cstdint>

#include "platform/linux/base/descriptor.h"

namespace quorlet {
namespace {

class LinuxSemaphore : public Semaphore {
 public:
  void signal() override {
    const std::uint64_t one = 1;
    (void)Uninterrupted([&] { return write(count_.get(), &one, sizeof one); });
  }

  bool wait(std::chrono::nanoseconds limit) override {
    if (!count_.isOpen()) return true;
    const auto start = std::chrono::steady_clock::now();
    while (true) {
      const auto used = std::chrono::steady_clock::now() - start;
      const bool timeRanOut = !waitOnce(std::max(limit - used, std::chrono::nanoseconds(0)));
      // Another thread may have taken the count that was waited for.
      std::uint64_t taken = 0;
      if (Uninterrupted([&] { return read(count_.get(), &taken, sizeof taken); }) > 0) return true;
      if (timeRanOut) return false;
    }
  }

 private:
  // False when there was no count for the whole of `limit`.
  bool waitOnce(std::chrono::nanoseconds limit) const {
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(limit);
    const timespec time = {.tv_sec = static_cast<time_t>(seconds.count()),
                           .tv_nsec = static_cast<long>((limit - seconds).count())};
    pollfd entry = {.fd = count_.get(), .events = POLLIN, .revents = 0};
    return ppoll(&entry, 1, &time, nullptr) != 0;
  }

  const Descriptor count_{eventfd(0, EFD_SEMAPHORE | EFD_CLOEXEC | EFD_NONBLOCK)};
};

class LinuxSemaphores : public Semaphores {
 public:
  std::shared_ptr<Semaphore> create() override { return std::make_shared<LinuxSemaphore>(); }
};

}  // namespace

std::unique_ptr<Semaphores> MakeLinuxSemaphores() { return std::make_unique<LinuxSemaphores>(); }

}  // namespace quorlet
