// BCP 47 language tags.
#ifndef QUORLET_PLATFORM_LINUX_DEVICE_LANGUAGE_TAG_H_
#define QUORLET_PLATFORM_LINUX_DEVICE_LANGUAGE_TAG_H_

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace quorlet {

struct LanguageTag {
  std::string language;  // "sr"
  std::string script;    // "Latn", or empty
  std::string region;    // "RS" or "419", or empty
  std::string variant;   // "valencia", or empty

  // "sr-Latn-RS"
  std::string text() const;
};

// The tag of a locale name such as "de_AT.UTF-8" or "sr_RS@latin", or of a tag in any letter case;
// nothing for "C" and "POSIX" and for what is no language. A modifier that names no script or
// variant is dropped.
std::optional<LanguageTag> ParseLocaleName(std::string_view name);

// The members of `available` found by RFC 4647 lookup, one for each range of `preferred` that has
// one, without repetition.
std::vector<std::string> LookUpLanguages(const std::vector<std::string>& available,
                                         const std::vector<std::string>& preferred);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_DEVICE_LANGUAGE_TAG_H_
