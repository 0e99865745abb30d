#include "platform/linux/service/listening_socket.h"

#include <stdlib.h>
#include <sys/stat.h>

#include <algorithm>
#include <cstring>
#include <string_view>

#include "platform/linux/base/files.h"
#include "platform/linux/service/unix_socket.h"
#include "values/digits.h"

namespace quorlet {
namespace {

constexpr int kFirstPassedDescriptor = 3;
constexpr long kMostPassed = 1024;
constexpr int kBacklog = 128;

// The decimal number in an environment variable, or -1.
long EnvironmentNumber(const char* name) {
  const char* text = secure_getenv(name);
  return text != nullptr ? ParseNumber<long>(text).value_or(-1) : -1;
}

int SocketOption(int descriptor, int option) {
  int value = -1;
  socklen_t size = sizeof value;
  return getsockopt(descriptor, SOL_SOCKET, option, &value, &size) == 0 ? value : -1;
}

bool SetFlags(int descriptor) {
  const int flags = fcntl(descriptor, F_GETFL);
  return flags >= 0 && fcntl(descriptor, F_SETFL, flags | O_NONBLOCK) == 0 &&
         fcntl(descriptor, F_SETFD, FD_CLOEXEC) == 0;
}

// How many descriptors were passed to this process. Asking uses them up.
int TakePassedCount() {
  const long count = EnvironmentNumber("LISTEN_FDS");
  const bool forUs = EnvironmentNumber("LISTEN_PID") == getpid() && count > 0;
  for (const char* name : {"LISTEN_PID", "LISTEN_FDS", "LISTEN_FDNAMES"}) unsetenv(name);
  if (!forUs) return 0;
  // None of them is for a process that we might start.
  const int passed = static_cast<int>(std::min(count, kMostPassed));
  for (int i = 0; i < passed; ++i) fcntl(kFirstPassedDescriptor + i, F_SETFD, FD_CLOEXEC);
  return passed;
}

// Makes way for a new socket: removes a stale one. Returns why there is no way, or nothing.
std::string ClearPath(const std::string& path, const UnixSocketAddress& address, int type) {
  struct stat status {};
  if (lstat(path.c_str(), &status) != 0) return errno == ENOENT ? "" : ErrnoText(errno);
  if (!S_ISSOCK(status.st_mode)) return "something else has its place";
  const Descriptor probe(socket(AF_UNIX, type | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!probe.isOpen()) return ErrnoText(errno);
  const int error = address.connect(probe.get());
  // A full backlog (EAGAIN) is a live listener too.
  if (error == 0 || error == EAGAIN) return std::string(kAlreadyListening);
  if (error != ECONNREFUSED) return ErrnoText(error);
  return unlink(path.c_str()) == 0 || errno == ENOENT ? "" : ErrnoText(errno);
}

}  // namespace

ListeningSocket::~ListeningSocket() {
  if (path_.empty() || !descriptor_.isOpen()) return;
  struct stat status {};
  if (lstat(path_.c_str(), &status) != 0) return;
  if (status.st_dev == device_ && status.st_ino == inode_) unlink(path_.c_str());
}

std::optional<std::variant<ListeningSocket, std::string>> ListeningSocket::Passed() {
  if (TakePassedCount() == 0) return std::nullopt;
  Descriptor first(kFirstPassedDescriptor);
  if (SocketOption(first.get(), SO_DOMAIN) != AF_UNIX ||
      SocketOption(first.get(), SO_TYPE) != SOCK_STREAM ||
      SocketOption(first.get(), SO_ACCEPTCONN) != 1 || !SetFlags(first.get())) {
    return std::string("the descriptor passed is not a listening stream socket");
  }
  return ListeningSocket(std::move(first));
}

std::optional<std::variant<std::vector<ListeningSocket>, std::string>>
ListeningSocket::PassedDatagrams() {
  const int count = TakePassedCount();
  if (count == 0) return std::nullopt;
  std::vector<ListeningSocket> sockets;
  for (int i = 0; i < count; ++i) {
    ListeningSocket passed{Descriptor(kFirstPassedDescriptor + i)};
    const int domain = SocketOption(passed.get(), SO_DOMAIN);
    if ((domain != AF_UNIX && domain != AF_INET && domain != AF_INET6) ||
        SocketOption(passed.get(), SO_TYPE) != SOCK_DGRAM || !SetFlags(passed.get())) {
      return "the descriptor " + std::to_string(passed.get()) +
             " that was passed is not a datagram socket";
    }
    sockets.push_back(std::move(passed));
  }
  return sockets;
}

namespace {

// As with every file that root creates. Held by a descriptor: the owner of the directory may have
// put something else in its place.
void GiveToOwnerOf(const std::string& directory, const std::string& path) {
  struct stat around {};
  struct stat made {};
  const Descriptor socket(open(path.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
  if (geteuid() != 0 || stat(directory.c_str(), &around) != 0 || fstat(socket.get(), &made) != 0 ||
      !S_ISSOCK(made.st_mode)) {
    return;
  }
  if (fchownat(socket.get(), "", around.st_uid, around.st_gid, AT_EMPTY_PATH) != 0) return;
}

}  // namespace

std::variant<ListeningSocket, std::string> ListeningSocket::Make(const std::string& directory,
                                                                 const std::string& name,
                                                                 const SocketShape& shape) {
  // Held until the new socket listens: before that it looks stale to another starting process.
  const FileLock lock(directory + "/." + name + ".lock");
  if (lock.error() != 0) return ErrnoText(lock.error());
  const std::string path = directory + "/" + name;
  const UnixSocketAddress address(directory, name);
  if (address.error() != 0) return ErrnoText(address.error());
  if (std::string reason = ClearPath(path, address, shape.type); !reason.empty()) return reason;

  Descriptor made(socket(AF_UNIX, shape.type | SOCK_CLOEXEC, 0));
  struct stat status {};
  // The mode is set before the socket has a name, so that nobody else ever finds it open.
  if (!made.isOpen() || fchmod(made.get(), shape.mode) != 0) return ErrnoText(errno);
  if (const int error = address.bind(made.get())) return ErrnoText(error);
  GiveToOwnerOf(directory, path);
  if (chmod(path.c_str(), shape.mode) != 0 || lstat(path.c_str(), &status) != 0 ||
      (shape.type == SOCK_STREAM && listen(made.get(), kBacklog) != 0) || !SetFlags(made.get())) {
    const int error = errno;
    unlink(path.c_str());
    return ErrnoText(error);
  }
  ListeningSocket result(std::move(made));
  result.path_ = path;
  result.device_ = status.st_dev;
  result.inode_ = status.st_ino;
  return result;
}

}  // namespace quorlet
