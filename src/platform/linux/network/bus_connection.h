// A connection to a D-Bus peer, or to the message bus, with a deadline.
#ifndef QUORLET_PLATFORM_LINUX_NETWORK_BUS_CONNECTION_H_
#define QUORLET_PLATFORM_LINUX_NETWORK_BUS_CONNECTION_H_

#include <chrono>
#include <cstddef>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/descriptor.h"
#include "platform/linux/network/bus_message.h"

namespace quorlet {

class BusConnection {
 public:
  using Deadline = std::chrono::steady_clock::time_point;

  // Nothing below waits beyond `deadline`.
  explicit BusConnection(Deadline deadline) : deadline_(deadline) {}

  // Connects to the stream socket at `path` and says who is asking. False when nobody answers
  // there.
  [[nodiscard]] bool connect(const std::string& path);

  // Makes all calls and gives the bodies of their replies in the order of the calls; the body is
  // empty when the call failed or its reply does not have `signature`. nullopt when the peer did
  // not answer all of them in time, or broke the protocol: the connection is of no use then.
  [[nodiscard]] std::optional<std::vector<std::string>> call(std::span<const BusCall> calls,
                                                             std::string_view signature);
  // The error's name of the last call that failed with one; empty before.
  const std::string& failure() const { return failure_; }

 private:
  bool waitFor(short event) const;
  bool sendAll(std::string_view bytes);
  bool receiveSome();
  bool authenticate();
  std::optional<std::string> receiveMessage();

  const Deadline deadline_;
  Descriptor socket_;
  std::string received_;  // what has come and is not used yet
  std::uint32_t lastSerial_ = 0;
  std::string failure_;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_NETWORK_BUS_CONNECTION_H_
