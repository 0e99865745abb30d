#include "values/text.h"

#include <gtest/gtest.h>

namespace quorlet {
namespace {

TEST(FormatText, PutsArgumentsIntoConversions) {
  EXPECT_EQ(FormatText("100%% of %s: %d, %llu, %@ and %{public}@", "keys", -3, ~0ull,
                       std::string("a%sb"), PropertyValue("x y")),
            "100% of keys: -3, 18446744073709551615, a%sb and x y");
  EXPECT_EQ(FormatText("%@ %s", std::optional<std::string>(), std::optional<std::string>("x")),
            "(null) x");
  // A text that the compiler never saw: what has no argument or no meaning stays.
  EXPECT_EQ(FormatMessage("%x %s %", {}), "%x %s %");
}

TEST(Utf8, ReplacesEachMaximalIllFormedPart) {
  struct Case {
    std::string_view text;
    std::string_view repaired;
    std::size_t validPrefix;
  };
  // clang-format off
  const Case cases[] = {
      {"", "", 0},
      {"a\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80\x7F", "a\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80\x7F", 11},
      {"a\x80" "b", "a\uFFFDb", 1},
      {"\xC0\xAF", "\uFFFD\uFFFD", 0},              // overlong
      {"\xE0\x9F\xBF", "\uFFFD\uFFFD\uFFFD", 0},    // overlong
      {"\xED\xA0\x80", "\uFFFD\uFFFD\uFFFD", 0},    // surrogate
      {"\xF4\x90\x80\x80", "\uFFFD\uFFFD\uFFFD\uFFFD", 0},
      {"\xF0\x9F\x98", "\uFFFD", 0},                // cut
      {"x\xE2\x82y\xE2", "x\uFFFDy\uFFFD", 1},
      {"\xED\x9F\xBF\xEE\x80\x80\xF4\x8F\xBF\xBF", "\xED\x9F\xBF\xEE\x80\x80\xF4\x8F\xBF\xBF", 10},
  };
  // clang-format on
  for (const Case& c : cases) {
    EXPECT_EQ(RepairUtf8(c.text), c.repaired);
    EXPECT_EQ(ValidUtf8Prefix(c.text), c.validPrefix) << c.repaired;
    EXPECT_EQ(IsValidUtf8(c.text), c.text == c.repaired) << c.repaired;
  }
}

}  // namespace
}  // namespace quorlet
