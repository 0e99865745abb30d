// What every reader and writer of property lists says of a document beyond the limits.
#ifndef QUORLET_VALUES_PROPERTY_LIST_ERRORS_H_
#define QUORLET_VALUES_PROPERTY_LIST_ERRORS_H_

#include <string>

#include "values/property_list.h"

namespace quorlet {

std::string TooLarge(const PropertyListLimits& limits);
std::string TooManyValues(const PropertyListLimits& limits);
std::string TooMuchContent(const PropertyListLimits& limits);
std::string TooDeeplyNested();

}  // namespace quorlet

#endif  // QUORLET_VALUES_PROPERTY_LIST_ERRORS_H_
