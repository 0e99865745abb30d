// Files, containers, the user mode and the tick clock.
#ifndef QUORLET_PLATFORM_ENVIRONMENT_H_
#define QUORLET_PLATFORM_ENVIRONMENT_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace quorlet {

struct FileStatus {
  std::uint64_t size = 0;  // bytes
};

// Paths are absolute paths of the system.
class Environment {
 public:
  virtual ~Environment() = default;

  // What is at `path`, whatever its type, or nothing when it cannot be examined.
  virtual std::optional<FileStatus> stat(std::string_view path) = 0;

  // All bytes of a regular file of at most `limit` bytes; nothing when it is missing, unreadable,
  // not a regular file or larger.
  virtual std::optional<std::string> readFile(std::string_view path, std::size_t limit) = 0;

  // The path of a system group's container; on failure nothing, and `error` is the error code.
  virtual std::optional<std::string> SystemGroupContainerPath(std::string_view identifier,
                                                              std::uint64_t& error) = 0;

  // Writes the user mode (non-zero: multi-user). False, with `mode` untouched, when it fails.
  virtual bool CheckMultiUserMode(std::int32_t& mode) = 0;

  // Ticks since boot, monotonic.
  virtual std::uint64_t TickClockNow() = 0;

  // ticks * numerator / denominator = nanoseconds. Returns 0, or a non-zero status on failure.
  virtual int TickTimebase(std::uint32_t& numerator, std::uint32_t& denominator) = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_ENVIRONMENT_H_
