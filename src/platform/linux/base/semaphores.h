#ifndef QUORLET_PLATFORM_LINUX_BASE_SEMAPHORES_H_
#define QUORLET_PLATFORM_LINUX_BASE_SEMAPHORES_H_

#include <memory>

#include "platform/semaphores.h"

namespace quorlet {

// A semaphore that cannot be made, for want of descriptors, never makes anybody wait: each wait()
// succeeds at once.
std::unique_ptr<Semaphores> MakeLinuxSemaphores();

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_BASE_SEMAPHORES_H_
