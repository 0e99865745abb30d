// How a storage driver is asked for its exports: what drivers and their readers agree on.
#ifndef QUORLET_PLATFORM_STORAGE_EXPORTS_H_
#define QUORLET_PLATFORM_STORAGE_EXPORTS_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

#include "values/byte_reader.h"
#include "values/byte_writer.h"

namespace quorlet {

// A class of drivers that have exports.
struct StorageClass {
  std::string_view name;
  std::string_view characteristicsKey;  // the registry property of the device characteristics
  std::uint32_t exportMethod = 0;       // gives the size of an export, and the export
};
inline constexpr StorageClass kFlashStorageClass{"FSPStorage", "Device Characteristics", 8};
inline constexpr StorageClass kNvmeStorageClass{"NuvexEmbeddedNVMeController",
                                                "Controller Characteristics", 9};

inline constexpr std::uint32_t kBandStatisticsSelector = 11;
inline constexpr std::uint32_t kStatisticsSelector = 13;
inline constexpr std::uint32_t kDefectsListSelector = 15;
inline constexpr std::uint32_t kTelemetryListSelector = 17;
inline constexpr std::uint32_t kSnapshotSelector = 22;
inline constexpr std::uint32_t kTaskSchedulerSelector = 39;
inline constexpr std::uint32_t kSnapshotHeaderSelector = 145;

// The flags of a request. The size query is one with bit 0.
inline constexpr std::uint16_t kSizeOnlyFlag = 1;
constexpr std::uint16_t ExportFlags(bool requestFlag, std::uint8_t listIndex) {
  return static_cast<std::uint16_t>((requestFlag ? 2U : 0U) | (unsigned{listIndex} << 2));
}
constexpr std::uint8_t ListIndexOf(std::uint16_t flags) {
  return static_cast<std::uint8_t>((flags >> 2) & 0xFF);
}

// The input block of the export methods: selector u32, flags u16, the rest zero; little-endian.
using ExportRequest = std::array<std::byte, 24>;
constexpr ExportRequest MakeExportRequest(std::uint32_t selector, std::uint16_t flags) {
  ExportRequest request{};
  WriteLittle(selector, std::span(request).first(4));
  WriteLittle(flags, std::span(request).subspan(4, 2));
  return request;
}

struct ExportQuestion {
  std::uint32_t selector = 0;
  std::uint16_t flags = 0;
};
// Nothing for a block of another size.
inline std::optional<ExportQuestion> ReadExportRequest(std::span<const std::byte> request) {
  if (request.size() != sizeof(ExportRequest)) return std::nullopt;
  ByteReader reader(request);
  const auto selector = reader.little<std::uint32_t>();
  return ExportQuestion{selector, reader.little<std::uint16_t>()};
}

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_STORAGE_EXPORTS_H_
