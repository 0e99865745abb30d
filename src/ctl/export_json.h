// JSON as the exports write it: straight to a text, in UTF-8, without a tree.
#ifndef QUORLET_CTL_EXPORT_JSON_H_
#define QUORLET_CTL_EXPORT_JSON_H_

#include <string>
#include <string_view>

#include "drvreport/property_value.h"

namespace quorlet {

// A string with its quotes; ill-formed UTF-8 becomes U+FFFD.
void AppendJsonString(std::string& json, std::string_view text);
// An integer with all its digits, a real in the fewest digits that read back as it; null for what
// is not finite.
void AppendJsonNumber(std::string& json, const Number& number);
void AppendJsonNumber(std::string& json, double number);
// In decimal, without quotes.
void AppendDecimal(std::string& json, std::uint64_t number);

bool IsFinite(const Number& number);

}  // namespace quorlet

#endif  // QUORLET_CTL_EXPORT_JSON_H_
