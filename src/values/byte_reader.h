// A bounds-checked reader over bytes that nobody vouches for.
#ifndef QUORLET_VALUES_BYTE_READER_H_
#define QUORLET_VALUES_BYTE_READER_H_

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <span>

namespace quorlet {

// Reads little-endian or big-endian unsigned integers one after the other. A read beyond the end
// gives 0 and sets a failure flag that stays set: read a whole record, then ask ok() once.
class ByteReader {
 public:
  explicit ByteReader(std::span<const std::byte> bytes) : bytes_(bytes) {}

  bool ok() const { return ok_; }
  std::size_t position() const { return position_; }
  std::size_t remaining() const { return bytes_.size() - position_; }

  void seek(std::size_t position) {
    if (position > bytes_.size()) {
      ok_ = false;
    } else {
      position_ = position;
    }
  }
  void skip(std::size_t count) { (void)take(count); }

  // The next `count` bytes, owned by whoever owns the buffer; empty on failure.
  std::span<const std::byte> take(std::size_t count) {
    if (!ok_ || count > remaining()) {
      ok_ = false;
      return {};
    }
    const auto taken = bytes_.subspan(position_, count);
    position_ += count;
    return taken;
  }

  template <std::unsigned_integral T>
  T little() {
    std::uint64_t value = 0;
    const auto taken = take(sizeof(T));
    for (std::size_t i = taken.size(); i-- > 0;) {
      value = (value << 8) | std::to_integer<std::uint64_t>(taken[i]);
    }
    return static_cast<T>(value);
  }

  // A big-endian integer of `width` bytes, 1 to 8.
  std::uint64_t big(std::size_t width) {
    std::uint64_t value = 0;
    for (const std::byte b : take(width)) value = (value << 8) | std::to_integer<std::uint64_t>(b);
    return value;
  }

 private:
  std::span<const std::byte> bytes_;
  std::size_t position_ = 0;
  bool ok_ = true;
};

}  // namespace quorlet

#endif  // QUORLET_VALUES_BYTE_READER_H_
