#include "ctl/tally_lines.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>

#include "ctl/options.h"
#include "ctl/output.h"

namespace quorlet {
namespace {

constexpr std::string_view kScalar = "scalar";
constexpr std::string_view kValue = "value";

void AppendInteger(std::int64_t number, std::string& text) {
  std::array<char, 20> digits;
  const auto end = std::to_chars(digits.data(), digits.data() + digits.size(), number).ptr;
  text.append(digits.data(), end);
}

void AppendReal(double number, std::string& text) {
  std::array<char, 32> digits;  // the longest has 24
  char* const end = digits.data() + digits.size();
  // The shortest text of 100000 would be 1e+05.
  const bool isWhole = std::abs(number) < 1e15 && std::trunc(number) == number;
  const auto used = isWhole ? std::to_chars(digits.data(), end, number, std::chars_format::fixed)
                            : std::to_chars(digits.data(), end, number);
  text.append(digits.data(), used.ptr);
}

// The text before the next tab, which is taken from `rest` together with the tab.
std::string_view TakeField(std::string_view& rest) {
  const std::size_t tab = rest.find('\t');
  const std::string_view field = rest.substr(0, tab);
  rest.remove_prefix(tab == std::string_view::npos ? rest.size() : tab + 1);
  return field;
}

std::string Wrong(std::string_view what, std::string_view field) {
  return std::string(what).append(": ").append(field);
}

}  // namespace

std::variant<ScalarLine, SampleLine, std::string> ParseTallyLine(std::string_view line) {
  const auto tabs = std::ranges::count(line, '\t');
  std::string_view rest = line;
  const std::string_view kind = TakeField(rest);
  if (kind != kScalar && kind != kValue) {
    return std::string("starts with neither \"scalar\" nor \"value\" and a tab");
  }
  const bool isScalar = kind == kScalar;
  if (tabs != (isScalar ? 3 : 4)) {
    return std::string(isScalar ? "needs the four fields scalar, DAY, KEY, VALUE"
                                : "needs the five fields value, DAY, KEY, SECOND, NUMBER");
  }
  const std::string_view dayField = TakeField(rest);
  const auto day = ParseDayNumber(dayField);
  if (!day) return Wrong("not a day number up to today's", dayField);
  auto key = Unescape(TakeField(rest));
  if (!key) return std::string("the key has a backslash that is not \\t, \\n, \\r, \\\\ or \\xNN");
  if (isScalar) {
    const auto value = ParseNumber<std::int64_t>(rest);
    if (!value) return Wrong("not a whole number of 64 bits", rest);
    return ScalarLine{*day, std::move(*key), *value};
  }
  const std::string_view secondField = TakeField(rest);
  const auto second = ParseSecond(secondField);
  if (!second) return Wrong("not a second of the day", secondField);
  const auto number = ParseNumber<double>(rest);
  if (!number) return Wrong("not a number", rest);
  return SampleLine{*day, std::move(*key), {*number, *second}};
}

void AppendScalarLine(std::int32_t day, std::string_view escapedKey, std::int64_t value,
                      std::string& lines) {
  lines.append(kScalar) += '\t';
  AppendInteger(day, lines);
  (lines += '\t').append(escapedKey) += '\t';
  AppendInteger(value, lines);
  lines += '\n';
}

void AppendSampleLine(std::int32_t day, std::string_view escapedKey,
                      const DistributionSample& sample, std::string& lines) {
  lines.append(kValue) += '\t';
  AppendInteger(day, lines);
  (lines += '\t').append(escapedKey) += '\t';
  AppendInteger(sample.secondsInDay, lines);
  lines += '\t';
  AppendReal(sample.value, lines);
  lines += '\n';
}

std::string RealText(double number) {
  std::string text;
  AppendReal(number, text);
  return text;
}

}  // namespace quorlet
