// Who holds a lock on a file.
#ifndef QUORLET_PLATFORM_LINUX_COUNTERS_LOCK_HOLDER_H_
#define QUORLET_PLATFORM_LINUX_COUNTERS_LOCK_HOLDER_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace quorlet {

// The process that holds the write lock on a byte of the file at `path`, as the kernel lists it;
// nothing when there is none, or none that may be known. The file is not opened: closing it again
// would take this process's own locks on it along.
std::optional<int> LockHolder(const std::string& path, std::uint64_t byte);

// The same in the text of /proc/locks, for a file as it is named there ("08:01:1234").
std::optional<int> LockHolderIn(std::string_view locks, std::string_view file, std::uint64_t byte);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_COUNTERS_LOCK_HOLDER_H_
