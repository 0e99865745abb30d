// Property-list documents: XML and binary are read, XML is written. Reading is strict: what is
// broken, ambiguous or beyond the limits is refused, and the work is bounded by the document's
// size.
#ifndef QUORLET_VALUES_PROPERTY_LIST_H_
#define QUORLET_VALUES_PROPERTY_LIST_H_

#include <cstddef>
#include <span>
#include <string>
#include <string_view>
#include <variant>

#include "drvreport/property_value.h"

namespace quorlet {

inline constexpr std::size_t kMaxPropertyListBytes = std::size_t{16} * 1024 * 1024;
inline constexpr std::size_t kMaxPropertyListDepth = 128;

// What a document may hold at the most; beyond it the document is refused.
struct PropertyListLimits {
  std::size_t bytes = kMaxPropertyListBytes;
  // Values of a whole tree, and bytes of its strings and data, with shared objects of a binary
  // document counted each time they are met.
  std::size_t values = 1'000'000;
  std::size_t content = std::size_t{64} * 1024 * 1024;
};
// Of the logs that we write ourselves: as much as the spool takes.
inline constexpr PropertyListLimits kLogLimits = {.bytes = std::size_t{64} * 1024 * 1024,
                                                  .values = 4'000'000};

// Why a document was refused, for people: "line 3: …" or "object 7: …".
struct PropertyListError {
  std::string description;
};

using PropertyListResult = std::variant<PropertyValue, PropertyListError>;

// Reads an XML or binary document. Integers come back as Int64 (UInt64 above 2^63 - 1), reals as
// Double.
[[nodiscard]] PropertyListResult ReadPropertyList(std::span<const std::byte> bytes,
                                                  const PropertyListLimits& limits = {});
[[nodiscard]] PropertyListResult ReadPropertyList(std::string_view bytes,
                                                  const PropertyListLimits& limits = {});

// The XML document, or an error when the tree is too deep (or cyclic) or too large. What XML cannot
// hold in a string or key becomes U+FFFD. Dates lose their fractions of a second.
[[nodiscard]] std::variant<std::string, PropertyListError> WriteXmlPropertyList(
    const PropertyValue& root, const PropertyListLimits& limits = {});

// A string, key or date as it reads after it was written.
std::string AsWritten(std::string_view text);
Date AsWritten(Date date);

}  // namespace quorlet

#endif  // QUORLET_VALUES_PROPERTY_LIST_H_
