// Helpers for sample data in binary form.
#ifndef QUORLET_CTL_DEMO_BYTES_H_
#define QUORLET_CTL_DEMO_BYTES_H_

#include <algorithm>
#include <cstddef>
#include <string>
#include <utility>
#include <variant>

#include "drvreport/property_value.h"
#include "values/byte_writer.h"
#include "values/property_list.h"

namespace quorlet {

inline std::string FileOf(const ByteWriter& writer) {
  const Data& data = writer.data();
  std::string file(data.size(), '\0');
  std::ranges::transform(data, file.begin(),
                         [](std::byte byte) { return static_cast<char>(byte); });
  return file;
}

// The property-list document.
inline std::string Document(const PropertyValue& root) {
  auto document = WriteXmlPropertyList(root);
  std::string* text = std::get_if<std::string>(&document);
  return text != nullptr ? std::move(*text) : std::string();
}

}  // namespace quorlet

#endif  // QUORLET_CTL_DEMO_BYTES_H_
