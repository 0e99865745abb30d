// Numbers and bytes as text, and back.
#ifndef QUORLET_VALUES_DIGITS_H_
#define QUORLET_VALUES_DIGITS_H_

#include <charconv>
#include <concepts>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <system_error>

namespace quorlet {

// The whole text as a number (a real: also "1e9", "inf", "nan"), or nothing when it is not one or
// does not fit. No blanks, no "+", no "0x".
template <typename T>
requires std::integral<T> || std::floating_point<T> std::optional<T> ParseNumber(
    std::string_view text, int base = 10) {
  T value{};
  const char* const end = text.data() + text.size();
  std::from_chars_result result{};
  if constexpr (std::integral<T>) {
    result = std::from_chars(text.data(), end, value, base);
  } else {
    result = std::from_chars(text.data(), end, value);
  }
  if (result.ec != std::errc{} || result.ptr != end) return std::nullopt;
  return value;
}

inline constexpr std::string_view kLowerDigits = "0123456789abcdef";
inline constexpr std::string_view kUpperDigits = "0123456789ABCDEF";

// Two hexadecimal digits.
inline void AppendHex(std::string& out, std::byte byte, std::string_view digits = kLowerDigits) {
  out += digits[std::to_integer<std::size_t>(byte >> 4)];
  out += digits[std::to_integer<std::size_t>(byte & std::byte{15})];
}
inline void AppendHex(std::string& out, char byte) { AppendHex(out, static_cast<std::byte>(byte)); }

// "1f"; no prefix.
inline std::string HexNumber(std::uint64_t number) {
  char text[16];
  return {text, std::to_chars(std::begin(text), std::end(text), number, 16).ptr};
}

inline constexpr std::size_t kUuidBytes = 16;

// "1B4E28BA-2FA1-11D2-883F-B9A761BDE3FB"
inline std::string UuidText(std::span<const std::byte, kUuidBytes> uuid) {
  std::string text;
  for (const std::byte byte : uuid) {
    if (text.size() == 8 || text.size() == 13 || text.size() == 18 || text.size() == 23)
      text += '-';
    AppendHex(text, byte, kUpperDigits);
  }
  return text;
}

}  // namespace quorlet

#endif  // QUORLET_VALUES_DIGITS_H_
