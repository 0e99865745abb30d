#include "platform/preferences.h"

namespace quorlet {

bool Preferences::DGWPreferencesGetBoolValue(std::string_view key, std::string_view domain,
                                             bool& found) {
  const auto value = DGWPreferencesGetValue(key, domain);
  const bool* boolean = value ? value->asBoolean() : nullptr;
  found = boolean != nullptr;
  return found && *boolean;
}

std::int64_t Preferences::DGWPreferencesGetIntegerValue(std::string_view key,
                                                        std::string_view domain) {
  const auto value = DGWPreferencesGetValue(key, domain);
  const Number* number = value ? value->asNumber() : nullptr;
  return number != nullptr ? number->toInt64() : 0;
}

}  // namespace quorlet
