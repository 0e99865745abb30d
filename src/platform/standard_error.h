// The process's standard error stream, where the storage telemetry reports.
#ifndef QUORLET_PLATFORM_STANDARD_ERROR_H_
#define QUORLET_PLATFORM_STANDARD_ERROR_H_

#include <string_view>

namespace quorlet {

class StandardError {
 public:
  virtual ~StandardError() = default;

  // Writes the text as it is: line ends are the caller's. A failure is not reported.
  virtual void write(std::string_view text) = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_STANDARD_ERROR_H_
