// Text: type-safe message formatting, UTF-8 repair, dates.
#ifndef QUORLET_VALUES_TEXT_H_
#define QUORLET_VALUES_TEXT_H_

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>

#include "drvreport/property_value.h"

namespace quorlet {

// One argument of a message; refers to what it was made from.
class MessageArgument {
 public:
  MessageArgument(std::string_view text) : text_(text) {}
  MessageArgument(const std::string& text) : text_(text) {}
  MessageArgument(const char* text) : text_(text) {}
  MessageArgument(const PropertyValue& value) : owned_(value.description()), text_(*owned_) {}
  // An absent value prints as "(null)".
  MessageArgument(const std::optional<std::string>& text)
      : text_(text ? std::string_view(*text) : "(null)") {}
  template <std::integral T>
  MessageArgument(T number) : owned_(std::to_string(number)), text_(*owned_) {}
  MessageArgument(const MessageArgument&) = delete;
  MessageArgument& operator=(const MessageArgument&) = delete;

  std::string_view text() const { return text_; }

 private:
  std::optional<std::string> owned_;
  std::string_view text_;
};

// The conversions of a message text: "%@", "%{public}@", "%s", "%d", "%u", "%llu", "%lld"; "%%" is
// a percent sign. All of them print their argument's text.
constexpr std::size_t ConversionLength(std::string_view fromPercent) {
  for (std::string_view conversion : {"%@", "%{public}@", "%s", "%d", "%u", "%llu", "%lld"}) {
    if (fromPercent.substr(0, conversion.size()) == conversion) return conversion.size();
  }
  return 0;
}

// A message text whose conversions are counted by the compiler.
template <typename... Arguments>
struct BasicMessage {
  consteval BasicMessage(const char* literal) : text(literal) {
    std::size_t conversions = 0;
    for (std::size_t i = 0; i < text.size(); ++i) {
      if (text[i] != '%') continue;
      if (text.substr(i, 2) == "%%") {
        ++i;
        continue;
      }
      if (ConversionLength(text.substr(i)) == 0) throw "unknown conversion";
      ++conversions;
    }
    if (conversions != sizeof...(Arguments)) throw "wrong number of arguments";
  }
  std::string_view text;
};
template <typename... Arguments>
using Message = BasicMessage<std::type_identity_t<Arguments>...>;

std::string FormatMessage(std::string_view text, std::span<const MessageArgument> arguments);

// FormatText("line %d: %@", 3, reason)
template <typename... Arguments>
std::string FormatText(Message<Arguments...> message, const Arguments&... arguments) {
  if constexpr (sizeof...(Arguments) == 0) {
    return FormatMessage(message.text, {});
  } else {
    const MessageArgument list[] = {MessageArgument(arguments)...};
    return FormatMessage(message.text, list);
  }
}

// `text` with every ill-formed UTF-8 sequence replaced by U+FFFD (one for each maximal subpart).
std::string RepairUtf8(std::string_view text);
// Appends a character, which must be one: below 0x110000 and no surrogate.
void AppendUtf8(std::string& out, std::uint32_t character);
// How many bytes at the start of `text` are printable ASCII.
std::size_t PrintableAsciiPrefix(std::string_view text);
bool IsValidUtf8(std::string_view text);
// How many bytes of `text` come before the first ill-formed sequence; text.size() without one.
std::size_t ValidUtf8Prefix(std::string_view text);

// "2026-03-04T05:06:07Z"; fractions are dropped. Years outside 0 to 9999 are clamped.
std::string Rfc3339(Date date);
// The number of the day, counted from 1970-01-01, that "2026-03-04" names; nothing for a text of
// another form and for a day that the calendar does not have.
std::optional<std::int32_t> ParseDate(std::string_view text);

}  // namespace quorlet

#endif  // QUORLET_VALUES_TEXT_H_
