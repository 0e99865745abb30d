// Checks of what is installed below a root: directories, sockets and units.
#ifndef QUORLET_CTL_INSTALL_CHECKS_H_
#define QUORLET_CTL_INSTALL_CHECKS_H_

#include <string>
#include <string_view>
#include <utility>

#include "platform/linux/base/files.h"

namespace quorlet {

enum class State { kOk, kWarning, kError };
constexpr std::string_view StateName(State state) {
  return state == State::kOk ? "ok" : state == State::kWarning ? "warning" : "error";
}

// What a check found, and the command that mends it; none is needed for kOk.
struct Finding {
  State state = State::kOk;
  std::string text;
  std::string remedy;
};
inline Finding Ok(std::string text) { return {State::kOk, std::move(text), ""}; }
inline Finding Warning(std::string text, std::string remedy) {
  return {State::kWarning, std::move(text), std::move(remedy)};
}
inline Finding Error(std::string text, std::string remedy) {
  return {State::kError, std::move(text), std::move(remedy)};
}

Finding CheckRootDirectory(const Root& root);
// Whether this user may read and write what the programs write: an error where nobody of this
// user's rights could make a pass, a warning where another user can.
Finding CheckPermissions(const Root& root);
// The named service's socket, or a unit that provides it; and the recording socket.
Finding CheckService(const Root& root);
// The units of the daily pass, where systemd runs.
Finding CheckUnits(const Root& root);

}  // namespace quorlet

#endif  // QUORLET_CTL_INSTALL_CHECKS_H_
