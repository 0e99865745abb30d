// Helpers for sample data in binary form.
#ifndef QUORLET_CTL_DEMO_BYTES_H_
#define QUORLET_CTL_DEMO_BYTES_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <utility>
#include <variant>

#include "values/property_list.h"
#include "values/property_value.h"

namespace quorlet {

// Little-endian integers, one after the other.
class LittleEndian {
 public:
  LittleEndian& u16(std::uint64_t number) { return add(number, 2); }
  LittleEndian& u32(std::uint64_t number) { return add(number, 4); }
  LittleEndian& u64(std::uint64_t number) { return add(number, 8); }
  // The text, cut or filled with zero bytes to `width`.
  LittleEndian& text(std::string text, std::size_t width) {
    text.resize(width);
    bytes_ += text;
    return *this;
  }

  std::size_t size() const { return bytes_.size(); }
  const std::string& bytes() const { return bytes_; }
  Data data() const {
    Data data;
    for (const char byte : bytes_) data.push_back(static_cast<std::byte>(byte));
    return data;
  }

 private:
  LittleEndian& add(std::uint64_t number, std::size_t width) {
    for (std::size_t i = 0; i < width; ++i) bytes_ += static_cast<char>((number >> (8 * i)) & 0xFF);
    return *this;
  }

  std::string bytes_;
};

// The property-list document.
inline std::string Document(const PropertyValue& root) {
  auto document = WriteXmlPropertyList(root);
  std::string* text = std::get_if<std::string>(&document);
  return text != nullptr ? std::move(*text) : std::string();
}

}  // namespace quorlet

#endif  // QUORLET_CTL_DEMO_BYTES_H_
