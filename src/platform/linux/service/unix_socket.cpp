#include "platform/linux/service/unix_socket.h"

#include <fcntl.h>

#include <cerrno>
#include <cstring>

namespace quorlet {

UnixSocketAddress::UnixSocketAddress(const std::string& directory, const std::string& name) {
  std::string path = directory + "/" + name;
  address_.sun_family = AF_UNIX;
  if (path.size() >= sizeof address_.sun_path) {
    directory_ = Descriptor(open(directory.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!directory_.isOpen()) {
      error_ = errno;
      return;
    }
    path = "/proc/self/fd/" + std::to_string(directory_.get()) + "/" + name;
  }
  if (path.size() >= sizeof address_.sun_path) {
    error_ = ENAMETOOLONG;
    return;
  }
  std::memcpy(address_.sun_path, path.c_str(), path.size() + 1);
}

int UnixSocketAddress::connect(int socket) const {
  if (error_ != 0) return error_;
  const auto* address = reinterpret_cast<const sockaddr*>(&address_);
  return ::connect(socket, address, sizeof address_) == 0 ? 0 : errno;
}

int UnixSocketAddress::bind(int socket) const {
  if (error_ != 0) return error_;
  const auto* address = reinterpret_cast<const sockaddr*>(&address_);
  return ::bind(socket, address, sizeof address_) == 0 ? 0 : errno;
}

Descriptor MakeUnixSocket() { return Descriptor(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)); }

}  // namespace quorlet
