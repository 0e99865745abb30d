// What a command that keeps showing things knows of its terminal, and of being asked to stop.
#ifndef QUORLET_CTL_TERMINAL_H_
#define QUORLET_CTL_TERMINAL_H_

#include <termios.h>

#include <chrono>
#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace quorlet {

struct TerminalSize {
  std::size_t columns = 80;
  std::size_t rows = 24;
};

// Whether standard output is a terminal that can place its cursor.
bool IsTerminal();
TerminalSize GetTerminalSize();

// The start of an escaped text that fits so many columns, a character being one column wide.
std::string_view FitColumns(std::string_view text, std::size_t columns);
// `text`, cut or filled with blanks; to the left or to the right of them.
std::string LeftAligned(std::string_view text, std::size_t columns);
std::string RightAligned(std::string_view text, std::size_t columns);

// Columns as wide as what is in them, two blanks between, and no blanks at the ends of lines. Where
// they do not fit `columns`, the widest ones that are aligned to the left are cut, the one that
// `name` numbers last; numbers, which stand in the columns that `toTheRight` names, never are. All
// rows have as many cells.
std::vector<std::string> TableLines(const std::vector<std::vector<std::string>>& rows,
                                    const std::vector<bool>& toTheRight, std::size_t name,
                                    std::size_t columns);

// "[#####.....]" for a share of 0.5 and a width of 10; nothing but dots for what is no share.
std::string Bar(double share, std::size_t width);

// While it lives, the terminal sends SIGQUIT for the key q, and shows no key.
class LeaveKey {
 public:
  LeaveKey();
  LeaveKey(const LeaveKey&) = delete;
  LeaveKey& operator=(const LeaveKey&) = delete;
  ~LeaveKey();

 private:
  termios before_ = {};
  bool isSet_ = false;
};

// While it lives, SIGINT, SIGQUIT and SIGTERM end waits instead of the program.
class Interruption {
 public:
  Interruption();
  Interruption(const Interruption&) = delete;
  Interruption& operator=(const Interruption&) = delete;
  ~Interruption();

  // True when `end` has come, false when the program was asked to stop before.
  [[nodiscard]] bool waitUntil(std::chrono::steady_clock::time_point end);
  bool isRequested() const;
};

}  // namespace quorlet

#endif  // QUORLET_CTL_TERMINAL_H_
