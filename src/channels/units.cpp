// Unit codes, as units.h lays them out: labels, factors and conversion.
#include "channels/units.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <string_view>
#include <utility>

#include "channels/channel.h"

namespace quorlet {
namespace {

constexpr std::uint64_t kScaleMask = (std::uint64_t{1} << 56) - 1;
constexpr std::uint64_t kBytesScale = 0x820000000000;  // 2^3 bits
constexpr std::uint8_t kQuantityData = 9;              // counted in bits

struct ScaleText {
  std::uint64_t scale;
  std::string_view text;
};

// The label of the scale, whatever the quantity.
// clang-format off
constexpr auto kWholeLabels = std::to_array<ScaleText>({
    {0x0007600000001, "1Gticks"},
    {0x0007980000018, "24Mticks"},
    {0x1000000000000, "hwticks?"},
    {0x2000000000000, "hwpage?"},
});

constexpr auto kPrefixes = std::to_array<ScaleText>({
    {0x007300000000, "p"},
    {0x007600000000, "n"},
    {0x007900000000, "u"},
    {0x007C00000000, "m"},
    {0x008200000000, "k"},
    {0x008500000000, "M"},
    {0x008800000000, "G"},
    {0x008B00000000, "T"},
    {0x890000000000, "Ki"},
    {0x8C0000000000, "KiB"},
    {0x8C0000000004, "4KiB"},
    {0x8C0000000008, "8KiB"},
    {0x930000000000, "Mi"},
    {0x960000000000, "MiB"},
    {0x9D0000000000, "Gi"},
    {0xA00000000000, "GiB"},
    {0xA70000000000, "Ti"},
    {0xAA0000000000, "TiB"},
});
// clang-format on
static_assert(std::ranges::is_sorted(kPrefixes, {}, &ScaleText::scale));

constexpr std::string_view FindText(const auto& table, std::uint64_t scale) {
  const auto row = std::ranges::find(table, scale, &ScaleText::scale);
  return row == table.end() ? std::string_view() : row->text;
}

constexpr std::uint8_t QuantityOf(std::uint64_t unit) {
  return static_cast<std::uint8_t>(unit >> 56);
}

std::string_view QuantityLabel(std::uint8_t quantity, std::uint64_t scale) {
  static constexpr auto kLabels =
      std::to_array<std::string_view>({"", "s", "W", "J", "A", "V", "F", "H", "Hz"});
  if (quantity < kLabels.size()) return kLabels[quantity];
  switch (quantity) {
    case kQuantityData:
      if (scale == 0) return "b";
      return scale == kBytesScale ? "B" : "";
    case 10:
      return "C";
    case 100:
      return "events";
    case 101:
      return "packets";
    default:
      return "??";
  }
}

// The signed exponent of a non-zero exponent byte.
constexpr int ExponentOf(std::uint64_t byte) {
  return static_cast<std::int8_t>(static_cast<std::uint8_t>(byte + 0x81));
}
static_assert(ExponentOf(1) == -126 && ExponentOf(0x7F) == 0 && ExponentOf(0x82) == 3);
static_assert(ExponentOf(254) == 127 && ExponentOf(255) == -128);

// Modulo 2^64: 0 from 10^64 on.
constexpr std::uint64_t PowerOfTen(int exponent) {
  std::uint64_t power = 1;
  for (; exponent > 0; --exponent) power *= 10;
  return power;
}

// Modulo 2^64, where the language leaves a shift by 64 or more undefined.
constexpr std::uint64_t ShiftedLeft(std::uint64_t value, int bits) {
  return bits < 64 ? value << bits : 0;
}

}  // namespace

std::optional<std::string> copyUnitLabel(std::uint64_t unit) {
  if (unit == static_cast<std::uint64_t>(kDrvReportInvalidValue)) return std::nullopt;
  const std::uint64_t scale = unit & kScaleMask;
  std::string label(FindText(kWholeLabels, scale));
  if (label.empty()) {
    label = FindText(kPrefixes, scale);
    label += QuantityLabel(QuantityOf(unit), scale);
  }
  return label;
}

KernelReturn getFactorsFromScale(std::uint64_t scale, std::uint64_t& numerator,
                                 std::uint64_t& denominator) {
  if (((scale >> 48) & 0xFF) != 0) return kKernelBadArgument;
  const std::uint64_t multiplier = scale & 0x7FFFFFFF;
  const bool divides = (scale & 0x80000000) != 0;
  numerator = multiplier == 0 || divides ? 1 : multiplier;
  denominator = multiplier != 0 && divides ? multiplier : 1;
  if (const std::uint64_t byte = (scale >> 32) & 0xFF; byte != 0) {
    const int exponent = ExponentOf(byte);
    (exponent > 0 ? numerator : denominator) *= PowerOfTen(std::abs(exponent));
  }
  if (const std::uint64_t byte = (scale >> 40) & 0xFF; byte != 0) {
    const int exponent = ExponentOf(byte);
    std::uint64_t& factor = exponent > 0 ? numerator : denominator;
    factor = ShiftedLeft(factor, std::abs(exponent));
  }
  return kKernelSuccess;
}

const std::string* DrvReportChannelGetUnitLabel(Dictionary& channel) {
  constexpr std::string_view kUnitLabel = "UnitLabel";
  if (const PropertyValue* kept = channel.find(kUnitLabel)) return kept->asString();
  auto label = copyUnitLabel(DrvReportChannelGetUnit(channel));
  if (!label) return nullptr;
  channel[kUnitLabel] = *std::move(label);
  return StringEntry(channel, kUnitLabel);
}

Dictionary DrvReportCreateUnitInfo(std::uint64_t unit) {
  return {{"DrvReportChannelUnit", Int64(static_cast<std::int64_t>(unit))}};
}

double DrvReportScaleValue(std::uint64_t value, std::uint64_t from, std::uint64_t to) {
  // Factors of 0 are possible, and then a division by zero that must be infinite or NaN.
  static_assert(std::numeric_limits<double>::is_iec559);
  constexpr double kNotANumber = std::numeric_limits<double>::quiet_NaN();
  std::uint64_t n1 = 0, d1 = 0, n2 = 0, d2 = 0;
  if (QuantityOf(from) != QuantityOf(to) || getFactorsFromScale(from, n1, d1) != kKernelSuccess ||
      getFactorsFromScale(to, n2, d2) != kKernelSuccess) {
    return kNotANumber;
  }
  const double scaled = static_cast<double>(value) * static_cast<double>(n1) /
                        static_cast<double>(d1) / static_cast<double>(n2) * static_cast<double>(d2);
  // 0 / 0 makes a negative NaN on some processors, which prints differently.
  return std::isnan(scaled) ? kNotANumber : scaled;
}

}  // namespace quorlet
