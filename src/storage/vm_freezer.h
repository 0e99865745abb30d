// How much the kernel's memory freezer has written to flash, out of a snapshot of all tasks.
#ifndef QUORLET_STORAGE_VM_FREEZER_H_
#define QUORLET_STORAGE_VM_FREEZER_H_

#include <cstddef>
#include <optional>
#include <span>
#include <string_view>

#include "drvreport/property_value.h"
#include "platform/standard_error.h"
#include "platform/task_snapshot.h"

namespace quorlet {

// A new dictionary: "nuvex.NANDInfo.VMFreezer.NumPhysicalWrites" is the number of bytes that the
// thread "VM_swapout" has written, 0 when the kernel has no statistics of it. When the snapshot
// cannot be taken or lacks the thread, the two error keys of the freezer instead.
Dictionary CopyVMFreezerNANDInfo(TaskSnapshot& taskSnapshot, StandardError& errors);

// The payload of an I/O statistics item, in the snapshot's buffer.
using IOStats = std::span<const std::byte>;

// Searches the tagged items for a container that holds a thread of that name. When there is one,
// `ioStats` becomes the I/O statistics in the same container, or nothing.
bool getIOStatsWithThreadnameFromSnapItems(std::span<const std::byte> items,
                                           std::string_view threadName,
                                           std::optional<IOStats>& ioStats);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_VM_FREEZER_H_
