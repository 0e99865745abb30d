// Languages and region. Languages are BCP 47 tags, most preferred first.
#ifndef QUORLET_PLATFORM_LOCALE_H_
#define QUORLET_PLATFORM_LOCALE_H_

#include <optional>
#include <string>
#include <vector>

namespace quorlet {

class LocaleService {
 public:
  virtual ~LocaleService() = default;

  // The languages that the user prefers.
  virtual std::vector<std::string> PreferredLanguages() = 0;

  // The languages that the system has.
  virtual std::vector<std::string> SystemLanguages() = 0;

  // The members of `available` that serve `preferred`, best first.
  virtual std::vector<std::string> PreferredLocalizations(
      const std::vector<std::string>& available, const std::vector<std::string>& preferred) = 0;

  // The region (country) code of the current locale, or nothing.
  virtual std::optional<std::string> CurrentRegionCode() = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LOCALE_H_
