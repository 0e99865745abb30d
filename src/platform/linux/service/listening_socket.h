// Getting the socket that a service listens on.
#ifndef QUORLET_PLATFORM_LINUX_SERVICE_LISTENING_SOCKET_H_
#define QUORLET_PLATFORM_LINUX_SERVICE_LISTENING_SOCKET_H_

#include <sys/socket.h>
#include <sys/types.h>

#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/linux/base/descriptor.h"

namespace quorlet {

// The reason that is no fault: whoever came first serves.
inline constexpr std::string_view kAlreadyListening = "another process is listening";

// What kind of socket a service has.
struct SocketShape {
  int type;
  mode_t mode;
};
inline constexpr SocketShape kStreamShape = {SOCK_STREAM, 0600};
// For whoever is in its group to send to.
inline constexpr SocketShape kDatagramShape = {SOCK_DGRAM, 0660};

// A listening, or for datagrams a bound, non-blocking socket. One that this process made is removed
// from its directory at the end, unless somebody has replaced it.
class ListeningSocket {
 public:
  ListeningSocket(ListeningSocket&&) = default;
  ListeningSocket& operator=(ListeningSocket&&) = default;
  ~ListeningSocket();

  // The socket that the service manager passed (LISTEN_PID, LISTEN_FDS); nothing when it passed
  // none to this process, a reason when what it passed cannot be used. Asking uses it up.
  static std::optional<std::variant<ListeningSocket, std::string>> Passed();

  // The same for every datagram socket passed, Unix or UDP.
  static std::optional<std::variant<std::vector<ListeningSocket>, std::string>> PassedDatagrams();

  // A socket `name` in `directory` (which is created), or the reason why there is none.
  static std::variant<ListeningSocket, std::string> Make(const std::string& directory,
                                                         const std::string& name,
                                                         const SocketShape& shape = kStreamShape);

  int get() const { return descriptor_.get(); }

 private:
  explicit ListeningSocket(Descriptor descriptor) : descriptor_(std::move(descriptor)) {}

  Descriptor descriptor_;
  std::string path_;  // empty for a passed socket
  dev_t device_ = 0;
  ino_t inode_ = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_SERVICE_LISTENING_SOCKET_H_
