// Property-list documents: XML and binary are read, XML is written.
//
// libplist does the parsing; since it accepts much that is broken without a word (a missing end
// tag, a key without a value, an integer that is not one) and expands shared objects without
// bound, every document is checked here first.
#ifndef QUORLET_VALUES_PROPERTY_LIST_H_
#define QUORLET_VALUES_PROPERTY_LIST_H_

#include <cstddef>
#include <span>
#include <string>
#include <string_view>
#include <variant>

#include "values/property_value.h"

namespace quorlet {

// What a document may hold at the most; beyond it the document is refused.
inline constexpr std::size_t kMaxPropertyListBytes = std::size_t{16} * 1024 * 1024;
inline constexpr std::size_t kMaxPropertyListDepth = 128;
// Values of a whole tree, and bytes of its strings and data, with shared objects of a binary
// document counted each time they are met.
inline constexpr std::size_t kMaxPropertyListValues = 1'000'000;
inline constexpr std::size_t kMaxPropertyListContentBytes = std::size_t{64} * 1024 * 1024;

// Why a document was refused, for people: "line 3: …" or "object 7: …".
struct PropertyListError {
  std::string description;
};

using PropertyListResult = std::variant<PropertyValue, PropertyListError>;

// Reads an XML or binary document. Integers come back as Int64 (UInt64 above 2^63 - 1), reals as
// Double.
[[nodiscard]] PropertyListResult ReadPropertyList(std::span<const std::byte> bytes);
[[nodiscard]] PropertyListResult ReadPropertyList(std::string_view bytes);

// The XML document, or an error when the tree is too deep (or cyclic) or too large. What XML cannot
// hold in a string or key becomes U+FFFD. Dates lose their fractions of a second.
[[nodiscard]] std::variant<std::string, PropertyListError> WriteXmlPropertyList(
    const PropertyValue& root);

// A string, key or date as it reads after it was written.
std::string AsWritten(std::string_view text);
Date AsWritten(Date date);

}  // namespace quorlet

#endif  // QUORLET_VALUES_PROPERTY_LIST_H_
