// Stream sockets with a name in a directory.
#ifndef QUORLET_PLATFORM_LINUX_SERVICE_UNIX_SOCKET_H_
#define QUORLET_PLATFORM_LINUX_SERVICE_UNIX_SOCKET_H_

#include <sys/socket.h>
#include <sys/un.h>

#include <string>

#include "platform/linux/base/descriptor.h"

namespace quorlet {

// The address of the socket `name` in `directory`. A path longer than an address holds goes through
// a descriptor of the directory, which this object keeps open.
class UnixSocketAddress {
 public:
  UnixSocketAddress(const std::string& directory, const std::string& name);

  // 0, or the errno of why there is no address.
  int error() const { return error_; }
  // The result of connect(2) or bind(2) on `socket`: 0 or an errno.
  [[nodiscard]] int connect(int socket) const;
  [[nodiscard]] int bind(int socket) const;

 private:
  Descriptor directory_;
  sockaddr_un address_{};
  int error_ = 0;
};

// A new stream socket (close-on-exec), or one that is not open.
Descriptor MakeUnixSocket();

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_SERVICE_UNIX_SOCKET_H_
