#include "ctl/statsd_line.h"

#include <algorithm>
#include <array>
#include <cmath>

#include "values/digits.h"

namespace quorlet {
namespace {

// Takes what stands before `end` off the front of `text`, and `end` with it. All that is read of a
// line is cut off here, so nothing beyond it can be reached.
std::string_view TakeUntil(std::string_view& text, char end) {
  const std::size_t at = std::min(text.find(end), text.size());
  const std::string_view taken = text.substr(0, at);
  text.remove_prefix(std::min(at + 1, text.size()));
  return taken;
}

// A decimal number. ParseNumber takes no "+", and would take the "-" of "+-1".
bool ReadNumber(std::string_view text, StatsdNumber& number) {
  number = {};
  number.isSigned = text.starts_with('+') || text.starts_with('-');
  if (text.starts_with('+')) {
    text.remove_prefix(1);
    if (text.starts_with('-')) return false;
  }
  number.whole = ParseNumber<std::int64_t>(text);
  const auto real = number.whole ? static_cast<double>(*number.whole) : ParseNumber<double>(text);
  number.real = real.value_or(0);
  return real && std::isfinite(*real);
}

bool ReadNumbers(std::string_view text, std::vector<StatsdNumber>& numbers) {
  numbers.clear();
  const auto count = static_cast<std::size_t>(std::ranges::count(text, ':')) + 1;
  for (std::size_t i = 0; i < count; ++i) {
    StatsdNumber number;
    if (!ReadNumber(TakeUntil(text, ':'), number)) return false;
    numbers.push_back(number);
  }
  return true;
}

bool ReadType(std::string_view type, StatsdKind& kind) {
  if (type == "c") {
    kind = StatsdKind::kCounter;
  } else if (type == "g") {
    kind = StatsdKind::kGauge;
  } else if (type == "ms" || type == "h" || type == "d") {
    kind = StatsdKind::kValues;
  } else {
    return false;
  }
  return true;
}

// What may follow the type, each after a "|". Only the rate, once, means something here.
bool ReadField(std::string_view field, std::optional<double>& rate) {
  if (field.starts_with('@')) {
    if (rate) return false;
    rate = ParseNumber<double>(field.substr(1));
    return rate && *rate > 0 && *rate <= 1;
  }
  constexpr std::array<std::string_view, 5> kLeftOut = {"#", "T", "c:", "e:", "card:"};
  return std::ranges::any_of(kLeftOut,
                             [field](std::string_view start) { return field.starts_with(start); });
}

std::optional<Refusal> CheckKey(std::string_view key) {
  if (key.empty()) return Refusal::kUnreadable;
  if (key.size() > kLongestRecordedKey) return Refusal::kKeyTooLong;
  const bool isClean = std::ranges::none_of(key, [](char letter) {
    const auto byte = static_cast<unsigned char>(letter);
    return byte <= 0x20 || byte == 0x7f;
  });
  return isClean ? std::nullopt : std::optional(Refusal::kKeyBytes);
}

}  // namespace

std::optional<Refusal> ParseStatsdLine(std::string_view text, StatsdLine& line) {
  if (text.starts_with("_e{")) return Refusal::kEvent;
  if (text.starts_with("_sc|")) return Refusal::kServiceCheck;
  std::string_view fields = text;
  std::string_view numbers = TakeUntil(fields, '|');
  if (numbers.find(':') == std::string_view::npos) return Refusal::kUnreadable;
  line.key = TakeUntil(numbers, ':');
  // A type without "|" after it is the last field; with one, the next field must not be empty.
  bool isLast = fields.find('|') == std::string_view::npos;
  const std::string_view type = TakeUntil(fields, '|');
  if (type == "s") return Refusal::kSet;
  if (!ReadType(type, line.kind)) return Refusal::kUnreadable;
  std::optional<double> rate;
  while (!isLast) {
    isLast = fields.find('|') == std::string_view::npos;
    if (!ReadField(TakeUntil(fields, '|'), rate)) return Refusal::kUnreadable;
  }
  line.rate = rate.value_or(1);
  if (!ReadNumbers(numbers, line.numbers)) return Refusal::kUnreadable;
  return CheckKey(line.key);
}

std::optional<std::string_view> NextStatsdLine(std::string_view& text) {
  while (!text.empty()) {
    if (const std::string_view line = TakeUntil(text, '\n'); !line.empty()) return line;
  }
  return std::nullopt;
}

}  // namespace quorlet
