#include "channels/units.h"

#include <gtest/gtest.h>

#include <cmath>

namespace quorlet {
namespace {

TEST(UnitsTest, Labels) {
  const std::uint64_t units[] = {0x0100007900000000, 0x0100008300000000, 0x0900000000000000,
                                 0x0900820000000000, 0x0900820000000001, 0x09008C0000000004,
                                 0x0000007600000001, 0x6402000000000000, 0x6500008500000000,
                                 0x0800008500000000, 0x7F00000000000000};
  std::string labels;
  for (const std::uint64_t unit : units) {
    Dictionary channel{{"DrvReportChannelInfo", DrvReportCreateUnitInfo(unit)}};
    labels += *DrvReportChannelGetUnitLabel(channel) + ' ';
  }
  EXPECT_EQ(labels, "us s b B  4KiB 1Gticks hwpage? Mpackets MHz ?? ");
}

TEST(UnitsTest, ScalingWithFactorsModulo64Bits) {
  constexpr std::uint64_t s = kSecondsUnit, kBytes = 0x0900820000000000;
  for (const auto& [value, from, to, scaled] :
       {std::tuple(~0ULL, s | 0x7F7F80000000, s, std::ldexp(1, 64)),
        {1500, s | 0x7600000000, s | 0x7C00000000, 0.0015},
        {24000000, s | 0x7980000018, s, 1},
        {3, 0x09008C0000000004, kBytes, 12288},
        {1, s | 0x9300000000, s, 7766279631452241920.0},
        {1, s | 0xBE0000000001, s | 0x400000000000, std::ldexp(1, 126)},
        {1, s | 0xBF0000000001, s, 0},
        {1, s | 0xFF0000000001, s, INFINITY},
        {0, s | 0x0100000000, s, NAN},
        {1, s, kBytes, NAN},
        {1, s, s | 0x80000000000000, NAN}}) {
    // As text, which tells a negative NaN from a positive one.
    EXPECT_EQ(testing::PrintToString(DrvReportScaleValue(value, from, to)),
              testing::PrintToString(scaled));
  }
}

}  // namespace
}  // namespace quorlet
