// Format texts that come from a device: they are data, and never become the format of a formatting
// function.
#ifndef QUORLET_STORAGE_FORMAT_TEXT_H_
#define QUORLET_STORAGE_FORMAT_TEXT_H_

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

namespace quorlet {

// Text in a buffer that never grows. What does not fit, with a terminator after it, fails the text
// as a whole: nothing is appended from then on.
class BoundedText {
 public:
  explicit BoundedText(std::span<char> buffer) : buffer_(buffer) {}

  bool ok() const { return ok_; }
  void append(std::string_view text) {
    if (reserve(text.size())) std::ranges::copy(text, next(text.size()));
  }
  void append(std::size_t count, char c) {
    if (reserve(count)) std::fill_n(next(count), count, c);
  }
  // Writes the terminator; the length without it, or nothing when something did not fit.
  std::optional<std::size_t> finish() {
    if (!reserve(0)) return std::nullopt;
    buffer_[length_] = '\0';
    return length_;
  }

 private:
  bool reserve(std::size_t count) { return ok_ = ok_ && count < buffer_.size() - length_; }
  char* next(std::size_t count) {
    char* const start = buffer_.data() + length_;
    length_ += count;
    return start;
  }

  std::span<char> buffer_;
  std::size_t length_ = 0;
  bool ok_ = true;
};

// Appends `format` with its first conversions %u, %d, %i, %x, %X and %o filled with `numbers`, in
// order; flags, width and precision (up to three digits each) mean what they mean to printf, and
// length modifiers mean nothing. "%%" is a percent sign; everything else, and conversions beyond
// the numbers, stay as they are.
void AppendFormatted(BoundedText& out, std::string_view format,
                     std::span<const std::uint32_t> numbers);

// The same with one conversion, %s.
void AppendFormatted(BoundedText& out, std::string_view format, std::string_view text);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_FORMAT_TEXT_H_
