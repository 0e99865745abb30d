// Reporting channels as drivers and the hub pass them on: the binary layouts that publishers, the
// hub and readers share. All numbers are little-endian.
#ifndef QUORLET_PLATFORM_REPORT_RECORDS_H_
#define QUORLET_PLATFORM_REPORT_RECORDS_H_

#include <cstddef>
#include <cstdint>

namespace quorlet {

// A raw element record: u64 driver ID, channel ID, type word, time stamp of the last update, and
// four values.
inline constexpr std::size_t kRawElementSize = 64;
inline constexpr std::size_t kRawElementChannelOffset = 8;
inline constexpr std::size_t kRawElementTypeOffset = 16;
inline constexpr std::size_t kRawElementTimeOffset = 24;
inline constexpr std::size_t kRawElementValuesOffset = 32;
inline constexpr std::size_t kRawElementValues = 4;

// The type word, from its lowest byte on: format (1 byte), a byte that is not read, categories (2),
// element count (2).
enum class ReportFormat : std::uint8_t { kSimple = 1, kState = 2, kHistogram = 3, kArray = 4 };
inline constexpr std::uint64_t kDailyCategory = 0x100;  // belongs into the daily record
inline constexpr std::size_t kMaxElementCount = 0xFFFF;

constexpr std::uint64_t makeType(ReportFormat format, std::uint64_t categories,
                                 std::uint64_t elementCount) {
  return static_cast<std::uint64_t>(format) | (categories & 0xFFFF) << 16 |
         (elementCount & 0xFFFF) << 32;
}
constexpr std::uint8_t formatOfType(std::uint64_t type) { return type & 0xFF; }
constexpr std::uint16_t categoriesOfType(std::uint64_t type) { return (type >> 16) & 0xFFFF; }
constexpr std::uint16_t elementCountOfType(std::uint64_t type) { return (type >> 32) & 0xFFFF; }

// What is asked of the hub: an interest list is u32 count, 4 bytes of 0, and for each channel u64
// driver ID, channel ID and type word.
enum DrvReportMethod : std::uint32_t {
  kDrvReportUserClientOpen = 0,
  kDrvReportUserClientConfigureInterests = 2,
  kDrvReportUserClientUpdateKernelBuffer = 3
};
inline constexpr std::size_t kInterestListHeaderBytes = 8;
inline constexpr std::size_t kInterestBytes = 24;

// Unit codes.
inline constexpr std::uint64_t kNanoseconds = 0x0100'0076'0000'0000;
inline constexpr std::uint64_t kMicroseconds = 0x0100'0079'0000'0000;
inline constexpr std::uint64_t kMilliseconds = 0x0100'007C'0000'0000;
inline constexpr std::uint64_t kMicrojoules = 0x0300'0079'0000'0000;
inline constexpr std::uint64_t kBytes = 0x0900'8200'0000'0000;
inline constexpr std::uint64_t kMillidegrees = 0x0A00'007C'0000'0000;
inline constexpr std::uint64_t kEvents = 0x6400'0000'0000'0000;

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_REPORT_RECORDS_H_
