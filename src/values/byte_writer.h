// Writing integers in the byte order that drivers, sockets and files use.
#ifndef QUORLET_VALUES_BYTE_WRITER_H_
#define QUORLET_VALUES_BYTE_WRITER_H_

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>
#include <utility>

#include "drvreport/property_value.h"

namespace quorlet {

// Writes the low bytes of `number`, little-endian, over all of `room`; beyond 8 bytes, zeros.
constexpr void WriteLittle(std::uint64_t number, std::span<std::byte> room) {
  for (std::byte& byte : room) {
    byte = static_cast<std::byte>(number & 0xFF);
    number >>= 8;
  }
}

// Collects little-endian integers and bytes, one after the other; the counterpart of ByteReader.
class ByteWriter {
 public:
  void reserve(std::size_t size) { data_.reserve(size); }

  template <std::unsigned_integral T>
  ByteWriter& little(T number) {
    return little(number, sizeof number);
  }
  ByteWriter& u16(std::uint64_t number) { return little(number, 2); }
  ByteWriter& u32(std::uint64_t number) { return little(number, 4); }
  ByteWriter& u64(std::uint64_t number) { return little(number, 8); }
  ByteWriter& bytes(std::span<const std::byte> bytes) {
    data_.insert(data_.end(), bytes.begin(), bytes.end());
    return *this;
  }
  // The text, cut or filled with zero bytes to `width`.
  ByteWriter& text(std::string_view text, std::size_t width) {
    const auto taken = std::as_bytes(std::span(text.substr(0, width)));
    bytes(taken);
    data_.resize(data_.size() + width - taken.size());
    return *this;
  }

  std::size_t size() const { return data_.size(); }
  const Data& data() const { return data_; }
  Data take() { return std::exchange(data_, {}); }

 private:
  ByteWriter& little(std::uint64_t number, std::size_t width) {
    data_.resize(data_.size() + width);
    WriteLittle(number, std::span(data_).last(width));
    return *this;
  }

  Data data_;
};

}  // namespace quorlet

#endif  // QUORLET_VALUES_BYTE_WRITER_H_
