// How far a long command has got, for whoever sits at the terminal.
#ifndef QUORLET_CTL_PROGRESS_H_
#define QUORLET_CTL_PROGRESS_H_

#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>

namespace quorlet {

// One line on standard error that is written over itself, and goes with the object. Nothing where
// standard error is no terminal.
class Progress {
 public:
  // "12345 lines, 3.4 MB". `noun` is in the singular; `isWanted` is false where the line would mix
  // with other output.
  explicit Progress(std::string_view noun, bool isWanted = true);
  Progress(const Progress&) = delete;
  Progress& operator=(const Progress&) = delete;
  ~Progress() { clear(); }

  // One more is done, which had so many bytes.
  void advance(std::size_t bytes) {
    ++done_;
    bytes_ += bytes;
    if (isShown_ && done_ % kStep == 0) show();
  }
  // Makes room for another line.
  void clear();

 private:
  static constexpr std::uint64_t kStep = 16;
  void show();

  const std::string noun_;
  const bool isShown_;
  bool isOnScreen_ = false;
  std::uint64_t done_ = 0;
  std::uint64_t bytes_ = 0;
  std::chrono::steady_clock::time_point next_ = {};
};

}  // namespace quorlet

#endif  // QUORLET_CTL_PROGRESS_H_
