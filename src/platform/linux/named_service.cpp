// The named service: sockets, frames and the main thread's event loop.
//
// A connection is read only while none of its frames waits to be handled. A peer that floods the
// service so has at most one block of its bytes ahead of everybody else's, and messages are handled
// in the order in which their last bytes were read.
#include "platform/linux/named_service.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <deque>
#include <exception>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/frame_buffer.h"
#include "platform/linux/listening_socket.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

using Time = std::chrono::steady_clock::time_point;

constexpr std::size_t kReadBytes = 256 * 1024;

// One peer. While it is being announced to the listener it is the Peer that may be accepted.
struct Connection : Peer {
  explicit Connection(Descriptor peer) : socket(std::move(peer)) {}
  Descriptor socket;  // not open after the peer has hung up or was dropped
  NamedService::MessageHandler handler;
  FrameBuffer frames;
  std::size_t waiting = 0;  // complete frames that have not been handled
  std::uint64_t heard = 0;  // the higher, the later
};

// Milliseconds for poll(2): rounded up, so that the end of a slice is not met by spinning.
int PollTimeout(Time deadline) {
  const auto left =
      std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
  return static_cast<int>(std::clamp<std::int64_t>(left.count(), 0, 1'000'000));
}

Time DeadlineIn(double seconds) {
  constexpr double kLongest = 1e6;
  const double sane = std::isnan(seconds) ? 0 : std::clamp(seconds, 0.0, kLongest);
  return std::chrono::steady_clock::now() +
         std::chrono::ceil<std::chrono::nanoseconds>(std::chrono::duration<double>(sane));
}

class LinuxNamedService : public NamedService {
 public:
  LinuxNamedService(const Root& root, SystemLog& log)
      : directory_(root.path(kServiceDirectory)), log_(log) {}

  bool ListenNamedService(std::string_view name, ListenerHandler handler) override;
  void AcceptPeerConnection(Peer& peer, MessageHandler handler) override {
    if (&peer == announced_) announced_->handler = std::move(handler);
  }
  MainLoopResult RunMainLoop(double seconds, bool returnAfterOneEvent) override;

 private:
  bool handleOneMessage();
  bool pollOnce(Time deadline);
  bool acceptOne();
  bool announce(Connection& connection);
  void readFrom(Connection& connection);
  void drop(Connection& connection) { connection.socket = Descriptor(); }
  void forgetDropped();
  void makeRoom();
  template <typename Call>
  void guarded(Call call);

  const std::string directory_;
  SystemLog& log_;
  std::optional<ListeningSocket> listening_;
  ListenerHandler listener_;
  bool acceptPaused_ = false;  // for the rest of the slice
  Connection* announced_ = nullptr;
  std::vector<std::shared_ptr<Connection>> connections_;
  std::deque<std::shared_ptr<Connection>> arrived_;  // once for each complete frame
  std::uint64_t clock_ = 0;
  std::string readBuffer_;
};

bool LinuxNamedService::ListenNamedService(std::string_view name, ListenerHandler handler) {
  if (!IsSafeName(name)) {
    log_.error("Refused the service name \"%@\"", name.substr(0, 200));
    return false;
  }
  auto passed = ListeningSocket::Passed();
  auto socket = passed ? std::move(*passed) : ListeningSocket::Make(directory_, std::string(name));
  if (const auto* reason = std::get_if<std::string>(&socket)) {
    log_.error("Cannot listen as %@: %@", name, *reason);
    return false;
  }
  listening_ = std::move(std::get<ListeningSocket>(socket));
  listener_ = std::move(handler);
  return true;
}

MainLoopResult LinuxNamedService::RunMainLoop(double seconds, bool returnAfterOneEvent) {
  const Time deadline = DeadlineIn(seconds);
  acceptPaused_ = false;
  for (bool first = true;; first = false) {
    // An event that has arrived is handled even in a slice of no time at all.
    const bool handled = handleOneMessage() || pollOnce(deadline);
    if (handled && returnAfterOneEvent) return MainLoopResult::kHandledEvent;
    if (!first && (arrived_.empty() || !returnAfterOneEvent) &&
        std::chrono::steady_clock::now() >= deadline) {
      return MainLoopResult::kTimedOut;
    }
  }
}

// Handles the message that arrived first. False when none waits.
bool LinuxNamedService::handleOneMessage() {
  while (!arrived_.empty()) {
    const std::shared_ptr<Connection> connection = std::move(arrived_.front());
    arrived_.pop_front();
    --connection->waiting;
    const auto frame = connection->frames.take();
    if (!frame || !connection->handler) continue;
    const auto message = ReadPropertyList(*frame);
    if (const auto* error = std::get_if<PropertyListError>(&message)) {
      log_.error("Closing a connection: its message is not a property list: %@",
                 error->description);
      connection->handler = nullptr;  // what it sent after that is not looked at
      drop(*connection);
      continue;
    }
    guarded([&] { connection->handler(std::get<PropertyValue>(message)); });
    return true;
  }
  return false;
}

// Waits until something happens or the deadline, and takes in what there is. True when a new peer
// was announced.
bool LinuxNamedService::pollOnce(Time deadline) {
  forgetDropped();
  std::vector<pollfd> polled;
  for (const auto& connection : connections_) {
    polled.push_back({connection->waiting == 0 ? connection->socket.get() : -1, POLLIN, 0});
  }
  const bool accepts = listening_ && !acceptPaused_;
  polled.push_back({accepts ? listening_->get() : -1, POLLIN, 0});
  if (poll(polled.data(), polled.size(), PollTimeout(deadline)) <= 0) return false;
  for (std::size_t i = 0; i + 1 < polled.size(); ++i) {
    if (polled[i].revents != 0) readFrom(*connections_[i]);
  }
  for (std::size_t i = 0; i + 1 < polled.size(); ++i) {
    for (std::size_t n = 0; polled[i].revents != 0 && n < connections_[i]->waiting; ++n) {
      arrived_.push_back(connections_[i]);
    }
  }
  return polled.back().revents != 0 && acceptOne();
}

// Takes in one new connection. False when it is none of ours.
bool LinuxNamedService::acceptOne() {
  Descriptor socket(accept4(listening_->get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
  if (!socket.isOpen()) {
    if (errno == EAGAIN || errno == EINTR || errno == ECONNABORTED) return false;
    // Out of descriptors or memory: the peer stays in the queue, and asking again would only spin.
    log_.error("Cannot accept a connection: %@", ErrnoText(errno));
    acceptPaused_ = true;
    return false;
  }
  ucred peer{};
  socklen_t size = sizeof peer;
  if (getsockopt(socket.get(), SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0 ||
      (peer.uid != 0 && peer.uid != geteuid())) {
    log_.error("Closing a connection of user %u: only root and our own user are served",
               static_cast<unsigned>(peer.uid));
    return false;
  }
  makeRoom();
  auto connection = std::make_shared<Connection>(std::move(socket));
  connection->heard = ++clock_;
  connections_.push_back(connection);
  return announce(*connection);
}

bool LinuxNamedService::announce(Connection& connection) {
  announced_ = &connection;
  guarded([&] { listener_({&connection}); });
  announced_ = nullptr;
  if (!connection.handler) drop(connection);
  return true;
}

void LinuxNamedService::readFrom(Connection& connection) {
  readBuffer_.resize(kReadBytes);
  const ssize_t size = Uninterrupted(
      [&] { return recv(connection.socket.get(), readBuffer_.data(), readBuffer_.size(), 0); });
  if (size < 0 && errno == EAGAIN) return;
  if (size <= 0) {
    // A peer that hangs up in the middle of a frame is no event, and nobody's error.
    drop(connection);
    return;
  }
  connection.heard = ++clock_;
  connection.waiting +=
      connection.frames.append({readBuffer_.data(), static_cast<std::size_t>(size)});
  if (connection.frames.isBroken()) {
    log_.error("Closing a connection: it announced a message of more than %llu bytes",
               kMaxFrameBytes);
    drop(connection);
  }
}

// Connections that are gone; those with frames left to be handled live on in arrived_.
void LinuxNamedService::forgetDropped() {
  std::erase_if(connections_, [](const auto& connection) { return !connection->socket.isOpen(); });
}

// Drops the connection that has been silent longest, if there is no place for one more.
void LinuxNamedService::makeRoom() {
  forgetDropped();
  if (connections_.size() < kMaxConnections) return;
  const auto silent = std::ranges::min_element(connections_, {}, [](const auto& connection) {
    return std::pair(connection->waiting != 0, connection->heard);
  });
  log_.info("Dropping a silent connection for a new one");
  connections_.erase(silent);
}

// What a handler throws must not end the service.
template <typename Call>
void LinuxNamedService::guarded(Call call) {
  try {
    call();
  } catch (const std::exception& failure) {
    log_.error("A message could not be handled: %s", failure.what());
  }
}

}  // namespace

std::unique_ptr<NamedService> MakeLinuxNamedService(const Root& root, SystemLog& log) {
  return std::make_unique<LinuxNamedService>(root, log);
}

}  // namespace quorlet
