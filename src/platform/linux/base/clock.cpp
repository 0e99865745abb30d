#include <time.h>

#include "platform/linux/base/services.h"

namespace quorlet {
namespace {

class LinuxClock : public Clock {
 public:
  Date now() override {
    timespec time = {};
    clock_gettime(CLOCK_REALTIME, &time);
    return {static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9};
  }
};

}  // namespace

std::unique_ptr<Clock> MakeLinuxClock() { return std::make_unique<LinuxClock>(); }

}  // namespace quorlet
