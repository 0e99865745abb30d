#include "platform/linux/device/language_tag.h"

#include <algorithm>
#include <array>

namespace quorlet {
namespace {

constexpr bool IsLetter(char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'); }
constexpr bool IsDigit(char c) { return c >= '0' && c <= '9'; }
constexpr bool IsLetterOrDigit(char c) { return IsLetter(c) || IsDigit(c); }
constexpr char Lower(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }
constexpr char Upper(char c) { return c >= 'a' && c <= 'z' ? static_cast<char>(c - 'a' + 'A') : c; }

std::string Lowered(std::string_view text) {
  std::string lowered(text);
  std::ranges::transform(lowered, lowered.begin(), Lower);
  return lowered;
}

struct Modifier {
  std::string_view name;
  std::string_view script;
  std::string_view variant;
};

// The modifiers of locale names that say what a language tag can say.
constexpr auto kModifiers = std::to_array<Modifier>({
    {"latin", "Latn", ""},
    {"cyrillic", "Cyrl", ""},
    {"devanagari", "Deva", ""},
    {"valencia", "", "valencia"},
});

// Puts a subtag after the language where it belongs; false when it belongs nowhere.
bool TakeSubtag(std::string_view subtag, LanguageTag& tag) {
  const std::size_t size = subtag.size();
  const bool isLetters = std::ranges::all_of(subtag, IsLetter);
  if (size == 4 && isLetters && tag.script.empty() && tag.region.empty()) {
    tag.script = Lowered(subtag);
    tag.script.front() = Upper(tag.script.front());
    return true;
  }
  const bool isRegion =
      (size == 2 && isLetters) || (size == 3 && std::ranges::all_of(subtag, IsDigit));
  if (isRegion && tag.region.empty()) {
    tag.region = subtag;
    std::ranges::transform(tag.region, tag.region.begin(), Upper);
    return true;
  }
  const bool isVariant = (size >= 5 && size <= 8) || (size == 4 && IsDigit(subtag.front()));
  if (isVariant && std::ranges::all_of(subtag, IsLetterOrDigit) && tag.variant.empty()) {
    tag.variant = Lowered(subtag);
    return true;
  }
  return false;
}

}  // namespace

std::string LanguageTag::text() const {
  std::string text = language;
  for (const std::string& part : {script, region, variant}) {
    if (!part.empty()) text += "-" + part;
  }
  return text;
}

std::optional<LanguageTag> ParseLocaleName(std::string_view name) {
  const std::size_t at = name.find('@');
  const std::string modifier = Lowered(at == name.npos ? "" : name.substr(at + 1));
  std::string_view rest = name.substr(0, std::min(at, name.find('.')));
  if (rest == "C" || rest == "POSIX") return std::nullopt;

  LanguageTag tag;
  bool first = true;
  while (first || !rest.empty()) {
    const std::string_view subtag = rest.substr(0, rest.find_first_of("_-"));
    rest.remove_prefix(std::min(rest.size(), subtag.size() + 1));
    if (first) {
      const bool isLanguage =
          subtag.size() >= 2 && subtag.size() <= 3 && std::ranges::all_of(subtag, IsLetter);
      if (!isLanguage) return std::nullopt;
      tag.language = Lowered(subtag);
      first = false;
    } else if (!TakeSubtag(subtag, tag)) {
      return std::nullopt;
    }
  }
  const auto known = std::ranges::find(kModifiers, modifier, &Modifier::name);
  if (known != kModifiers.end()) {
    if (tag.script.empty()) tag.script = known->script;
    if (tag.variant.empty()) tag.variant = known->variant;
  }
  return tag;
}

std::vector<std::string> LookUpLanguages(const std::vector<std::string>& available,
                                         const std::vector<std::string>& preferred) {
  std::vector<std::string> chosen;
  for (const std::string& language : preferred) {
    std::string range = Lowered(language);
    while (!range.empty()) {
      const auto match = std::ranges::find(available, range, Lowered);
      if (match != available.end()) {
        if (std::ranges::find(chosen, *match) == chosen.end()) chosen.push_back(*match);
        break;
      }
      // Without its last subtag, and without a single letter that introduced it.
      const std::size_t end = range.rfind('-');
      range.resize(end == range.npos ? 0 : end);
      if (range.size() >= 2 && range[range.size() - 2] == '-') range.resize(range.size() - 2);
    }
  }
  return chosen;
}

}  // namespace quorlet
