#ifndef QUORLET_PLATFORM_LINUX_BASE_ACCESS_H_
#define QUORLET_PLATFORM_LINUX_BASE_ACCESS_H_

namespace quorlet {

// With kReadOnly no file below the root changes: preference writes are kept in memory only, the
// counter store refuses writes, and no directory, lock or temporary file is made.
enum class Access { kReadWrite, kReadOnly };

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_BASE_ACCESS_H_
