// Reading what the kernel publishes as text below /proc and /sys.
//
// Nothing read here is trusted: files are capped, numbers are whole decimal numbers or nothing, and
// names become short printable ASCII.
#ifndef QUORLET_PLATFORM_LINUX_BASE_KERNEL_TEXT_H_
#define QUORLET_PLATFORM_LINUX_BASE_KERNEL_TEXT_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/linux/base/logging_root.h"

namespace quorlet {

// An attribute of sysfs announces the size of a page, whatever it holds.
inline constexpr std::size_t kMaxAttributeBytes = 65536;

// The file's text without the blanks around it, or nothing when it cannot be read.
std::optional<std::string> ReadKernelText(const std::string& path,
                                          std::size_t limit = kMaxAttributeBytes);

// `text` when it is nothing but a decimal number that fits a signed 64-bit value.
std::optional<std::uint64_t> ParseCounter(std::string_view text);
std::optional<std::uint64_t> ReadCounter(const std::string& path);
std::optional<std::int64_t> ReadInteger(const std::string& path);

// The words between blanks; `rest` loses the line that it gives.
std::vector<std::string_view> Words(std::string_view line);
std::string_view TakeLine(std::string_view& rest);

// The number behind `prefix` when `name` is nothing else, without leading zeros.
std::optional<std::uint64_t> NumberBehind(std::string_view prefix, std::string_view name);
// The names of a directory that are `prefix` and a number, by number: state2 before state10.
std::vector<std::pair<std::uint64_t, std::string>> NumberedNames(const LoggingRoot& root,
                                                                 const std::string& directory,
                                                                 std::string_view prefix);

// At most 64 characters of printable ASCII; what is not becomes "?", a run of blanks one blank.
std::string CleanName(std::string_view text);

// Where a symbolic link points; empty when `path` is none.
std::string LinkTarget(const std::string& path);

// What tells where a device of sysfs is plugged in, from the path that /sys/block/* or
// /sys/class/*/* links to: its last PCI address and what follows, or its place on the platform,
// without the numbers that count devices as they were found. Empty for a device that is nowhere.
//   ../devices/pci0000:00/0000:00:17.0/ata2/host1/target1:0:0/1:0:0:0/block/sda
//     -> 0000:00:17.0/ata2/0:0:0
std::string DevicePlace(std::string_view linkTarget);

// An ID that is the same whenever the text is the same; never negative.
std::uint64_t HashedID(std::string_view text);
// The first eight characters of `text`, the first one in the most significant byte.
constexpr std::uint64_t PackedID(std::string_view text) {
  std::uint64_t id = 0;
  for (std::size_t i = 0; i < 8; ++i) {
    id = (id << 8) | (i < text.size() ? static_cast<unsigned char>(text[i]) : 0u);
  }
  return id;
}

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_BASE_KERNEL_TEXT_H_
