#include "platform/linux/drives/drive_figures.h"

#include <algorithm>
#include <array>
#include <limits>

#include "platform/linux/drives/nvme_pages.h"
#include "values/byte_reader.h"
#include "values/digits.h"

namespace quorlet {
namespace {

using enum DriveFigure;

constexpr std::uint64_t kDataUnitBytes = 512'000;
constexpr std::uint64_t kLargest = std::numeric_limits<std::int64_t>::max();

// Where a figure lies, and what makes its unit of the page's.
struct Field {
  std::size_t offset;
  std::size_t width;
  DriveFigure figure;
  std::uint64_t factor = 1;
};
// clang-format off
constexpr auto kHealthFields = std::to_array<Field>({
    {0,    1, kWarnings},
    {3,    1, kSpare},
    {4,    1, kSpareThreshold},
    {5,    1, kUsed},
    {32,  16, kBytesRead, kDataUnitBytes},
    {48,  16, kBytesWritten, kDataUnitBytes},
    {64,  16, kReads},
    {80,  16, kWrites},
    {96,  16, kBusy, 60},
    {112, 16, kPowerCycles},
    {128, 16, kPowerOn, 3600},
    {144, 16, kUnsafeShutdowns},
    {160, 16, kMediaErrors},
    {176, 16, kErrorLog},
    {192,  4, kWarm, 60},
    {196,  4, kCritical, 60},
    {216,  4, kThrottled1},
    {220,  4, kThrottled2},
    {224,  4, kThrottledTime1},
    {228,  4, kThrottledTime2},
});
constexpr auto kDatacenterFields = std::to_array<Field>({
    {0,   16, kMediaBytesWritten},
    {16,  16, kMediaBytesRead},
    {32,   6, kBadBlocks},
    {40,   6, kBadSystemBlocks},
    {56,   8, kUncorrectableReads},
    {64,   8, kCorrectedReads},
    {88,   4, kErasesMax},
    {92,   4, kErasesMin},
    {112,  4, kIncompleteShutdowns},
    {120,  1, kFreeBlocks},
    {128,  2, kCapacitor},
});
// clang-format on
constexpr bool LieInPage(std::span<const Field> fields) {
  return std::ranges::all_of(fields, [](const Field& field) {
    return field.offset <= kNvmePageBytes && field.width <= kNvmePageBytes - field.offset;
  });
}
static_assert(LieInPage(kHealthFields) && LieInPage(kDatacenterFields));

// At the end of a datacenter page.
constexpr std::array<std::uint8_t, 16> kDatacenterIdentifier = {
    0xC5, 0xAF, 0x10, 0x28, 0xEA, 0xBF, 0xF2, 0xA4, 0x9C, 0x4F, 0x6F, 0x7C, 0xC9, 0x14, 0xD5, 0xAF};

struct FieldValue {
  std::uint64_t value = 0;  // saturated
  bool isAllOnes = true;
};

FieldValue ReadField(std::span<const std::byte> page, const Field& field) {
  FieldValue read;
  const auto bytes = page.subspan(field.offset, field.width);
  for (std::size_t i = bytes.size(); i-- > 0;) {
    const auto byte = std::to_integer<std::uint64_t>(bytes[i]);
    read.isAllOnes = read.isAllOnes && byte == 0xFF;
    read.value = read.value > kLargest >> 8 ? kLargest : read.value << 8 | byte;
  }
  std::uint64_t product = 0;
  read.value = __builtin_mul_overflow(read.value, field.factor, &product)
                   ? kLargest
                   : std::min(product, kLargest);
  return read;
}

}  // namespace

void AddNvmeHealth(std::span<const std::byte> page, DriveFigures& figures) {
  if (page.size() != kNvmePageBytes) return;
  for (const Field& field : kHealthFields) {
    const auto [value, isAllOnes] = ReadField(page, field);
    // 0 also stands for an amount of data that the drive does not report.
    if (value != 0 || field.factor != kDataUnitBytes) figures.set(field.figure, value);
  }
  ByteReader reader(page);
  reader.skip(1);
  const std::int64_t kelvin = reader.little<std::uint16_t>();
  // Below freezing there is no figure, as none is negative.
  if (kelvin >= 273) {
    figures.set(kTemperature, static_cast<std::uint64_t>((kelvin - 273) * 1000));
  }
}

void AddNvmeDatacenter(std::span<const std::byte> page, DriveFigures& figures) {
  if (page.size() != kNvmePageBytes) return;
  const auto end = page.last<kDatacenterIdentifier.size()>();
  if (!std::ranges::equal(end, std::as_bytes(std::span(kDatacenterIdentifier)))) return;
  for (const Field& field : kDatacenterFields) {
    const auto [value, isAllOnes] = ReadField(page, field);
    if (!isAllOnes) figures.set(field.figure, value);
  }
}

std::optional<std::uint32_t> ParseHexadecimal(std::string_view text) {
  if (text.starts_with("0x") || text.starts_with("0X")) text.remove_prefix(2);
  return text.size() > 8 ? std::nullopt : ParseNumber<std::uint32_t>(text, 16);
}

std::optional<std::int64_t> LifeTimeUsed(std::string_view code) {
  const auto number = ParseHexadecimal(code);
  if (!number || *number < 1 || *number > 11) return std::nullopt;
  return *number * kLifeTimeStep;
}

void AddLifeTime(std::string_view areaA, std::string_view areaB, std::string_view endOfLife,
                 DriveFigures& figures) {
  std::int64_t most = 0;
  for (const auto& [code, figure] : {std::pair(areaA, kUsedA), std::pair(areaB, kUsedB)}) {
    const auto used = LifeTimeUsed(code);
    if (!used) continue;
    figures.set(figure, static_cast<std::uint64_t>(*used));
    most = std::max(most, *used);
  }
  if (most != 0) figures.set(kUsed, static_cast<std::uint64_t>(most));
  const auto reserve = ParseHexadecimal(endOfLife);
  if (reserve && *reserve >= 1 && *reserve <= 3) figures.set(kReserve, *reserve);
}

}  // namespace quorlet
