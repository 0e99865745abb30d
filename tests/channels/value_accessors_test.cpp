#include "channels/value_accessors.h"

#include <gtest/gtest.h>

#include <cmath>

#include "channels/sample_makers.h"

namespace quorlet {
namespace {

constexpr std::int64_t kDeep = 0x44454550, kIdle = 0x49444C45;  // "DEEP", "IDLE"

TEST(ValueAccessorsTest, States) {
  Dictionary good = Sample(2, {{kDeep}, {kIdle, 2, 30, 0, -1}, {kDeep, 3, 10, 0, -1}});
  Dictionary torn = Sample(2, {{kDeep, 1, 9, 0, 1}, {kIdle, 1, 9}}, 2);
  Dictionary still = Sample(2, {{kDeep}, {}, {}});
  EXPECT_EQ(DrvReportStateGetIndexForID(good, kDeep), 2);
  EXPECT_EQ(DrvReportStateGetIndexForID(good, 5), -1);
  EXPECT_EQ(DrvReportStateGetIndexForID(torn, 1ULL << 63), 3);
  for (auto& [sample, index] : {std::pair(&good, -1), {&good, 3}, {&torn, 0}, {&still, 0}}) {
    EXPECT_TRUE(std::isnan(DrvReportStateGetDutyCycle(*sample, index)));
    EXPECT_EQ(DrvReportStateGetNameForIndex(*sample, index), nullptr);
    EXPECT_EQ(sample->contains("StateNames"), sample == &good);
    EXPECT_EQ(DrvReportStateGetCurrent(*sample), sample == &good ? 1 : -1);
  }
}

TEST(ValueAccessorsTest, HistogramExtremesSkipBucketsWithoutHits) {
  const Records buckets{{0, 1, 2, 3}, {5, 7, 8, 9}, {0, 1, 99, 3}, {2, 13, 14, 15}, {0, 4, 5, 6}};
  EXPECT_EQ(DrvReportHistogramGetMinValue(Sample(3, buckets)), 7);
  EXPECT_EQ(DrvReportHistogramGetMaxValue(Sample(3, buckets)), 14);
  EXPECT_EQ(DrvReportHistogramGetMinValue(Sample(3, {{0, 1, 2}})), kNone);
  EXPECT_EQ(DrvReportHistogramGetMaxValue(Sample(3, buckets, 1)), kNone);
}

TEST(ValueAccessorsTest, BucketBounds) {
  using Segments = std::vector<std::array<std::int64_t, 3>>;  // base, mode, number of buckets
  using Bounds = std::vector<std::uint64_t>;
  constexpr std::int64_t kMany = 0x7FFFFFFF, kNegative = 0x80000000, kLarge = 0xFFFFFFFF;
  for (const auto& [elements, segments, bounds] :
       {std::tuple(4u, Segments{{10, 0, 3}}, Bounds{10, 20, 30}),
        {5, {{2, 7, 3}, {5, 0, kNegative}, {9, 0, 2}}, {2, 4, 8, 9, 18}},
        {4, {{kLarge, 1, 2}}, {0xFFFFFFFF, 0xFFFFFFFE00000001}},
        {4, {{1LL << 31, 1, kMany}}, {}},
        {4, {{1LL << 31, 0, 2}}, {}},
        {4, {{1, 0, 5}}, {}},
        {4, {{1, 1, 2}}, {}},
        {4, {}, {}}}) {
    ByteWriter config;
    for (const auto& [base, mode, buckets] : segments) {
      config.u32(static_cast<std::uint64_t>(base)).u32(static_cast<std::uint64_t>(mode));
      config.u32(9).u32(static_cast<std::uint64_t>(buckets));
    }
    config.text("", 15);  // a part that is no segment
    Dictionary channel = Sample(3, {}, elements);
    channel["DrvReportChannelInfo"] = Dictionary{{"DrvReportChannelConfig", config.data()}};
    Bounds read;
    std::int64_t lower = 0, upper = 0, previous = 0;
    int i = 0;
    for (; DrvReportHistogramGetBucketBounds(channel, i, &lower, &upper) == kKernelSuccess; ++i) {
      EXPECT_EQ(lower, previous);
      previous = upper;
      read.push_back(static_cast<std::uint64_t>(upper));
    }
    EXPECT_EQ(read, bounds);
    EXPECT_EQ(channel.contains("ProcessedChannelConfig"), i > 0);
    EXPECT_EQ(DrvReportHistogramGetBucketBounds(channel, i, &lower, nullptr) == 0, i > 0);
    EXPECT_EQ(lower, upper);
    EXPECT_NE(DrvReportHistogramGetBucketBounds(channel, i + 1, nullptr, nullptr), 0u);
  }
}

}  // namespace
}  // namespace quorlet
