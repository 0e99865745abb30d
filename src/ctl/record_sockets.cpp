#include "ctl/record_sockets.h"

#include <fcntl.h>
#include <sys/time.h>

#include <cerrno>
#include <cstring>
#include <utility>
#include <variant>

#include "ctl/messages.h"

namespace quorlet {
namespace {

// How long a read may wait. Signals and timers wait as long.
constexpr timeval kMoment = {0, 20'000};

// The kernel's word, which only root can forge.
Sender SenderOf(msghdr& header) {
  for (cmsghdr* item = CMSG_FIRSTHDR(&header); item != nullptr; item = CMSG_NXTHDR(&header, item)) {
    if (item->cmsg_level != SOL_SOCKET || item->cmsg_type != SCM_CREDENTIALS ||
        item->cmsg_len < CMSG_LEN(sizeof(ucred))) {
      continue;
    }
    ucred credentials;
    std::memcpy(&credentials, CMSG_DATA(item), sizeof credentials);
    return credentials.uid;
  }
  return std::nullopt;
}

std::vector<ListeningSocket> OpenSockets(const std::string& path) {
  if (auto passed = ListeningSocket::PassedDatagrams()) {
    if (const auto* why = std::get_if<std::string>(&*passed)) throw Failure(*why);
    return std::get<std::vector<ListeningSocket>>(std::move(*passed));
  }
  const std::size_t slash = path.rfind('/');
  auto made = ListeningSocket::Make(path.substr(0, slash), path.substr(slash + 1), kDatagramShape);
  if (const auto* why = std::get_if<std::string>(&made)) {
    throw Failure("cannot listen on " + path + ": " + *why);
  }
  std::vector<ListeningSocket> sockets;
  sockets.push_back(std::get<ListeningSocket>(std::move(made)));
  return sockets;
}

}  // namespace

std::vector<ListeningSocket> OpenRecordSockets(const std::string& path) {
  std::vector<ListeningSocket> sockets = OpenSockets(path);
  const int on = 1;
  for (const ListeningSocket& socket : sockets) {
    // Over UDP there are no credentials to ask for.
    static_cast<void>(setsockopt(socket.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on));
    const int flags = fcntl(socket.get(), F_GETFL);
    if (flags >= 0 &&
        setsockopt(socket.get(), SOL_SOCKET, SO_RCVTIMEO, &kMoment, sizeof kMoment) == 0) {
      static_cast<void>(fcntl(socket.get(), F_SETFL, flags & ~O_NONBLOCK));
    }
  }
  return sockets;
}

// Left as it is: only the pages that datagrams fill take up memory.
DatagramReader::DatagramReader()
    : texts_(std::make_unique_for_overwrite<char[]>(kAtOnce * kLongestDatagram)) {}

std::size_t DatagramReader::read(int socket, Patience patience, const Take& take) {
  for (std::size_t i = 0; i < kAtOnce; ++i) {
    places_[i] = {texts_.get() + i * kLongestDatagram, kLongestDatagram};
    msghdr& header = messages_[i].msg_hdr;
    header = {};
    header.msg_iov = &places_[i];
    header.msg_iovlen = 1;
    header.msg_control = credentials_[i].bytes.data();
    header.msg_controllen = credentials_[i].bytes.size();
  }
  const int flags =
      MSG_CMSG_CLOEXEC | (patience == Patience::kAMoment ? MSG_WAITFORONE : MSG_DONTWAIT);
  const int count =
      Uninterrupted([&] { return recvmmsg(socket, messages_.data(), kAtOnce, flags, nullptr); });
  for (int i = 0; i < count; ++i) {
    mmsghdr& message = messages_[static_cast<std::size_t>(i)];
    const auto* text = static_cast<const char*>(message.msg_hdr.msg_iov->iov_base);
    take({text, message.msg_len}, SenderOf(message.msg_hdr),
         (message.msg_hdr.msg_flags & MSG_TRUNC) != 0);
  }
  return count > 0 ? static_cast<std::size_t>(count) : 0;
}

}  // namespace quorlet
