#include "platform/os_version.h"

namespace quorlet {

std::string OSVersionText(OSVersion& osVersion) {
  const auto version = osVersion.CopySystemVersionDictionary();
  if (!version) return "unknown";
  std::string text;
  const auto add = [&](const char* key, const char* before, const char* after) {
    const std::string* part = StringEntry(*version, key);
    if (part == nullptr || part->empty()) return;
    if (!text.empty()) text += ' ';
    text += before + *part + after;
  };
  add("ProductName", "", "");
  add("ProductVersion", "", "");
  add("ProductBuildVersion", "(", ")");
  return text.empty() ? "unknown" : text;
}

}  // namespace quorlet
