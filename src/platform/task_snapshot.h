// The kernel's snapshot of all tasks and threads.
#ifndef QUORLET_PLATFORM_TASK_SNAPSHOT_H_
#define QUORLET_PLATFORM_TASK_SNAPSHOT_H_

#include <cstdint>
#include <optional>

#include "drvreport/property_value.h"

namespace quorlet {

// Asks for the buffer as a sequence of tagged items.
inline constexpr std::uint32_t kTaskSnapshotTaggedItems = 0x10000;

class TaskSnapshot {
 public:
  virtual ~TaskSnapshot() = default;

  // The snapshot's buffer, at most 64 MiB, or nothing when it cannot be taken.
  virtual std::optional<Data> CaptureTaskSnapshot(std::uint32_t flags) = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_TASK_SNAPSHOT_H_
