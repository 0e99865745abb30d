// The sockets that lines to record arrive on.
#ifndef QUORLET_CTL_RECORD_SOCKETS_H_
#define QUORLET_CTL_RECORD_SOCKETS_H_

#include <sys/socket.h>

#include <array>
#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "ctl/record_refusals.h"
#include "platform/linux/base/files.h"
#include "platform/linux/service/listening_socket.h"

namespace quorlet {

// The sockets that the service manager passed, or else a new one at `path`. Throws Failure.
std::vector<ListeningSocket> OpenRecordSockets(const std::string& path);

// Takes datagrams off sockets, some at a time, into memory that is used again.
class DatagramReader {
 public:
  DatagramReader();

  // Datagrams up to this size are whole; of a larger one the rest is lost.
  static constexpr std::size_t kLongestDatagram = std::size_t{1} << 18;

  // Hands each datagram that waits on the socket, up to some, to `take`; `isCut` when its end was
  // lost. Returns how many there were. Where none waits, it may give the first one a moment.
  using Take = std::function<void(std::string_view text, Sender sender, bool isCut)>;
  enum class Patience { kNone, kAMoment };
  std::size_t read(int socket, Patience patience, const Take& take);

 private:
  static constexpr std::size_t kAtOnce = 16;
  struct Credentials {
    alignas(cmsghdr) std::array<std::byte, CMSG_SPACE(sizeof(ucred))> bytes;
  };
  std::unique_ptr<char[]> texts_;
  std::array<Credentials, kAtOnce> credentials_;
  std::array<iovec, kAtOnce> places_{};
  std::array<mmsghdr, kAtOnce> messages_{};
};

}  // namespace quorlet

#endif  // QUORLET_CTL_RECORD_SOCKETS_H_
