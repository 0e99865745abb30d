#include "ctl/terminal.h"

#include <signal.h>
#include <sys/ioctl.h>
#include <termios.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>

namespace quorlet {
namespace {

constexpr std::size_t kMostColumns = 1000;

volatile sig_atomic_t g_isStopRequested = 0;

void RequestStop(int) { g_isStopRequested = 1; }

sigset_t StopSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGQUIT);
  return signals;
}

void HandleStopSignals(void (*handler)(int)) {
  struct sigaction action = {};
  action.sa_handler = handler;  // without SA_RESTART: a write that blocks ends, too
  for (const int signal : {SIGINT, SIGTERM, SIGQUIT}) sigaction(signal, &action, nullptr);
}

bool IsContinuation(char c) { return (static_cast<unsigned char>(c) & 0xC0) == 0x80; }

std::size_t Columns(std::string_view text) {
  return text.size() - static_cast<std::size_t>(std::ranges::count_if(text, IsContinuation));
}

}  // namespace

bool IsTerminal() {
  const char* type = std::getenv("TERM");
  return isatty(STDOUT_FILENO) == 1 && type != nullptr && *type != '\0' &&
         std::string_view(type) != "dumb";
}

TerminalSize GetTerminalSize() {
  TerminalSize size;
  winsize window = {};
  if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &window) != 0) return size;
  if (window.ws_col != 0) size.columns = std::min<std::size_t>(window.ws_col, kMostColumns);
  if (window.ws_row != 0) size.rows = window.ws_row;
  return size;
}

std::string_view FitColumns(std::string_view text, std::size_t columns) {
  std::size_t end = 0;
  while (end < text.size()) {
    if (!IsContinuation(text[end]) && columns-- == 0) break;
    ++end;
  }
  return text.substr(0, end);
}

std::string LeftAligned(std::string_view text, std::size_t columns) {
  std::string aligned(FitColumns(text, columns));
  return aligned.append(columns - Columns(aligned), ' ');
}

std::string RightAligned(std::string_view text, std::size_t columns) {
  const std::string_view fit = FitColumns(text, columns);
  return std::string(columns - Columns(fit), ' ').append(fit);
}

std::vector<std::string> TableLines(const std::vector<std::vector<std::string>>& rows,
                                    const std::vector<bool>& toTheRight, std::size_t name,
                                    std::size_t columns) {
  constexpr std::string_view kGap = "  ";
  constexpr std::size_t kNarrowest = 8;
  std::vector<std::size_t> widths(toTheRight.size());
  for (const auto& row : rows) {
    for (std::size_t i = 0; i < widths.size(); ++i) {
      widths[i] = std::max(widths[i], Columns(row[i]));
    }
  }
  std::size_t total = (widths.size() - 1) * kGap.size();
  for (const std::size_t width : widths) total += width;
  while (total > columns) {
    std::size_t* widest = &widths[name];
    for (std::size_t i = 0; i < widths.size(); ++i) {
      if (toTheRight[i] || i == name || widths[i] <= kNarrowest) continue;
      if (widest == &widths[name] || widths[i] > *widest) widest = &widths[i];
    }
    if (*widest <= kNarrowest) break;
    --*widest;
    --total;
  }
  std::vector<std::string> lines;
  for (const auto& row : rows) {
    std::string line;
    for (std::size_t i = 0; i < widths.size(); ++i) {
      if (i != 0) line += kGap;
      line += toTheRight[i] ? RightAligned(row[i], widths[i]) : LeftAligned(row[i], widths[i]);
    }
    line.erase(line.find_last_not_of(' ') + 1);
    lines.push_back(std::move(line));
  }
  return lines;
}

std::string Bar(double share, std::size_t width) {
  const double filled = std::isfinite(share) ? std::clamp(share, 0.0, 1.0) : 0.0;
  const auto marks = static_cast<std::size_t>(std::lround(filled * static_cast<double>(width)));
  return "[" + std::string(marks, '#') + std::string(width - marks, '.') + "]";
}

LeaveKey::LeaveKey() {
  // In the background the terminal is another program's.
  if (tcgetpgrp(STDIN_FILENO) != getpgrp() || tcgetattr(STDIN_FILENO, &before_) != 0) return;
  termios changed = before_;
  changed.c_cc[VQUIT] = 'q';
  changed.c_lflag &= ~static_cast<tcflag_t>(ECHO);
  isSet_ = tcsetattr(STDIN_FILENO, TCSANOW, &changed) == 0;
}

LeaveKey::~LeaveKey() {
  if (isSet_) tcsetattr(STDIN_FILENO, TCSANOW, &before_);
}

Interruption::Interruption() {
  g_isStopRequested = 0;
  HandleStopSignals(RequestStop);
}

Interruption::~Interruption() { HandleStopSignals(SIG_DFL); }

bool Interruption::isRequested() const { return g_isStopRequested != 0; }

bool Interruption::waitUntil(std::chrono::steady_clock::time_point end) {
  // Blocked from the question to the wait: a signal in between is not lost.
  const sigset_t signals = StopSignals();
  sigset_t before;
  sigprocmask(SIG_BLOCK, &signals, &before);
  bool isStopped = isRequested();
  while (!isStopped) {
    const auto left = end - std::chrono::steady_clock::now();
    if (left <= left.zero()) break;
    const auto seconds = std::chrono::floor<std::chrono::seconds>(left);
    timespec timeout = {};
    timeout.tv_sec = static_cast<time_t>(seconds.count());
    timeout.tv_nsec = static_cast<long>(
        std::chrono::duration_cast<std::chrono::nanoseconds>(left - seconds).count());
    isStopped = sigtimedwait(&signals, nullptr, &timeout) > 0;
  }
  sigprocmask(SIG_SETMASK, &before, nullptr);
  if (isStopped) g_isStopRequested = 1;
  return !isStopped;
}

}  // namespace quorlet
