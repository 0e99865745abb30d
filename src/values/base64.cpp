#include "values/base64.h"

#include <nettle/base64.h>

#include <cstdint>

namespace quorlet {
namespace {

// The six bits that a digit stands for, or 64.
std::uint32_t Base64Bits(char c) {
  constexpr std::string_view kDigits =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  const std::size_t found = kDigits.find(c);
  return found == std::string_view::npos ? 64 : static_cast<std::uint32_t>(found);
}

}  // namespace

std::string Base64Text(const Data& data) {
  std::string text(BASE64_ENCODE_RAW_LENGTH(data.size()), '\0');
  base64_encode_raw(text.data(), data.size(), reinterpret_cast<const std::uint8_t*>(data.data()));
  return text;
}

// Not nettle's decoder, which takes a text whose padding is not where it belongs.
std::optional<Data> DataFromBase64(std::string_view text) {
  Data data;
  data.reserve(text.size() / 4 * 3);
  std::uint32_t bits = 0;  // of the group of four digits
  std::size_t digits = 0;
  std::size_t padding = 0;
  for (const char c : text) {
    if (c == ' ' || c == '\t' || c == '\r' || c == '\n') continue;
    const bool isPadding = c == '=' && digits % 4 >= 2;
    const std::uint32_t value = isPadding ? 0 : Base64Bits(c);
    if (value > 63 || padding > (isPadding ? 1 : 0) || (padding == 1 && !isPadding)) {
      return std::nullopt;
    }
    if (isPadding) ++padding;
    bits = bits << 6 | value;
    if (++digits % 4 != 0) continue;
    for (const unsigned shift : {16U, 8U, 0U}) data.push_back(std::byte(bits >> shift & 0xFF));
  }
  if (digits % 4 != 0) return std::nullopt;
  data.resize(data.size() - padding);
  return data;
}

}  // namespace quorlet
