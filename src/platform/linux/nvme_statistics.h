// The statistics export of an NVMe drive, built from what the drive and the kernel say about it.
//
// The export is a sequence of records of little-endian 64-bit words: one with the key ID in its low
// and the number of values in its high 32 bits, then the values.
#ifndef QUORLET_PLATFORM_LINUX_NVME_STATISTICS_H_
#define QUORLET_PLATFORM_LINUX_NVME_STATISTICS_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

#include "values/property_value.h"

namespace quorlet {

inline constexpr std::size_t kNvmeHealthPageBytes = 512;

// What /sys/block/*/stat counts since the drive was found, of all namespaces together.
struct NvmeBlockCounters {
  std::uint64_t discards = 0;
  std::uint64_t discardedSectors = 0;  // of 512 bytes
  std::uint64_t discardMilliseconds = 0;
  std::uint64_t flushes = 0;
  std::uint64_t flushMilliseconds = 0;
};

// Adds one namespace's line. False for a line that is not one (the counters stay as they are), as
// that of a kernel before 5.5, which does not count flushes.
[[nodiscard]] bool AddBlockCounters(std::string_view line, NvmeBlockCounters& counters);

// What is known of a drive; what is not known is left out of the export.
struct NvmeFacts {
  std::span<const std::byte> healthPage;      // SMART / Health log page
  std::optional<NvmeBlockCounters> counters;  // nothing when one of its namespaces has none
  std::optional<std::uint64_t> usedBytes;     // of all namespaces
};

// The export, or nothing when the health page is not kNvmeHealthPageBytes long.
std::optional<Data> EncodeNvmeStatistics(const NvmeFacts& facts);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_NVME_STATISTICS_H_
