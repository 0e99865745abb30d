#include "channels/descriptions.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>

#include "channels/sample_makers.h"
#include "channels/units.h"

namespace quorlet {
namespace {

using namespace std::string_literals;

Dictionary Named(std::string_view name, std::uint64_t unit, Dictionary sample) {
  sample["ChannelName"] = name;
  sample["DrvReportChannelInfo"] = DrvReportCreateUnitInfo(unit);
  sample["ProcessedChannelConfig"] = Array{Int64(10), Int64(-1)};
  return sample;
}

TEST(DescriptionsTest, Channel) {
  Dictionary channel{{"LegendChannel", Array{Int64(0), Int64(0xFFFF00000002)}},
                     {"DrvReportGroupName", "g%s\0\33"s}};
  EXPECT_EQ(DrvReportChannelCopyDescription(channel, 0, "> "),
            "> (null) (null) < 0 ((null)) | G/g g%s\0\33/(none) | cat 0000 | format 0x02 | "
            "elts 65535 >\n"s);
  channel["LegendChannel"] = Array{Int64(0)};
  EXPECT_EQ(DrvReportChannelCopyDescription(channel), std::nullopt);
}

TEST(DescriptionsTest, Samples) {
  const std::pair<Dictionary, std::optional<std::string>> samples[] = {
      {Sample(1, {{-5}}), ">                    0x1234567890 = {           -5 (null) }\n"},
      {Named("a\0%n"s, 0x0900820000000000, Sample(1, {{1}, {2}})),
       ">                            a\0%n = { -9223372036854775808 B }\n"
       ">                            a\0%n = { -9223372036854775808 B }\n"s},
      {Named("cpu", 0x0100007C00000000, Sample(2, {{0x49444C45, 12, 1500}, {0x44454550, -1, 500}})),
       ">                 cpu[    IDLE] = { # 12       1.500e+00 s / 75.0% }\n"
       ">                 cpu[    DEEP] = { # 18446744073709551615 5.000e-01 s / 25.0% }\n"},
      {Named("\xFF", 0x6400000000000000, Sample(2, {{7}})),
       ">        0x1234567890[     0x7] = { # 0              nan s /  nan% }\n"},
      {Named("", kSecondsUnit, Sample(2, {{1}}, 2)),
       ">        0x1234567890[0x8000000000000000] = { # 9223372036854775808 9.223e+18 s /  nan% "
       "}\n"},
      {Named("h", kSecondsUnit, Sample(3, {{0, 1, 2, 3}, {-1, 4, 5, -6}})),
       ">                   h[           0 -           10 s] = { <no hits>; # 0 }\n"
       ">                   h[          10 -           -1 s] = { m            4; M            5; "
       "s           -6; # 18446744073709551615 }\n"},
      {Named("h", kSecondsUnit, Sample(3, {{}, {}, {}})), std::nullopt},  // 2 bounds only
      {Named("h", kSecondsUnit, Sample(3, {{}, {kNone}})), std::nullopt},
      {Named(std::string(40 << 20, 'x'), 0, Sample(1, {{}, {}})), std::nullopt}};
  for (auto [sample, text] : samples) {
    EXPECT_EQ(DrvReportSampleCopyDescription(sample, 0, ">"), text);
  }
  Dictionary array = Sample(4, {{1}, {2}});
  EXPECT_EQ(DrvReportSampleCopyDescription(array), "arrays unsupported?arrays unsupported?");
}

TEST(DescriptionsTest, ManyStatesWithoutNamesAreNotQuadratic) {
  Records records(65535, {0x49444C45, 1, 1});
  records.back()[0] = 7;
  Dictionary sample = Sample(2, records);  // minutes, if it were
  EXPECT_TRUE(
      DrvReportSampleCopyDescription(sample)->starts_with("        0x1234567890[0x49444c45]"));
}

TEST(DescriptionsTest, WritesText) {
  const std::string text = "\xC3\xA9\0x"s, illFormed = "\xC3";
  std::FILE* file = std::tmpfile();
  EXPECT_EQ(DrvReportWriteStringUTF8(fileno(file), nullptr), kKernelBadArgument);
  EXPECT_EQ(DrvReportWriteStringUTF8(fileno(file), &illFormed), kKernelNoMemory);
  EXPECT_EQ(DrvReportWriteStringUTF8(fileno(file), &text), kKernelSuccess);
  EXPECT_EQ(lseek(fileno(file), 0, SEEK_CUR), 4);
  std::fclose(file);
  EXPECT_EQ(DrvReportWriteStringUTF8(-1, &text), 0xE00002CA);
}

}  // namespace
}  // namespace quorlet
