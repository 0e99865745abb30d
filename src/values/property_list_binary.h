// Binary property lists.
#ifndef QUORLET_VALUES_PROPERTY_LIST_BINARY_H_
#define QUORLET_VALUES_PROPERTY_LIST_BINARY_H_

#include <cstddef>
#include <span>
#include <string_view>

#include "values/property_list.h"

namespace quorlet {

inline constexpr std::string_view kBinaryMagic = "bplist00";

// The value of a document that begins with the magic bytes, is well-formed and within the limits,
// otherwise why it is not: "object 7 contains itself". The work is bounded by the size of the
// document and the limits, however often its objects are shared.
[[nodiscard]] PropertyListResult ReadBinaryPropertyList(std::span<const std::byte> document,
                                                        const PropertyListLimits& limits);

}  // namespace quorlet

#endif  // QUORLET_VALUES_PROPERTY_LIST_BINARY_H_
