// The named service: sockets, frames and the main thread's event loop.
//
// The kernel tells which sources (connections, and the socket for new ones)
// woke up, in the order in which they did: each is told once (edge-triggered)
// and read until it is empty, so that a source that wakes up again while a
// handler runs takes its place behind those that woke up before. What was read
// of one source is handled before the next is read: what a peer adds while it
// waits for its turn is handled in that turn. A peer that floods the service has
// at most one block of its bytes ahead of everybody else's.
#include <poll.h>
#include <sys/epoll.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <deque>
#include <exception>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/base/paths.h"
#include "platform/linux/service/frame_buffer.h"
#include "platform/linux/service/listening_socket.h"
#include "platform/linux/service/services.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

using Time = std::chrono::steady_clock::time_point;

constexpr std::size_t kReadBytes = std::size_t{256} << 10;
// What all connections together may hold; beyond that, messages are taken in one after the other.
constexpr std::size_t kMaxHeldBytes = std::size_t{64} * 1024 * 1024;
// How long one that is in the middle of a message may keep the others waiting then.
constexpr auto kLongestHoldUp = std::chrono::seconds(1);
constexpr int kHeldUpPollMilliseconds = 10;
// New connections in a row before everybody else has a turn.
constexpr int kAcceptsInARow = 64;
constexpr auto kAcceptPause = std::chrono::seconds(1);

// One peer. While it is being announced to the listener it is the Peer that may
// be accepted.
struct Connection : Peer {
  explicit Connection(Descriptor peer) : socket(std::move(peer)) {}
  Descriptor socket;  // not open after the peer has hung up or was dropped
  NamedService::MessageHandler handler;
  FrameBuffer frames;
  std::size_t waiting = 0;  // complete frames that have not been handled
  Time heard;               // when it last said anything
  bool hasSpoken = false;   // a whole message has come
};

// Milliseconds for poll(2): rounded up, so that the end of a slice is not met
// by spinning.
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
  bool serveReady();
  void findReady(Time deadline);
  bool watch(int descriptor, std::uint32_t events);
  bool acceptOne();
  void pauseAccepting(int error);
  bool announce(const std::shared_ptr<Connection>& connection);
  void readFrom(const std::shared_ptr<Connection>& connection);
  void drop(Connection& connection) { connection.socket = Descriptor(); }
  void forgetDropped();
  std::shared_ptr<Connection> findQuietest() const;
  std::shared_ptr<Connection> holdUpOf(const Connection& reading) const;
  void closeIfItKeepsBack(const std::shared_ptr<Connection>& first);
  template <typename Call>
  void guarded(Call call);

  const std::string directory_;
  SystemLog& log_;
  std::optional<ListeningSocket> listening_;
  ListenerHandler listener_;
  Descriptor epoll_;
  std::optional<Time> acceptAgainAt_;  // while no descriptor or memory is left
                                       // for new connections
  bool acceptFails_ = false;           // and that was said
  int acceptsLeft_ = 0;
  Connection* announced_ = nullptr;
  std::vector<std::shared_ptr<Connection>> connections_;
  std::deque<std::shared_ptr<Connection>> arrived_;  // once for each complete frame
  // Sources that have something to be read, in that order; nullptr is the
  // listening socket.
  std::deque<std::shared_ptr<Connection>> ready_;
  std::vector<std::shared_ptr<Connection>> unfinished_;  // they may have more, in the next round
  bool isHeldUp_ = false;  // a connection in unfinished_ waits for another
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
    if (*reason == kAlreadyListening) {
      log_.info("Not listening as %@: %@", name, *reason);
    } else {
      log_.error("Cannot listen at %@/%@: %@", directory_, name, *reason);
    }
    return false;
  }
  epoll_ = Descriptor(epoll_create1(EPOLL_CLOEXEC));
  if (!epoll_.isOpen() || !watch(std::get<ListeningSocket>(socket).get(), EPOLLIN)) {
    log_.error("Cannot listen as %@: %@", name, ErrnoText(errno));
    return false;
  }
  listening_ = std::move(std::get<ListeningSocket>(socket));
  listener_ = std::move(handler);
  return true;
}

MainLoopResult LinuxNamedService::RunMainLoop(double seconds, bool returnAfterOneEvent) {
  const Time deadline = DeadlineIn(seconds);
  // An event that has arrived is handled even in a slice of no time at all: the
  // last look comes after the deadline.
  for (bool isLastLook = false;;) {
    if (handleOneMessage() || serveReady()) {
      if (returnAfterOneEvent) return MainLoopResult::kHandledEvent;
      if (std::chrono::steady_clock::now() >= deadline) return MainLoopResult::kTimedOut;
    } else if (arrived_.empty() && ready_.empty()) {
      if (isLastLook) return MainLoopResult::kTimedOut;
      isLastLook = std::chrono::steady_clock::now() >= deadline;
      findReady(deadline);
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
    PropertyListResult message = PropertyListError{"it could not be read"};
    guarded([&] { message = ReadPropertyList(*frame); });
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

// Takes in what the first ready source has. True when a new peer was announced.
bool LinuxNamedService::serveReady() {
  if (ready_.empty()) return false;
  const std::shared_ptr<Connection> source = std::move(ready_.front());
  ready_.pop_front();
  if (source == nullptr) return acceptOne();
  if (source->socket.isOpen()) readFrom(source);
  return false;
}

// Waits until a source wakes up or the deadline.
void LinuxNamedService::findReady(Time deadline) {
  forgetDropped();
  if (acceptAgainAt_ && std::chrono::steady_clock::now() >= *acceptAgainAt_) {
    acceptAgainAt_.reset();
    if (!watch(listening_->get(), EPOLLIN)) pauseAccepting(errno);
  }
  acceptsLeft_ = kAcceptsInARow;
  ready_.assign(unfinished_.begin(), unfinished_.end());
  unfinished_.clear();
  const Time end = std::min(deadline, acceptAgainAt_.value_or(deadline));
  int timeout = ready_.empty() ? PollTimeout(end) : 0;
  if (std::exchange(isHeldUp_, false)) timeout = kHeldUpPollMilliseconds;
  if (!epoll_.isOpen()) {
    poll(nullptr, 0, timeout);
    return;
  }
  std::array<epoll_event, kMaxConnections + 1> events;
  const int count =
      epoll_wait(epoll_.get(), events.data(), static_cast<int>(events.size()), timeout);
  for (int i = 0; i < count; ++i) {
    const int descriptor = events[static_cast<std::size_t>(i)].data.fd;
    const auto found = std::ranges::find(
        connections_, descriptor, [](const auto& connection) { return connection->socket.get(); });
    if (found != connections_.end()) {
      ready_.push_back(*found);
    } else if (descriptor == listening_->get()) {
      ready_.push_back(nullptr);
    }
  }
}

bool LinuxNamedService::watch(int descriptor, std::uint32_t events) {
  epoll_event event{};
  event.events = events;
  event.data.fd = descriptor;
  return epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, descriptor, &event) == 0;
}

// Takes in one new connection. False when it is none of ours.
bool LinuxNamedService::acceptOne() {
  forgetDropped();
  const bool isFull = connections_.size() >= kMaxConnections;
  const auto quietest = isFull ? findQuietest() : nullptr;
  // Where everybody has something to be read, that comes first; the newcomer
  // waits in the queue.
  if (acceptsLeft_-- <= 0 || (isFull && quietest == nullptr)) return false;
  Descriptor socket(accept4(listening_->get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
  if (!socket.isOpen()) {
    if (errno != EAGAIN && errno != EINTR && errno != ECONNABORTED) pauseAccepting(errno);
    return false;
  }
  acceptFails_ = false;
  ready_.push_front(nullptr);  // one wake-up stands for all in the queue
  ucred peer{};
  socklen_t size = sizeof peer;
  if (getsockopt(socket.get(), SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0 ||
      (peer.uid != 0 && peer.uid != geteuid())) {
    log_.error(
        "Closing a connection of user %u: only root and our own user "
        "are served",
        static_cast<unsigned>(peer.uid));
    return false;
  }
  if (!watch(socket.get(), EPOLLIN | EPOLLET)) {
    log_.error("Closing a connection that cannot be watched: %@", ErrnoText(errno));
    return false;
  }
  if (isFull) {
    log_.info("Dropping a silent connection for a new one");
    drop(*quietest);
    forgetDropped();
  }
  auto connection = std::make_shared<Connection>(std::move(socket));
  connection->heard = std::chrono::steady_clock::now();
  connections_.push_back(connection);
  return announce(connection);
}

// Out of descriptors or memory: the peer stays in the queue, and asking again
// at once would spin.
void LinuxNamedService::pauseAccepting(int error) {
  if (!acceptFails_) log_.error("Cannot accept connections: %@", ErrnoText(error));
  acceptFails_ = true;
  acceptAgainAt_ = std::chrono::steady_clock::now() + kAcceptPause;
  epoll_ctl(epoll_.get(), EPOLL_CTL_DEL, listening_->get(), nullptr);
}

bool LinuxNamedService::announce(const std::shared_ptr<Connection>& connection) {
  announced_ = connection.get();
  guarded([&] { listener_({connection.get()}); });
  announced_ = nullptr;
  if (connection->handler) {
    ready_.push_front(connection);  // what it sent came with it
  } else {
    drop(*connection);
  }
  return true;
}

// Reads what there is, at most about one block.
void LinuxNamedService::readFrom(const std::shared_ptr<Connection>& connection) {
  readBuffer_.resize(kReadBytes);
  for (std::size_t taken = 0; taken < kReadBytes;) {
    if (const auto first = holdUpOf(*connection)) {
      closeIfItKeepsBack(first);
      isHeldUp_ = true;
      break;
    }
    const ssize_t size = Uninterrupted(
        [&] { return recv(connection->socket.get(), readBuffer_.data(), readBuffer_.size(), 0); });
    if (size < 0 && errno == EAGAIN) return;
    if (size <= 0) {
      // A peer that hangs up in the middle of a frame is no event, and nobody's
      // error.
      drop(*connection);
      return;
    }
    taken += static_cast<std::size_t>(size);
    connection->heard = std::chrono::steady_clock::now();
    const std::size_t completed =
        connection->frames.append({readBuffer_.data(), static_cast<std::size_t>(size)});
    connection->hasSpoken = connection->hasSpoken || completed != 0;
    connection->waiting += completed;
    arrived_.insert(arrived_.end(), completed, connection);
    if (connection->frames.isBroken()) {
      log_.error(
          "Closing a connection: it announced a message of more than "
          "%llu bytes",
          kMaxFrameBytes);
      drop(*connection);
      return;
    }
  }
  unfinished_.push_back(connection);
}

// Connections that are gone; those with frames left to be handled live on in
// arrived_.
void LinuxNamedService::forgetDropped() {
  std::erase_if(connections_, [](const auto& connection) { return !connection->socket.isOpen(); });
}

// The connection that gives its place to a newcomer: one that has nothing
// unread; those that have never sent a message first, since a peer that has may
// well be waiting for its notification; then the one that has been silent
// longest. nullptr when everybody has something unread.
std::shared_ptr<Connection> LinuxNamedService::findQuietest() const {
  std::shared_ptr<Connection> quietest;
  for (const auto& connection : connections_) {
    int unread = 0;
    if (ioctl(connection->socket.get(), FIONREAD, &unread) == 0 && unread > 0) continue;
    const auto rank = [](const Connection& each) { return std::pair(each.hasSpoken, each.heard); };
    if (quietest == nullptr || rank(*connection) < rank(*quietest)) quietest = connection;
  }
  return quietest;
}

// The connection that must come to the end of its message before more is read of this one: once all
// together hold too much, the one that is nearest to it. Peers that are only slow wait for it.
std::shared_ptr<Connection> LinuxNamedService::holdUpOf(const Connection& reading) const {
  if (reading.frames.size() <= kReadBytes) return nullptr;
  std::size_t held = 0;
  std::shared_ptr<Connection> first;
  for (const auto& connection : connections_) {
    held += connection->frames.size();
    if (!connection->socket.isOpen()) continue;
    if (first == nullptr || connection->frames.size() > first->frames.size()) first = connection;
  }
  return held <= kMaxHeldBytes || first.get() == &reading ? nullptr : first;
}

// What others wait for must not keep them waiting for ever.
void LinuxNamedService::closeIfItKeepsBack(const std::shared_ptr<Connection>& first) {
  if (std::chrono::steady_clock::now() - first->heard < kLongestHoldUp) return;
  log_.error("Closing a connection that keeps back the rest of a message, to save memory");
  drop(*first);
  std::erase(connections_, first);
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
