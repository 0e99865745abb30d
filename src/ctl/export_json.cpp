#include "ctl/export_json.h"

#include <charconv>
#include <cmath>

#include "values/digits.h"
#include "values/text.h"

namespace quorlet {
namespace {

template <typename T>
void AppendDigits(std::string& json, T number) {
  char digits[32];
  json.append(digits, std::to_chars(std::begin(digits), std::end(digits), number).ptr);
}

void AppendEscaped(std::string& json, char c) {
  if (c == '"' || c == '\\') {
    (json += '\\') += c;
  } else if (c == '\n') {
    json += "\\n";
  } else {
    json += "\\u00";
    AppendHex(json, c);
  }
}

bool NeedsEscape(char c) { return static_cast<unsigned char>(c) < 0x20 || c == '"' || c == '\\'; }

void AppendUtf8Text(std::string& json, std::string_view text) {
  std::size_t plain = 0;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (!NeedsEscape(text[i])) continue;
    json += text.substr(plain, i - plain);
    AppendEscaped(json, text[i]);
    plain = i + 1;
  }
  json += text.substr(plain);
}

}  // namespace

void AppendJsonString(std::string& json, std::string_view text) {
  json += '"';
  if (PrintableAsciiPrefix(text) == text.size() || IsValidUtf8(text)) {
    AppendUtf8Text(json, text);
  } else {
    AppendUtf8Text(json, RepairUtf8(text));
  }
  json += '"';
}

void AppendJsonNumber(std::string& json, double number) {
  if (std::isfinite(number)) {
    AppendDigits(json, number);
  } else {
    json += "null";
  }
}

void AppendJsonNumber(std::string& json, const Number& number) {
  if (number.isReal()) {
    AppendJsonNumber(json, number.toDouble());
  } else if (number.kind() == NumberKind::kUInt64) {
    AppendDigits(json, number.toUInt64());
  } else {
    AppendDigits(json, number.toInt64());
  }
}

void AppendDecimal(std::string& json, std::uint64_t number) { AppendDigits(json, number); }

bool IsFinite(const Number& number) { return !number.isReal() || std::isfinite(number.toDouble()); }

}  // namespace quorlet
