// Base64 with padding.
#ifndef QUORLET_VALUES_BASE64_H_
#define QUORLET_VALUES_BASE64_H_

#include <optional>
#include <string>
#include <string_view>

#include "drvreport/property_value.h"

namespace quorlet {

std::string Base64Text(const Data& data);
// Blanks between the digits are skipped. nullopt for anything else that is no digit, and for digits
// that do not end with a group of four.
std::optional<Data> DataFromBase64(std::string_view text);

}  // namespace quorlet

#endif  // QUORLET_VALUES_BASE64_H_
