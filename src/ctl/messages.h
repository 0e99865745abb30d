// What a command says about itself: the messages of the layers below, and why it failed.
#ifndef QUORLET_CTL_MESSAGES_H_
#define QUORLET_CTL_MESSAGES_H_

#include <cstddef>
#include <exception>
#include <memory>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/access.h"
#include "platform/system_log.h"

namespace quorlet {

// Ends a command with exit status 1; its text becomes the one line on standard error.
class Failure : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// Ends a command whose answer is no: exit status 1, and nothing on standard error.
class AnswerIsNo : public std::exception {};

// The names in a directory, in byte order; none when there is no such directory. Throws Failure
// when it cannot be read.
std::vector<std::string> NamesIn(const std::string& directory);

// "quorletctl: text" on standard error, as one line whatever `text` holds.
void PrintErrorLine(std::string_view text);

// Keeps messages until it is known whether the command failed: one
// that fails says so in exactly one line.
class Messages {
 public:
  // A system log that adds to these messages; they outlive it. With access to write, errors go to
  // the root's system log as well.
  std::unique_ptr<SystemLog> makeLog(Access access);

  void add(LogLevel level, std::string_view text);
  // Messages below `lowest` are not kept; without a call, those below the default level.
  void keepFrom(LogLevel lowest) { lowest_ = lowest; }

  const std::vector<std::string>& errors() const { return errors_; }
  // The last error of the layers below, which says best why they failed; `otherwise` when they
  // were silent.
  std::string lastErrorOr(std::string_view otherwise) const;

  // Prints every message kept, one a line.
  void print() const;

 private:
  LogLevel lowest_ = LogLevel::kDefault;
  std::vector<std::string> kept_;
  std::vector<std::string> errors_;
  std::size_t dropped_ = 0;
};

}  // namespace quorlet

#endif  // QUORLET_CTL_MESSAGES_H_
