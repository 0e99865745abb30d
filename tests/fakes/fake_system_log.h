#ifndef QUORLET_TESTS_FAKES_FAKE_SYSTEM_LOG_H_
#define QUORLET_TESTS_FAKES_FAKE_SYSTEM_LOG_H_

#include <mutex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/system_log.h"

namespace quorlet {

// Keeps the messages. Writing is safe from any thread; look at them when the writers are done.
class FakeSystemLog : public SystemLog {
 public:
  void write(LogLevel level, std::string_view text) override {
    const std::lock_guard lock(mutex_);
    lines.emplace_back(level, std::string(text));
  }
  // The messages of one level, in order.
  std::vector<std::string> at(LogLevel level) const {
    std::vector<std::string> texts;
    for (const auto& [lineLevel, text] : lines) {
      if (lineLevel == level) texts.push_back(text);
    }
    return texts;
  }
  std::vector<std::string> errors() const { return at(LogLevel::kError); }

  std::vector<std::pair<LogLevel, std::string>> lines;

 private:
  std::mutex mutex_;
};

}  // namespace quorlet

#endif  // QUORLET_TESTS_FAKES_FAKE_SYSTEM_LOG_H_
