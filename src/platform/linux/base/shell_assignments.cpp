#include "platform/linux/base/shell_assignments.h"

#include <algorithm>
#include <optional>

#include "values/text.h"

namespace quorlet {
namespace {

constexpr std::string_view kBlanks = " \t\r";

bool IsName(std::string_view name) {
  const auto isNameByte = [](char c) {
    return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '_';
  };
  return !name.empty() && !(name.front() >= '0' && name.front() <= '9') &&
         std::ranges::all_of(name, isNameByte);
}

// Takes a quoted part, from after the opening quote to after the closing one, off the front of
// `rest`; false when the closing quote is missing.
bool TakeQuoted(char quote, std::string_view& rest, std::string& value) {
  for (std::size_t i = 0; i < rest.size(); ++i) {
    if (rest[i] == quote) {
      rest.remove_prefix(i + 1);
      return true;
    }
    // Inside double quotes a backslash takes away the meaning of these only.
    const bool escapes = quote == '"' && rest[i] == '\\' && i + 1 < rest.size() &&
                         std::string_view("\"\\$`").find(rest[i + 1]) != std::string_view::npos;
    value += rest[escapes ? ++i : i];
  }
  return false;
}

// The value that `rest`, what follows the "=", stands for; nothing when a quote is not closed.
std::optional<std::string> ParseValue(std::string_view rest) {
  rest.remove_prefix(std::min(rest.size(), rest.find_first_not_of(kBlanks)));
  std::string value;
  std::size_t kept = 0;  // blanks at the end count only when they are quoted or escaped
  while (!rest.empty()) {
    const char c = rest.front();
    const bool afterBlank = kept < value.size();
    if (c == '#' && afterBlank) break;
    rest.remove_prefix(1);
    if (c == '"' || c == '\'') {
      if (!TakeQuoted(c, rest, value)) return std::nullopt;
      kept = value.size();
      continue;
    }
    const bool escaped = c == '\\' && !rest.empty();
    value += escaped ? rest.front() : c;
    if (escaped) rest.remove_prefix(1);
    if (escaped || kBlanks.find(c) == std::string_view::npos) kept = value.size();
  }
  value.resize(kept);
  return value;
}

}  // namespace

ShellAssignments ParseShellAssignments(std::string_view text) {
  ShellAssignments assignments;
  while (!text.empty()) {
    std::string_view line = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(text.size(), line.size() + 1));
    line.remove_prefix(std::min(line.size(), line.find_first_not_of(kBlanks)));
    const std::size_t equals = line.find('=');
    if (equals == std::string_view::npos || !IsName(line.substr(0, equals))) continue;
    if (const auto value = ParseValue(line.substr(equals + 1))) {
      assignments.insert_or_assign(std::string(line.substr(0, equals)), RepairUtf8(*value));
    }
  }
  return assignments;
}

}  // namespace quorlet
