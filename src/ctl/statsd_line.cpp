#include "ctl/statsd_line.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <cstring>

#include "values/digits.h"

namespace quorlet {
namespace {

// Takes what stands before `end` off the front of `text`, and `end` with it; false when there was
// none. All that is read of a line is cut off here, so nothing beyond it can be reached.
inline bool TakeUntil(std::string_view& text, char end, std::string_view& taken) {
  const std::size_t at = std::min(text.find(end), text.size());
  const bool isFound = at < text.size();
  taken = text.substr(0, at);
  text.remove_prefix(at + (isFound ? 1 : 0));
  return isFound;
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
  bool isLast = false;
  while (!isLast) {
    std::string_view digits;
    isLast = !TakeUntil(text, ':', digits);
    if (!ReadNumber(digits, numbers.emplace_back())) return false;
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

// Whether there are no control characters and no blanks. Eight bytes at a time: most of a line is
// its key, and this was most of the parser's time.
bool IsClean(std::string_view key) {
  constexpr std::uint64_t kOnes = 0x0101010101010101;
  const auto hasBelow = [](std::uint64_t bytes, std::uint64_t bound) {
    return ((bytes - kOnes * bound) & ~bytes & (kOnes * 0x80)) != 0;
  };
  std::uint64_t bytes = 0;
  for (; key.size() >= sizeof bytes; key.remove_prefix(sizeof bytes)) {
    std::memcpy(&bytes, key.data(), sizeof bytes);
    if (hasBelow(bytes, 0x21) || hasBelow(bytes ^ (kOnes * 0x7f), 1)) return false;
  }
  return std::ranges::none_of(key, [](char letter) {
    const auto byte = static_cast<unsigned char>(letter);
    return byte <= 0x20 || byte == 0x7f;
  });
}

Refusal CheckKey(std::string_view key) {
  if (key.empty()) return Refusal::kUnreadable;
  if (key.size() > kLongestRecordedKey) return Refusal::kKeyTooLong;
  return IsClean(key) ? Refusal::kNone : Refusal::kKeyBytes;
}

}  // namespace

Refusal ParseStatsdLine(std::string_view text, StatsdLine& line) {
  if (text.starts_with("_e{")) return Refusal::kEvent;
  if (text.starts_with("_sc|")) return Refusal::kServiceCheck;
  std::string_view numbers, type, field;
  bool isLast = !TakeUntil(text, '|', numbers);
  if (!TakeUntil(numbers, ':', line.key) || isLast) return Refusal::kUnreadable;
  isLast = !TakeUntil(text, '|', type);
  if (type == "s") return Refusal::kSet;
  if (!ReadType(type, line.kind)) return Refusal::kUnreadable;
  std::optional<double> rate;
  while (!isLast) {
    isLast = !TakeUntil(text, '|', field);
    if (!ReadField(field, rate)) return Refusal::kUnreadable;
  }
  line.rate = rate.value_or(1);
  if (!ReadNumbers(numbers, line.numbers)) return Refusal::kUnreadable;
  return CheckKey(line.key);
}

std::optional<std::string_view> NextStatsdLine(std::string_view& text) {
  std::string_view line;
  while (!text.empty()) {
    static_cast<void>(TakeUntil(text, '\n', line));
    if (!line.empty()) return line;
  }
  return std::nullopt;
}

}  // namespace quorlet
