// The strict check of binary property lists, made before a lenient parser sees them: what passes is
// well-formed and within the limits of property_list.h.
#ifndef QUORLET_VALUES_PROPERTY_LIST_CHECK_H_
#define QUORLET_VALUES_PROPERTY_LIST_CHECK_H_

#include <cstddef>
#include <optional>
#include <span>
#include <string>

namespace quorlet {

// nullopt when `document` is a good binary property list, otherwise why it is not: "object 7
// contains itself". The work is bounded by the size of the document and the limits, however often
// its objects are shared.
std::optional<std::string> CheckBinaryPropertyList(std::span<const std::byte> document);

// What every reader and writer says of a tree beyond the limits.
std::string TooDeeplyNested();
std::string TooManyValues();
std::string TooMuchContent();

}  // namespace quorlet

#endif  // QUORLET_VALUES_PROPERTY_LIST_CHECK_H_
