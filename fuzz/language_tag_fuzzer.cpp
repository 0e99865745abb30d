// Any locale name gives nothing or a tag that gives itself, and what a look-up finds is available.
#include <algorithm>

#include "fuzz_support.h"
#include "platform/linux/device/language_tag.h"

namespace quorlet {
namespace {

void CheckName(std::string_view name) {
  const auto tag = ParseLocaleName(name);
  if (!tag) return;
  const std::string text = tag->text();
  Expect(text.size() <= 3 + 5 + 4 + 9, "a tag is too long", text);
  Expect(
      text.find_first_not_of("abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789-") ==
          std::string::npos,
      "a tag of other characters", text);
  const auto again = ParseLocaleName(text);
  Expect(again && again->text() == text && again->language == tag->language &&
             again->region == tag->region,
         "a tag has changed", text);
}

std::vector<std::string> Lines(std::string_view text) {
  std::vector<std::string> lines;
  while (!text.empty()) {
    lines.emplace_back(text.substr(0, text.find('\n')));
    text.remove_prefix(std::min(text.size(), lines.back().size() + 1));
  }
  return lines;
}

}  // namespace
}  // namespace quorlet

// The available languages, one a line, and after a NUL byte the preferred ones.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  const auto parts = Parts(AsText(data, size), 2);
  const auto available = Lines(parts[0]);
  const auto preferred = Lines(parts[1]);
  for (const auto* names : {&available, &preferred}) {
    for (const std::string& name : *names) CheckName(name);
  }
  auto chosen = LookUpLanguages(available, preferred);
  Expect(chosen == LookUpLanguages(available, preferred), "others the second time");
  Expect(chosen.size() <= preferred.size(), "more than were asked for");
  // What is preferred and there is found.
  for (const std::string& language : preferred) {
    if (language.empty() || std::ranges::find(available, language) == available.end()) continue;
    Expect(!chosen.empty(), "an available language is not found", language);
  }
  std::ranges::sort(chosen);
  Expect(std::ranges::adjacent_find(chosen) == chosen.end(), "a language twice");
  for (const std::string& language : chosen) {
    Expect(std::ranges::find(available, language) != available.end(), "not available", language);
  }
  return 0;
}
