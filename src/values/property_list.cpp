#include "values/property_list.h"

#include "values/property_list_binary.h"
#include "values/property_list_errors.h"
#include "values/property_list_xml.h"
#include "values/text.h"

namespace quorlet {

PropertyListResult ReadPropertyList(std::string_view bytes, const PropertyListLimits& limits) {
  if (bytes.empty()) return PropertyListError{"the document is empty"};
  if (bytes.size() > limits.bytes) return PropertyListError{TooLarge(limits)};
  return bytes.starts_with(kBinaryMagic)
             ? ReadBinaryPropertyList(std::as_bytes(std::span(bytes)), limits)
             : ReadXmlPropertyList(bytes, limits);
}

PropertyListResult ReadPropertyList(std::span<const std::byte> bytes,
                                    const PropertyListLimits& limits) {
  return ReadPropertyList(
      std::string_view(reinterpret_cast<const char*>(bytes.data()), bytes.size()), limits);
}

std::string TooLarge(const PropertyListLimits& limits) {
  return FormatText("the document is larger than %llu bytes", limits.bytes);
}

std::string TooManyValues(const PropertyListLimits& limits) {
  return FormatText("more than %llu values", limits.values);
}

std::string TooMuchContent(const PropertyListLimits& limits) {
  return FormatText("more than %llu bytes of content", limits.content);
}

std::string TooDeeplyNested() {
  return FormatText("nested more than %llu deep", kMaxPropertyListDepth);
}

}  // namespace quorlet
