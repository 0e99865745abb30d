#include "ctl/statsd_line.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace quorlet {
namespace {

struct Case {
  std::string text;
  std::vector<double> numbers;
  double rate = 1;
};

TEST(StatsdLineTest, ReadsWhatClientsSend) {
  const std::vector<Case> cases = {
      {"a:1|c", {1}},
      {"a:3|c|@0.999", {3}, 0.999},
      {"t:12.345000|ms", {12.345}},
      {"g:+4|g", {4}},
      {"g:-5|g", {-5}},
      {"x:1|g|T1700000000", {1}},
      {"d:9|d|#k:v,w|c:ID|e:it|card:low", {9}},
      {"p:1:-2:3e2:.5|h|@1", {1, -2, 300, .5}},
      {std::string(200, 'k') + ":1|c", {1}},
      {"\xc3\xa9/../%s:1|c", {1}},
  };
  for (const Case& test : cases) {
    StatsdLine line;
    ASSERT_EQ(ParseStatsdLine(test.text, line), Refusal::kNone) << test.text;
    EXPECT_EQ(line.key, test.text.substr(0, test.text.find(':'))) << test.text;
    EXPECT_EQ(line.rate, test.rate) << test.text;
    std::vector<double> numbers;
    for (const StatsdNumber& number : line.numbers) numbers.push_back(number.real);
    EXPECT_EQ(numbers, test.numbers) << test.text;
  }
}

TEST(StatsdLineTest, RefusesTheRestWithItsReason) {
  const std::vector<std::pair<Refusal, std::vector<std::string>>> cases = {
      {Refusal::kUnreadable,
       {"a",        "a:",          "a:1",       "a:1|",       ":1|c",          "a|b:1|c",
        "a:|c",     "a:1:|ms",     ":|c",       "a:1 |c",     "a:1|c|",        "a:1|c|x",
        "a:1|c|@0", "a:1|c|@1.01", "a:1|c|@-1", "a:1|c|@nan", "a:1|c|@.5|@.5", "a:1|k",
        "a:inf|ms", "a:1:nan|d",   "a:1e999|g", "a:+-1|g",    "a:++1|g",       "a:0x1|c",
        "a:1|c\r"}},
      {Refusal::kKeyTooLong, {std::string(201, 'k') + ":1|c"}},
      {Refusal::kKeyBytes,
       {"a b:1|c", "a\tb:1|c", "a\x7f:1|c", std::string("a\0:1|c", 6), "longer.key\x7f:1|c",
        "much longer.key:1|c", "\x1fonger.key:1|c"}},
      {Refusal::kSet, {"s:u1|s", "s:a,b|s|#t"}},
      {Refusal::kEvent, {"_e{5,4}:title|text"}},
      {Refusal::kServiceCheck, {"_sc|name|0"}},
  };
  for (const auto& [reason, texts] : cases) {
    for (const std::string& text : texts) {
      StatsdLine line;
      EXPECT_EQ(ParseStatsdLine(text, line), reason) << text;
    }
  }
}

}  // namespace
}  // namespace quorlet
