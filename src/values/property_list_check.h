// Strict checks of property-list documents, made before a lenient parser sees them: what passes is
// well-formed, means one thing only, and is within the limits of property_list.h.
#ifndef QUORLET_VALUES_PROPERTY_LIST_CHECK_H_
#define QUORLET_VALUES_PROPERTY_LIST_CHECK_H_

#include <cstddef>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace quorlet {

// nullopt when `document` is a good XML property list, otherwise why it is not: "line 3: <integer>
// holds "abc", which is not a 64-bit integer". With `plain`, that becomes the same content in a
// form that leaves a parser nothing to interpret (it is unspecified on failure):
// - no prolog, comments, entities or blanks between elements, and one spelling for every number;
// - an array starts with <false/>; a dictionary is an array that starts with <true/> and goes on
//   with its keys, as strings, each before its value. (libplist's dictionaries find a key by a hash
//   that anyone can make collide: a document of a few MB would take it hours.)
std::optional<std::string> CheckXmlPropertyList(std::string_view document,
                                                std::string* plain = nullptr);

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
