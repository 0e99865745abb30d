#include "ctl/progress.h"

#include <unistd.h>

#include "ctl/output.h"

namespace quorlet {
namespace {

constexpr auto kBetweenLines = std::chrono::milliseconds(100);
constexpr std::uint64_t kTenthOfMegabyte = 100'000;

void WriteToTerminal(std::string_view text) {
  // A line that cannot be shown is missed by nobody.
  [[maybe_unused]] const ssize_t written = ::write(STDERR_FILENO, text.data(), text.size());
}

}  // namespace

Progress::Progress(std::string_view noun, bool isWanted)
    : noun_(noun), isShown_(isWanted && ::isatty(STDERR_FILENO) == 1) {}

void Progress::show() {
  const auto now = std::chrono::steady_clock::now();
  if (now < next_) return;
  next_ = now + kBetweenLines;
  const std::uint64_t tenths = bytes_ / kTenthOfMegabyte;
  WriteToTerminal("\r" + Counted(done_, noun_) + ", " + std::to_string(tenths / 10) + "." +
                  std::to_string(tenths % 10) + " MB\x1b[K");
  isOnScreen_ = true;
}

void Progress::clear() {
  if (isOnScreen_) WriteToTerminal("\r\x1b[K");
  isOnScreen_ = false;
}

}  // namespace quorlet
