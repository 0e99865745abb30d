// The texts inside an XML property list: scalars, character references, blanks.
#ifndef QUORLET_VALUES_PROPERTY_LIST_SCALARS_H_
#define QUORLET_VALUES_PROPERTY_LIST_SCALARS_H_

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "drvreport/property_value.h"

namespace quorlet {

inline constexpr std::string_view kXmlBlanks = " \t\r\n";

// `text` without the blanks around it.
std::string_view Trimmed(std::string_view text);
// `text` in lower case, as far as it is ASCII.
std::string Lowered(std::string_view text);

// Each of these gives the value of a trimmed text, nullopt when it is not such a text.
// Integers: decimal or 0x hexadecimal, -2^63 to 2^64 - 1.
std::optional<PropertyValue> IntegerFromText(std::string_view text);
// Decimal numbers within the range of a double, "nan", "inf" and "infinity" in any case.
std::optional<PropertyValue> RealFromText(std::string_view text);
// "2026-03-04T05:06:07Z", years 1 to 9999 with or without leading zeros.
std::optional<PropertyValue> DateFromText(std::string_view text);
// Base64 with padding; blanks are skipped.
std::optional<PropertyValue> DataFromText(std::string_view text);

// The character that "amp" or "#x41" names, in UTF-8; nullopt for an unknown name and for one that
// XML does not allow.
std::optional<std::string> XmlReference(std::string_view name);

// How many bytes of `text`, which is valid UTF-8, come before the first character that an XML
// document cannot hold; text.size() without one.
std::size_t XmlTextPrefix(std::string_view text);

// `text` between quotes for an error line: shortened, valid UTF-8, without control characters.
std::string QuotedExcerpt(std::string_view text);

}  // namespace quorlet

#endif  // QUORLET_VALUES_PROPERTY_LIST_SCALARS_H_
