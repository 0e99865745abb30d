#include "ctl/output.h"

#include <array>
#include <cerrno>
#include <charconv>
#include <cstdio>

#include "values/text.h"

namespace quorlet {
namespace {

// The length of the UTF-8 sequence that starts `text`, judged by its first byte alone.
std::size_t SequenceLength(std::string_view text) {
  const auto first = static_cast<unsigned char>(text.front());
  const std::size_t length = first < 0x80 ? 1 : first < 0xE0 ? 2 : first < 0xF0 ? 3 : 4;
  return length < text.size() ? length : text.size();
}

bool IsPlain(std::string_view sequence) {
  const auto first = static_cast<unsigned char>(sequence.front());
  if (sequence.size() == 1) return first >= 0x20 && first < 0x7F && first != '\\';
  // C2 80 to C2 9F are the C1 controls, which terminals obey.
  if (first == 0xC2 && static_cast<unsigned char>(sequence[1]) < 0xA0) return false;
  return IsValidUtf8(sequence);
}

void AppendEscaped(char byte, std::string& escaped) {
  constexpr std::string_view kDigits = "0123456789abcdef";
  switch (byte) {
    case '\t':
      escaped += "\\t";
      return;
    case '\n':
      escaped += "\\n";
      return;
    case '\r':
      escaped += "\\r";
      return;
    case '\\':
      escaped += "\\\\";
      return;
    default:
      escaped += "\\x";
      escaped += kDigits[static_cast<unsigned char>(byte) >> 4];
      escaped += kDigits[static_cast<unsigned char>(byte) & 15];
  }
}

int HexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

}  // namespace

void Output::write(std::string_view bytes) {
  if (error_ != 0 || bytes.empty()) return;
  if (std::fwrite(bytes.data(), 1, bytes.size(), stdout) != bytes.size()) error_ = errno;
}

void Output::line(std::string_view text) {
  write(text);
  write("\n");
}

bool Output::finish() {
  if (std::fflush(stdout) != 0 && error_ == 0) error_ = errno;
  return error_ == 0;
}

std::string Escape(std::string_view text) {
  std::string escaped;
  escaped.reserve(text.size());
  while (!text.empty()) {
    const std::size_t length = SequenceLength(text);
    if (IsPlain(text.substr(0, length))) {
      escaped += text.substr(0, length);
      text.remove_prefix(length);
    } else {
      AppendEscaped(text.front(), escaped);
      text.remove_prefix(1);
    }
  }
  return escaped;
}

std::optional<std::string> Unescape(std::string_view text) {
  std::string bytes;
  bytes.reserve(text.size());
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '\\') {
      bytes += text[i];
      continue;
    }
    if (++i == text.size()) return std::nullopt;
    switch (text[i]) {
      case 't':
        bytes += '\t';
        break;
      case 'n':
        bytes += '\n';
        break;
      case 'r':
        bytes += '\r';
        break;
      case '\\':
        bytes += '\\';
        break;
      case 'x': {
        if (text.size() - i < 3) return std::nullopt;
        const int high = HexDigit(text[i + 1]);
        const int low = HexDigit(text[i + 2]);
        if (high < 0 || low < 0) return std::nullopt;
        bytes += static_cast<char>(high * 16 + low);
        i += 2;
        break;
      }
      default:
        return std::nullopt;
    }
  }
  return bytes;
}

std::string Hexadecimal(std::uint64_t number) {
  std::array<char, 16> digits{};
  const auto [end, error] = std::to_chars(digits.begin(), digits.end(), number, 16);
  return "0x" + std::string(digits.begin(), end);
}

std::string Counted(std::size_t count, std::string_view noun) {
  std::string text = std::to_string(count) + " ";
  if (count == 1) return text.append(noun);
  if (noun.ends_with("ry")) return text.append(noun.substr(0, noun.size() - 1)).append("ies");
  return text.append(noun).append(noun.ends_with("x") ? "es" : "s");
}

}  // namespace quorlet
