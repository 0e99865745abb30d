// Lines of the structured log, as stretches of a file that belong to one day.
#ifndef QUORLET_PLATFORM_LINUX_LOGS_STRUCTURED_LINES_H_
#define QUORLET_PLATFORM_LINUX_LOGS_STRUCTURED_LINES_H_

#include <sys/types.h>

#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace quorlet {

// Neighbouring lines of one day.
struct Lines {
  off_t begin = 0;
  off_t end = 0;
  std::string day;  // yyyymmdd; empty when it is not known
};

// Appends a line to `all`, as part of the stretch before it where it belongs to that.
void AddLine(std::vector<Lines>& all, Lines line);

// The day of an RFC 3339 time in UTC as yyyymmdd, or empty.
std::string DayOf(std::string_view time);

// Calls `take` with each line of the first `size` bytes of a file, in order; 0 or the errno. A line
// that was cut short, or is none of ours, has no day. Only the start of a long line is kept in
// memory.
[[nodiscard]] int ScanLines(int descriptor, off_t size, const std::function<void(Lines)>& take);

// Calls `take` with the bytes of [begin, end) of a file in order, until it returns an error; 0 or
// the errno, EIO when the file is shorter.
[[nodiscard]] int ReadRange(int descriptor, off_t begin, off_t end,
                            const std::function<int(std::string_view)>& take);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_LOGS_STRUCTURED_LINES_H_
