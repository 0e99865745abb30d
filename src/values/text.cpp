// Message formatting, UTF-8 repair and dates.
#include "values/text.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cmath>

#include "values/digits.h"

namespace quorlet {
namespace {

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";  // U+FFFD

struct Sequence {
  std::size_t length = 1;
  bool valid = false;
};

// What `text`, which is not empty, begins with: a well-formed sequence, or the longest run of bytes
// that could have begun one (at least one byte).
Sequence FirstSequence(std::string_view text) {
  const auto byteAt = [text](std::size_t i) { return static_cast<unsigned char>(text[i]); };
  const unsigned lead = byteAt(0);
  if (lead < 0x80) return {1, true};
  if (lead < 0xC2 || lead > 0xF4) return {1, false};
  const std::size_t wanted = lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4;
  // The second byte's range keeps out overlong forms, surrogates and what lies above U+10FFFF.
  unsigned low = lead == 0xE0 ? 0xA0 : lead == 0xF0 ? 0x90 : 0x80;
  unsigned high = lead == 0xED ? 0x9F : lead == 0xF4 ? 0x8F : 0xBF;
  for (std::size_t length = 1; length < wanted; ++length) {
    if (length == text.size() || byteAt(length) < low || byteAt(length) > high) {
      return {length, false};
    }
    low = 0x80;
    high = 0xBF;
  }
  return {wanted, true};
}

void AppendPadded(std::string& out, unsigned number, std::size_t width) {
  const std::string digits = std::to_string(number);
  out.append(width - std::min(width, digits.size()), '0');
  out += digits;
}

}  // namespace

std::string FormatMessage(std::string_view text, std::span<const MessageArgument> arguments) {
  std::string out;
  out.reserve(text.size() + 32);
  std::size_t next = 0;
  while (!text.empty()) {
    const std::size_t plain = std::min(text.find('%'), text.size());
    out += text.substr(0, plain);
    text.remove_prefix(plain);
    if (text.empty()) break;
    const std::size_t length = ConversionLength(text);
    if (length != 0 && next < arguments.size()) {
      out += arguments[next++].text();
      text.remove_prefix(length);
    } else {
      // "%%", or a conversion without an argument, which is printed as it stands.
      out += '%';
      text.remove_prefix(text.starts_with("%%") ? 2 : 1);
    }
  }
  return out;
}

std::size_t PrintableAsciiPrefix(std::string_view text) {
  std::size_t at = 0;
  // Most text is plain ASCII: eight bytes at a time, without a branch for each.
  for (; text.size() - at >= 8; at += 8) {
    unsigned odd = 0;
    for (std::size_t i = 0; i < 8; ++i) {
      const auto byte = static_cast<unsigned char>(text[at + i]);
      odd |= static_cast<unsigned>(byte < 0x20) | static_cast<unsigned>(byte > 0x7E);
    }
    if (odd != 0) break;
  }
  while (at < text.size() && text[at] >= 0x20 && text[at] <= 0x7E) ++at;
  return at;
}

std::size_t ValidUtf8Prefix(std::string_view text) {
  std::size_t at = 0;
  while (true) {
    while (at < text.size() && static_cast<unsigned char>(text[at]) < 0x80) ++at;
    if (at == text.size()) break;
    const Sequence sequence = FirstSequence(text.substr(at));
    if (!sequence.valid) break;
    at += sequence.length;
  }
  return at;
}

bool IsValidUtf8(std::string_view text) { return ValidUtf8Prefix(text) == text.size(); }

std::string RepairUtf8(std::string_view text) {
  if (PrintableAsciiPrefix(text) == text.size()) return std::string(text);
  std::string out;
  out.reserve(text.size());
  while (!text.empty()) {
    const std::size_t valid = ValidUtf8Prefix(text);
    out += text.substr(0, valid);
    text.remove_prefix(valid);
    if (text.empty()) break;
    out += kReplacement;
    text.remove_prefix(FirstSequence(text).length);
  }
  return out;
}

void AppendUtf8(std::string& out, std::uint32_t c) {
  const auto put = [&out](std::uint32_t byte) { out += static_cast<char>(byte); };
  if (c < 0x80) {
    put(c);
    return;
  }
  const unsigned more = c < 0x800 ? 1 : c < 0x10000 ? 2 : 3;
  constexpr std::array<std::uint32_t, 4> kLeads = {0, 0xC0, 0xE0, 0xF0};
  put(kLeads[more] | c >> (6 * more));
  for (unsigned i = more; i-- > 0;) put(0x80 | (c >> (6 * i) & 0x3F));
}

std::optional<std::int32_t> ParseDate(std::string_view text) {
  if (text.size() != 10 || text[4] != '-' || text[7] != '-') return std::nullopt;
  const auto number = [&](std::size_t at, std::size_t size) -> std::optional<unsigned> {
    return ParseNumber<unsigned>(text.substr(at, size));
  };
  const auto year = number(0, 4);
  const auto month = number(5, 2);
  const auto day = number(8, 2);
  if (!year || !month || !day) return std::nullopt;
  const std::chrono::year_month_day date{std::chrono::year(static_cast<int>(*year)),
                                         std::chrono::month(*month), std::chrono::day(*day)};
  if (!date.ok()) return std::nullopt;
  return static_cast<std::int32_t>(std::chrono::sys_days(date).time_since_epoch().count());
}

std::string Rfc3339(Date date) {
  using std::chrono::days;
  using std::chrono::seconds;
  using std::chrono::sys_days;
  using std::chrono::sys_seconds;
  using std::chrono::year;
  constexpr sys_seconds kFirst = sys_days(year(0) / 1 / 1);
  constexpr sys_seconds kLast = sys_days(year(10000) / 1 / 1) - seconds(1);
  const double wanted = std::isnan(date.secondsSince1970) ? 0 : std::floor(date.secondsSince1970);
  const double clamped = std::clamp(wanted, static_cast<double>(kFirst.time_since_epoch().count()),
                                    static_cast<double>(kLast.time_since_epoch().count()));
  const sys_seconds instant{seconds(static_cast<std::int64_t>(clamped))};
  const sys_days day = std::chrono::floor<days>(instant);
  const std::chrono::year_month_day civil(day);
  const std::chrono::hh_mm_ss time(instant - day);

  std::string out;
  AppendPadded(out, static_cast<unsigned>(static_cast<int>(civil.year())), 4);
  out += '-';
  AppendPadded(out, static_cast<unsigned>(civil.month()), 2);
  out += '-';
  AppendPadded(out, static_cast<unsigned>(civil.day()), 2);
  out += 'T';
  AppendPadded(out, static_cast<unsigned>(time.hours().count()), 2);
  out += ':';
  AppendPadded(out, static_cast<unsigned>(time.minutes().count()), 2);
  out += ':';
  AppendPadded(out, static_cast<unsigned>(time.seconds().count()), 2);
  out += 'Z';
  return out;
}

}  // namespace quorlet
