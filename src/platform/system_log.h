// The system log, the place for the program's own messages.
#ifndef QUORLET_PLATFORM_SYSTEM_LOG_H_
#define QUORLET_PLATFORM_SYSTEM_LOG_H_

#include "values/text.h"

namespace quorlet {

enum class LogLevel { kDebug, kInfo, kDefault, kError };

class SystemLog {
 public:
  virtual ~SystemLog() = default;

  // Adds one message; it may hold line breaks and any bytes. Never fails visibly.
  virtual void write(LogLevel level, std::string_view text) = 0;

  template <typename... Arguments>
  void debug(Message<Arguments...> message, const Arguments&... arguments) {
    write(LogLevel::kDebug, FormatText<Arguments...>(message, arguments...));
  }
  template <typename... Arguments>
  void info(Message<Arguments...> message, const Arguments&... arguments) {
    write(LogLevel::kInfo, FormatText<Arguments...>(message, arguments...));
  }
  // The default level.
  template <typename... Arguments>
  void log(Message<Arguments...> message, const Arguments&... arguments) {
    write(LogLevel::kDefault, FormatText<Arguments...>(message, arguments...));
  }
  template <typename... Arguments>
  void error(Message<Arguments...> message, const Arguments&... arguments) {
    write(LogLevel::kError, FormatText<Arguments...>(message, arguments...));
  }
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_SYSTEM_LOG_H_
