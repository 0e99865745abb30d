// A named service that other processes send messages to, and the main thread's event loop that
// delivers them.
#ifndef QUORLET_PLATFORM_NAMED_SERVICE_H_
#define QUORLET_PLATFORM_NAMED_SERVICE_H_

#include <functional>
#include <string_view>

#include "drvreport/property_value.h"

namespace quorlet {

enum class MainLoopResult { kFinished, kStopped, kTimedOut, kHandledEvent };

// A process that has connected to the service; owned by the service, valid during the listener
// handler's call.
class Peer {
 public:
  virtual ~Peer() = default;
};

// What a listener is told. `peer` is nullptr for every event but a new connection.
struct ListenerEvent {
  Peer* peer = nullptr;
};

// All handlers run inside RunMainLoop, on the thread that calls it, one at a time.
class NamedService {
 public:
  using ListenerHandler = std::function<void(const ListenerEvent& event)>;
  using MessageHandler = std::function<void(const PropertyValue& message)>;

  virtual ~NamedService() = default;

  // Registers as the listener of the service `name` and delivers its events to `handler` until the
  // process ends. False, after one error line, when the listener cannot be created.
  virtual bool ListenNamedService(std::string_view name, ListenerHandler handler) = 0;

  // Takes the new connection; its messages go to `handler` in their order. Among connections, those
  // have the first turn that were the first to have something to say. A peer that is not accepted
  // in the listener handler is disconnected.
  virtual void AcceptPeerConnection(Peer& peer, MessageHandler handler) = 0;

  // Serves events for at most `seconds`, with returnAfterOneEvent until one has been handled.
  // Waits out the whole time when there is nothing to serve. A message counts as an event, and so
  // does a new connection; a frame that is still incomplete, or a peer that hangs up, does not.
  virtual MainLoopResult RunMainLoop(double seconds, bool returnAfterOneEvent) = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_NAMED_SERVICE_H_
