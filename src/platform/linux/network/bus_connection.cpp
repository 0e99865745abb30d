#include "platform/linux/network/bus_connection.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <climits>
#include <cstdint>
#include <cstring>

namespace quorlet {
namespace {

constexpr std::size_t kMaxMessageBytes = 4 * 1024 * 1024;
constexpr std::size_t kMaxGreetingBytes = 512;
// A message bus refuses a peer that has more than 128 calls open.
constexpr std::size_t kMaxOpenCalls = 64;

}  // namespace

bool BusConnection::waitFor(short event) const {
  int ready = 0;
  do {
    const auto left =
        std::chrono::ceil<std::chrono::milliseconds>(deadline_ - std::chrono::steady_clock::now());
    if (left.count() <= 0) return false;
    pollfd entry = {.fd = socket_.get(), .events = event, .revents = 0};
    ready = poll(&entry, 1, static_cast<int>(std::min<std::int64_t>(left.count(), INT_MAX)));
  } while (ready < 0 && errno == EINTR);
  return ready > 0;  // an error or hang-up shows when the socket is used
}

bool BusConnection::sendAll(std::string_view bytes) {
  while (!bytes.empty()) {
    if (!waitFor(POLLOUT)) return false;
    const ssize_t count = send(socket_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (count < 0 && errno != EINTR && errno != EAGAIN) return false;
    if (count > 0) bytes.remove_prefix(static_cast<std::size_t>(count));
  }
  return true;
}

bool BusConnection::receiveSome() {
  if (!waitFor(POLLIN)) return false;
  std::array<char, 16 * 1024> chunk;
  const ssize_t count = recv(socket_.get(), chunk.data(), chunk.size(), 0);
  if (count < 0) return errno == EINTR || errno == EAGAIN;
  received_.append(chunk.data(), static_cast<std::size_t>(count));
  return count > 0;
}

bool BusConnection::connect(const std::string& path) {
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) return false;
  std::memcpy(address.sun_path, path.data(), path.size());
  socket_ = Descriptor(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  received_.clear();
  // A socket of this family connects at once or not at all.
  return socket_.isOpen() &&
         Uninterrupted([&] {
           return ::connect(socket_.get(), reinterpret_cast<const sockaddr*>(&address),
                            sizeof address);
         }) == 0 &&
         authenticate();
}

// The peer takes the identity from the socket; the text is the user's number in hexadecimal digits
// of its decimal ones.
bool BusConnection::authenticate() {
  std::string greeting("\0AUTH EXTERNAL ", 15);
  for (const char digit : std::to_string(geteuid())) {
    greeting += '3';
    greeting += digit;
  }
  // All at once: a service manager that reads BEGIN together with a call overlooks the call.
  if (!sendAll(greeting + "\r\nBEGIN\r\n")) return false;
  std::size_t end;
  while ((end = received_.find("\r\n")) == std::string::npos) {
    if (received_.size() > kMaxGreetingBytes || !receiveSome()) return false;
  }
  const bool isWelcome = received_.starts_with("OK ");
  received_.erase(0, end + 2);
  return isWelcome;
}

std::optional<std::string> BusConnection::receiveMessage() {
  while (received_.size() < kBusHeaderBytes) {
    if (!receiveSome()) return std::nullopt;
  }
  const auto length = BusMessageLength(received_, kMaxMessageBytes);
  if (!length) return std::nullopt;
  while (received_.size() < *length) {
    if (!receiveSome()) return std::nullopt;
  }
  std::string message = received_.substr(0, *length);
  received_.erase(0, *length);
  return message;
}

std::optional<std::vector<std::string>> BusConnection::call(std::span<const BusCall> calls,
                                                            std::string_view signature) {
  std::vector<std::string> bodies;
  for (std::size_t begin = 0; begin < calls.size(); begin += kMaxOpenCalls) {
    const std::size_t count = std::min(kMaxOpenCalls, calls.size() - begin);
    const std::uint32_t firstSerial = lastSerial_ + 1;
    std::string bytes;
    for (const BusCall& each : calls.subspan(begin, count)) {
      bytes += EncodeBusCall(++lastSerial_, each);
    }
    if (!sendAll(bytes)) return std::nullopt;
    std::vector<std::optional<std::string>> replies(count);
    for (std::size_t missing = count; missing > 0;) {
      const auto message = receiveMessage();
      if (!message) return std::nullopt;
      const auto parsed = ParseBusMessage(*message);
      if (!parsed) return std::nullopt;
      const std::uint32_t index = parsed->replySerial - firstSerial;
      // Signals come unasked.
      if (parsed->replySerial == 0 || index >= count || replies[index]) continue;
      if (!parsed->error.empty()) failure_ = parsed->error;
      replies[index] = parsed->signature == signature ? parsed->body : "";
      --missing;
    }
    for (auto& reply : replies) bodies.push_back(std::move(*reply));
  }
  return bodies;
}

}  // namespace quorlet
