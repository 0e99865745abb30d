#include "storage/format_text.h"

#include <algorithm>
#include <charconv>

namespace quorlet {
namespace {

struct Conversion {
  std::size_t length = 0;  // in the format text, from the percent sign on
  std::string_view flags;
  std::size_t width = 0;
  std::optional<std::size_t> precision;
  char kind = 0;

  bool has(char flag) const { return flags.find(flag) != std::string_view::npos; }
};

// Up to three digits, which leave `text`; a fourth stays and spoils the conversion.
std::size_t TakeDigits(std::string_view& text) {
  std::size_t value = 0;
  for (int i = 0; i < 3 && !text.empty() && text.front() >= '0' && text.front() <= '9'; ++i) {
    value = value * 10 + static_cast<std::size_t>(text.front() - '0');
    text.remove_prefix(1);
  }
  return value;
}

// Every number is one of 32 bits here, whatever length the text says.
void SkipLengthModifier(std::string_view& text) {
  for (const std::string_view modifier : {"hh", "h", "ll", "l", "z", "j", "t", "L"}) {
    if (!text.starts_with(modifier)) continue;
    text.remove_prefix(modifier.size());
    return;
  }
}

// The conversion that `format` starts with, if it is one of `kinds`.
std::optional<Conversion> ReadConversion(std::string_view format, std::string_view kinds) {
  Conversion conversion;
  std::string_view rest = format.substr(1);
  conversion.flags = rest.substr(0, rest.find_first_not_of("-+ #0"));
  rest.remove_prefix(conversion.flags.size());
  conversion.width = TakeDigits(rest);
  if (rest.starts_with('.')) {
    rest.remove_prefix(1);
    conversion.precision = TakeDigits(rest);
  }
  SkipLengthModifier(rest);
  if (rest.empty() || kinds.find(rest.front()) == std::string_view::npos) return std::nullopt;
  conversion.kind = rest.front();
  conversion.length = format.size() - rest.size() + 1;
  return conversion;
}

void AppendPadded(BoundedText& out, const Conversion& conversion, std::string_view prefix,
                  std::size_t zeros, std::string_view body) {
  const std::size_t length = prefix.size() + zeros + body.size();
  const std::size_t padding = conversion.width > length ? conversion.width - length : 0;
  if (!conversion.has('-')) out.append(padding, ' ');
  out.append(prefix);
  out.append(zeros, '0');
  out.append(body);
  if (conversion.has('-')) out.append(padding, ' ');
}

void AppendNumber(BoundedText& out, const Conversion& conversion, std::uint32_t value) {
  const bool isSigned = conversion.kind == 'd' || conversion.kind == 'i';
  const bool isHexadecimal = conversion.kind == 'x' || conversion.kind == 'X';
  const bool isOctal = conversion.kind == 'o';
  std::string_view prefix;
  if (isSigned) {
    const auto signedValue = static_cast<std::int32_t>(value);
    if (signedValue < 0) value = 0 - value;
    prefix = signedValue < 0 ? "-" : conversion.has('+') ? "+" : conversion.has(' ') ? " " : "";
  } else if (isHexadecimal && conversion.has('#') && value != 0) {
    prefix = conversion.kind == 'X' ? "0X" : "0x";
  }
  char buffer[12];  // a zero and a u32 in octal
  buffer[0] = '0';
  char* const first = buffer + 1;
  char* const end = std::to_chars(first, std::end(buffer), value,
                                  isHexadecimal ? 16
                                  : isOctal     ? 8
                                                : 10)
                        .ptr;
  if (conversion.kind == 'X') {
    std::transform(first, end, first, [](char c) {
      return c >= 'a' && c <= 'f' ? static_cast<char>(c - 'a' + 'A') : c;
    });
  }
  std::string_view digits(first, end);
  if (value == 0 && conversion.precision == std::size_t{0}) digits = {};
  // The flag "#" makes an octal number start with a zero, if need be by a digit more.
  if (isOctal && conversion.has('#') && !digits.starts_with('0') &&
      conversion.precision.value_or(0) <= digits.size()) {
    digits = std::string_view(buffer, digits.size() + 1);
  }
  // A precision or left-alignment switches the flag "0" off.
  const bool zeroFilled = conversion.has('0') && !conversion.has('-') && !conversion.precision;
  const std::size_t wanted = zeroFilled
                                 ? conversion.width - std::min(conversion.width, prefix.size())
                                 : conversion.precision.value_or(0);
  AppendPadded(out, conversion, prefix, wanted - std::min(wanted, digits.size()), digits);
}

// Copies `format`, but has `fill` append for its first `count` conversions of `kinds`.
template <typename Fill>
void AppendFilled(BoundedText& out, std::string_view format, std::string_view kinds,
                  std::size_t count, Fill fill) {
  std::size_t filled = 0;
  while (!format.empty()) {
    const std::size_t plain = std::min(format.find('%'), format.size());
    out.append(format.substr(0, plain));
    format.remove_prefix(plain);
    if (format.empty()) return;
    const bool isPercentSign = format.starts_with("%%");
    const auto conversion =
        isPercentSign || filled == count ? std::nullopt : ReadConversion(format, kinds);
    if (conversion) {
      fill(*conversion, filled++);
      format.remove_prefix(conversion->length);
    } else {
      out.append("%");
      format.remove_prefix(isPercentSign ? 2 : 1);
    }
  }
}

}  // namespace

void AppendFormatted(BoundedText& out, std::string_view format,
                     std::span<const std::uint32_t> numbers) {
  AppendFilled(out, format, "udixXo", numbers.size(),
               [&](const Conversion& conversion, std::size_t i) {
                 AppendNumber(out, conversion, numbers[i]);
               });
}

void AppendFormatted(BoundedText& out, std::string_view format, std::string_view text) {
  AppendFilled(out, format, "s", 1, [&](const Conversion& conversion, std::size_t) {
    AppendPadded(out, conversion, {}, 0,
                 text.substr(0, conversion.precision.value_or(text.size())));
  });
}

}  // namespace quorlet
