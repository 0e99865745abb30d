// Property values as JSON, both ways.
#ifndef QUORLET_CTL_JSON_VALUE_H_
#define QUORLET_CTL_JSON_VALUE_H_

#include <string>
#include <string_view>
#include <variant>

#include "drvreport/property_value.h"

namespace quorlet {

// JSON has neither dates nor data. kPlain: an RFC 3339 text, a base64 text. kTagged: the same under
// a name of its own, {"$date": "2026-03-04T05:06:07Z"} and {"$data": "AAEC"}, so that they can be
// read back. Numbers that are not finite become "nan", "inf" and "-inf".
enum class JsonForm { kPlain, kTagged };

// One line of valid JSON in ASCII, whatever bytes the strings hold.
std::string JsonText(const PropertyValue& value, JsonForm form);

// The value that a JSON text stands for, or why there is none. Integers become 64-bit numbers,
// other numbers doubles; there is nothing that null could become.
std::variant<PropertyValue, std::string> ParseJson(std::string_view text, JsonForm form);

}  // namespace quorlet

#endif  // QUORLET_CTL_JSON_VALUE_H_
