// XML property lists.
#ifndef QUORLET_VALUES_PROPERTY_LIST_XML_H_
#define QUORLET_VALUES_PROPERTY_LIST_XML_H_

#include <string_view>

#include "values/property_list.h"

namespace quorlet {

// The value of a document that is well-formed, means one thing only, and is within the limits;
// otherwise why it is not: "line 3: <integer> holds "abc", which is not a 64-bit
// integer". Of equal keys in a dictionary, the last one's value stays.
[[nodiscard]] PropertyListResult ReadXmlPropertyList(std::string_view document,
                                                     const PropertyListLimits& limits);

}  // namespace quorlet

#endif  // QUORLET_VALUES_PROPERTY_LIST_XML_H_
