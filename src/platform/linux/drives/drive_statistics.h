// The statistics export of a drive, built from what the drive and the kernel say about it.
//
// The export is a sequence of records of little-endian 64-bit words: one with the key ID in its low
// and the number of values in its high 32 bits, then the values.
#ifndef QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_STATISTICS_H_
#define QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_STATISTICS_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

#include "drvreport/property_value.h"
#include "platform/drives.h"

namespace quorlet {

// What /sys/block/*/stat counts since the drive was found, of all namespaces together.
struct BlockCounters {
  std::uint64_t discards = 0;
  std::uint64_t discardedSectors = 0;  // of 512 bytes
  std::uint64_t discardMilliseconds = 0;
  std::uint64_t flushes = 0;
  std::uint64_t flushMilliseconds = 0;
};

// Adds one namespace's line. False for a line that is not one (the counters stay as they are), as
// that of a kernel before 5.5, which does not count flushes.
[[nodiscard]] bool AddBlockCounters(std::string_view line, BlockCounters& counters);

// What is known of a drive; what is not known is left out of the export.
struct DriveFacts {
  std::span<const std::byte> healthPage;   // of NVMe: SMART / Health log page
  DriveFigures figures;                    // those of the datacenter page are used
  std::optional<BlockCounters> counters;   // nothing when one of its namespaces has none
  std::optional<std::uint64_t> usedBytes;  // of all namespaces
};

// The export. A health page that is not kNvmePageBytes long is none.
Data EncodeDriveStatistics(const DriveFacts& facts);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_STATISTICS_H_
