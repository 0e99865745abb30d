// Unit codes: what a channel counts, how it is labelled and how it converts.
//
// A unit is 64 bits: quantity (63-56), hardware-relative code (55-48: 1 ticks, 2 pages), binary
// exponent byte (47-40), decimal exponent byte (39-32), multiplier direction (31: 0 multiplies, 1
// divides) and multiplier (30-0, 0 means 1). An exponent byte of 0 is no exponent, any other stands
// for byte - 127, except 255, which stands for -128. The low 56 bits are the scale.
#ifndef QUORLET_CHANNELS_UNITS_H_
#define QUORLET_CHANNELS_UNITS_H_

#include <cstdint>
#include <optional>
#include <string>

#include "drvreport/drvreport.h"

namespace quorlet {

inline constexpr std::uint64_t kSecondsUnit = 0x0100000000000000;

// "ms", "KiB", "packets": scale prefix and quantity; nothing for the invalid unit. A scale without
// a prefix of its own is left out, an unknown quantity is "??".
std::optional<std::string> copyUnitLabel(std::uint64_t unit);

// One unit is `numerator` / `denominator` base units of its quantity. Both are products modulo 2^64
// (a power of ten or two that does not fit may leave 0). kKernelBadArgument, and nothing written,
// for a hardware-relative unit. The quantity in bits 63-56 is not looked at.
KernelReturn getFactorsFromScale(std::uint64_t scale, std::uint64_t& numerator,
                                 std::uint64_t& denominator);

}  // namespace quorlet

#endif  // QUORLET_CHANNELS_UNITS_H_
