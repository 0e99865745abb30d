// The value tree as JSON.
#ifndef QUORLET_PLATFORM_LINUX_BASE_PROPERTY_JSON_H_
#define QUORLET_PLATFORM_LINUX_BASE_PROPERTY_JSON_H_

#include <nlohmann/json.hpp>
#include <string>

#include "drvreport/property_value.h"

namespace quorlet {

// Data becomes a base64 string, a date an RFC 3339 string, a number that is not finite the string
// "nan", "inf" or "-inf"; integers keep all 64 bits. Containers nested deeper than a property list
// may be become null.
nlohmann::ordered_json PropertyJson(const PropertyValue& value);

// The text of `json` on one line, in ASCII; ill-formed UTF-8 becomes U+FFFD.
std::string JsonLine(const nlohmann::ordered_json& json);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_BASE_PROPERTY_JSON_H_
