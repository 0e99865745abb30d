// Scalars and characters as XML property lists spell them.
#include "values/property_list_scalars.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdint>
#include <limits>
#include <utility>

#include "values/base64.h"
#include "values/digits.h"
#include "values/text.h"

namespace quorlet {
namespace {

bool IsBetween(char c, char first, char last) { return c >= first && c <= last; }
bool IsDigit(char c) { return IsBetween(c, '0', '9'); }

// A number of `least` to `most` digits at the front of `text`, which loses them.
std::optional<unsigned> TakeDigits(std::string_view& text, std::size_t least, std::size_t most) {
  unsigned number = 0;
  std::size_t count = 0;
  for (; count < most && count < text.size() && IsDigit(text[count]); ++count) {
    number = number * 10 + static_cast<unsigned>(text[count] - '0');
  }
  text.remove_prefix(count);
  return count < least ? std::nullopt : std::optional(number);
}

bool IsXmlCharacter(std::uint32_t c) {
  return c == '\t' || c == '\n' || c == '\r' || (c >= 0x20 && c < 0xD800) ||
         (c >= 0xE000 && c < 0xFFFE) || (c >= 0x10000 && c <= 0x10FFFF);
}

PropertyValue NumberFromBits(std::uint64_t number) {
  return std::in_range<std::int64_t>(number) ? Int64(static_cast<std::int64_t>(number))
                                             : UInt64(number);
}

}  // namespace

std::string_view Trimmed(std::string_view text) {
  const std::size_t first = text.find_first_not_of(kXmlBlanks);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kXmlBlanks) - first + 1);
}

std::string Lowered(std::string_view text) {
  std::string out(text);
  for (char& c : out) c = IsBetween(c, 'A', 'Z') ? static_cast<char>(c - 'A' + 'a') : c;
  return out;
}

std::optional<PropertyValue> IntegerFromText(std::string_view text) {
  const bool negative = text.starts_with('-');
  if (negative || text.starts_with('+')) text.remove_prefix(1);
  const bool hexadecimal = text.starts_with("0x") || text.starts_with("0X");
  if (hexadecimal) text.remove_prefix(2);
  const auto magnitude = ParseNumber<std::uint64_t>(text, hexadecimal ? 16 : 10);
  if (!magnitude || (negative && *magnitude > std::uint64_t{1} << 63)) return std::nullopt;
  if (!negative) return NumberFromBits(*magnitude);
  return Int64(static_cast<std::int64_t>(-*magnitude));
}

std::optional<PropertyValue> RealFromText(std::string_view text) {
  const bool negative = text.starts_with('-');
  if (negative || text.starts_with('+')) text.remove_prefix(1);
  double value = 0;
  if (const std::string word = Lowered(text); word == "nan") {
    value = std::numeric_limits<double>::quiet_NaN();
  } else if (word == "inf" || word == "infinity") {
    value = std::numeric_limits<double>::infinity();
  } else {
    if (text.empty() || !(IsDigit(text[0]) || text[0] == '.')) return std::nullopt;
    const auto number = ParseNumber<double>(text);
    if (!number) return std::nullopt;
    value = *number;
  }
  return Double(negative ? -value : value);
}

std::optional<PropertyValue> DateFromText(std::string_view text) {
  std::array<unsigned, 6> fields{};
  constexpr std::string_view kSeparators = "--T::Z";
  for (std::size_t i = 0; i < fields.size(); ++i) {
    const auto number = TakeDigits(text, i == 0 ? 1 : 2, i == 0 ? 4 : 2);
    if (!number || !text.starts_with(kSeparators[i])) return std::nullopt;
    fields[i] = *number;
    text.remove_prefix(1);
  }
  const auto [year, month, day, hour, minute, second] = fields;
  const std::chrono::year_month_day civil(std::chrono::year(static_cast<int>(year)),
                                          std::chrono::month(month), std::chrono::day(day));
  if (!text.empty() || year == 0 || !civil.ok()) return std::nullopt;
  if (hour > 23 || minute > 59 || second > 59) return std::nullopt;
  const auto days = std::chrono::sys_days(civil).time_since_epoch();
  const auto time = std::chrono::hours(hour) + std::chrono::minutes(minute);
  const auto seconds = std::chrono::seconds(days) + time + std::chrono::seconds(second);
  return Date{static_cast<double>(seconds.count())};
}

std::optional<PropertyValue> DataFromText(std::string_view text) {
  auto data = DataFromBase64(text);
  return data ? std::optional<PropertyValue>(*std::move(data)) : std::nullopt;
}

std::optional<std::string> XmlReference(std::string_view name) {
  struct Entity {
    std::string_view name;
    char character;
  };
  constexpr auto kEntities = std::to_array<Entity>(
      {{"amp", '&'}, {"lt", '<'}, {"gt", '>'}, {"quot", '"'}, {"apos", '\''}});
  const auto* const entity = std::ranges::find(kEntities, name, &Entity::name);
  if (entity != kEntities.end()) return std::string(1, entity->character);
  if (!name.starts_with('#')) return std::nullopt;
  name.remove_prefix(1);
  const bool hexadecimal = name.starts_with('x');
  if (hexadecimal) name.remove_prefix(1);
  const auto code = ParseNumber<std::uint32_t>(name, hexadecimal ? 16 : 10);
  if (!code || !IsXmlCharacter(*code)) return std::nullopt;
  std::string out;
  AppendUtf8(out, *code);
  return out;
}

std::size_t XmlTextPrefix(std::string_view text) {
  for (std::size_t i = 0; i < text.size(); ++i) {
    i += PrintableAsciiPrefix(text.substr(i));
    if (i == text.size()) break;
    const auto byte = static_cast<unsigned char>(text[i]);
    if (byte < 0x20 && kXmlBlanks.find(text[i]) == std::string_view::npos) return i;
    // U+FFFE and U+FFFF.
    if (byte == 0xEF &&
        (text.substr(i, 3) == "\xEF\xBF\xBE" || text.substr(i, 3) == "\xEF\xBF\xBF")) {
      return i;
    }
  }
  return text.size();
}

std::string QuotedExcerpt(std::string_view text) {
  constexpr std::size_t kMost = 40;
  std::string_view shown = text.substr(0, kMost);
  // A character that was cut in two goes.
  if (text.size() > kMost) shown = shown.substr(0, ValidUtf8Prefix(shown));
  std::string out =
      FormatText("\"%s%s\"", RepairUtf8(shown), shown.size() < text.size() ? "…" : "");
  for (char& c : out) {
    if (static_cast<unsigned char>(c) < 0x20 || c == 0x7F) c = ' ';
  }
  return out;
}

}  // namespace quorlet
