#include "platform/preferences.h"

namespace quorlet {

bool Preferences::DGWPreferencesGetBoolValue(std::string_view key, std::string_view domain,
                                             bool& found) {
  const auto value = DGWPreferencesGetValue(key, domain);
  const bool* boolean = value ? value->asBoolean() : nullptr;
  found = boolean != nullptr;
  return found && *boolean;
}

std::optional<PropertyValue> Preferences::CopyPreferenceValue(std::string_view key,
                                                              std::string_view domain) {
  const auto value = DGWPreferencesGetValue(key, domain);
  return value ? std::optional(value->deepCopy()) : std::nullopt;
}

bool Preferences::GetPreferenceBool(std::string_view key, std::string_view domain, bool& exists) {
  const auto value = DGWPreferencesGetValue(key, domain);
  const Number* number = value ? value->asNumber() : nullptr;
  exists = number != nullptr || (value && value->asBoolean() != nullptr);
  return exists && (number != nullptr ? number->toDouble() != 0 : *value->asBoolean());
}

std::int64_t Preferences::DGWPreferencesGetIntegerValue(std::string_view key,
                                                        std::string_view domain) {
  const auto value = DGWPreferencesGetValue(key, domain);
  const Number* number = value ? value->asNumber() : nullptr;
  return number != nullptr ? number->toInt64() : 0;
}

}  // namespace quorlet
