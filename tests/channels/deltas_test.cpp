#include "channels/deltas.h"

#include <gtest/gtest.h>

#include "channels/sample_makers.h"

namespace quorlet {
namespace {

TEST(DeltasTest, RecordsAreSubtracted) {
  const std::tuple<std::uint8_t, Records, Records, Records> cases[] = {
      {1, {{kNone + 1, 1, 2, 3}}, {{INT64_MAX, 4, 5, 6, 1}}, {{-2, 1, 2, 3}}},
      {2, {{1, INT64_MAX, 1000, 7}}, {{kNone, kNone + 1, 1600, 8, 1}}, {{kNone, 2, 600, 8, 1}}},
      {3, {{3, 1, 2, kNone}}, {{3, 4, 5, kNone, 1}}, {{0, 4, 5, kNone, 1}}},
      {3, {{0, 1, 2, kNone}}, {{2, 4, 5, 50}}, {{2, 4, 5, 50}}},
      {3, {{}, {2, 1, 2, 40}}, {{}, {5, 4, 5, 100}}, {{0, 0, 0, kNone}, {3, 4, 5, 60}}},
      {4, {{kNone, 4, 4, kNone}}, {{7, kNone, 9, kNone, 1}}, {{7, 4, 5, kNone, 1}}}};
  for (const auto& [format, earlier, later, delta] : cases) {
    const Dictionary before = Sample(format, earlier), after = Sample(format, later);
    EXPECT_EQ(DrvReportSampleCreateDelta(before, after), Sample(format, delta));
    EXPECT_EQ(before, Sample(format, earlier));
  }
}

TEST(DeltasTest, Failures) {
  const Dictionary two = Sample(2, {{}, {}}), bucket = Sample(3, {{1, 1, 1, 1}});
  const std::string none = "createErr() passed a NULL string!";
  for (const auto& [earlier, later, code, reason] :
       {std::tuple(Sample(0, {{1}}), two, kKernelBadArgument, none),
        {Sample(1, {{}}), two, kKernelBadArgument, "mismatched formats"},
        {Sample(5, {{}}), Sample(5, {{}}), 0xE00002E6, "unknown report format"},
        {Sample(1, {{}}), Sample(1, {{kNone}}), kKernelError, none},
        {Sample(2, {{}}), two, 1, none},
        {two, Sample(2, {{}, {1, 1, kNone}}), 1, none},
        {Sample(2, {{}, {}}, 1), two, 1, none},
        {bucket, Sample(3, {{kNone, 1, 1, 1}}), 1, none},
        {bucket, Sample(3, {{2, 1, 1, kNone}}), 1, none},
        {Sample(3, {{2, 1, 1, kNone}}), bucket, 1, none},
        {Sample(4, {{}}), Sample(4, {{}, {}}), 1, none}}) {
    std::optional<ErrorValue> error;
    EXPECT_EQ(DrvReportSampleCreateDelta(earlier, later, &error), std::nullopt);
    EXPECT_EQ(error.value().code, static_cast<std::int32_t>(code));
    EXPECT_EQ(error->reason, reason);
  }
}

TEST(DeltasTest, ChannelsOfAggregatesArePaired) {
  const auto aggregate = [](const Array& channels) {
    return Dictionary{{"DrvReportChannels", channels}};
  };
  const Dictionary earlier = aggregate({Sample(2, {{1, 10, 10}}), Sample(2, {{1}, {2, 10, 10}})});
  const Dictionary later = aggregate({Sample(2, {{1}, {2, 13, 17}}), Sample(2, {{}, {}, {9, 9}})});
  EXPECT_EQ(DrvReportCreateSamplesDelta(earlier, later),
            aggregate({Sample(2, {{1}, {2, 3, 7}}), Sample(2, {{}, {}, {9, 9}})}));
  EXPECT_EQ(DrvReportCreateSamplesDelta(earlier, aggregate({Sample(2, {{1, kNone}})})),
            std::nullopt);
}

}  // namespace
}  // namespace quorlet
