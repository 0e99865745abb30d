// Standard output, and texts that are safe to show.
#ifndef QUORLET_CTL_OUTPUT_H_
#define QUORLET_CTL_OUTPUT_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace quorlet {

// Buffered standard output. A failed write is remembered, not thrown, so that row handlers may
// write from inside the platform's enumerations.
class Output {
 public:
  void write(std::string_view bytes);
  // `text` and a line break.
  void line(std::string_view text);
  // Hands everything to the system. False when any write failed.
  [[nodiscard]] bool finish();

  bool ok() const { return error_ == 0; }
  // The errno of the first failed write, or 0.
  int error() const { return error_; }

 private:
  int error_ = 0;
};

// `text` without line breaks, terminal controls or invalid UTF-8: "\t", "\n", "\r", "\\", and
// "\xNN" for every other control byte, byte of a C1 control, and byte that is not UTF-8.
std::string Escape(std::string_view text);

// The bytes that Escape was given, or nothing when a backslash starts none of its forms.
std::optional<std::string> Unescape(std::string_view text);

// "0x1f"
std::string Hexadecimal(std::uint64_t number);

// "1 key", "2 keys"
std::string Counted(std::uint64_t count, std::string_view noun);

}  // namespace quorlet

#endif  // QUORLET_CTL_OUTPUT_H_
