#include "ctl/output.h"

#include <array>
#include <cerrno>
#include <cstdio>

#include "values/digits.h"
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
      AppendHex(escaped, byte);
  }
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
        const auto byte = ParseNumber<std::uint8_t>(text.substr(i + 1, 2), 16);
        if (!byte) return std::nullopt;
        bytes += static_cast<char>(*byte);
        i += 2;
        break;
      }
      default:
        return std::nullopt;
    }
  }
  return bytes;
}

std::string Hexadecimal(std::uint64_t number) { return "0x" + HexNumber(number); }

std::string Counted(std::uint64_t count, std::string_view noun) {
  std::string text = std::to_string(count) + " ";
  if (count == 1) return text.append(noun);
  if (noun.ends_with("ry")) return text.append(noun.substr(0, noun.size() - 1)).append("ies");
  return text.append(noun).append(noun.ends_with("x") ? "es" : "s");
}

}  // namespace quorlet
