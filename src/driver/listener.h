// The listener of the named service: announcements, requests for a pass, and app info from peers.
//
// A message is a dictionary with the integer "operation" (compared by its low 32 bits):
//   0  logging status: the app info is wanted and the logging notification is posted
//   1  run the daily pass for the day in "value"
//   2  app info: "app_data", an array of dictionaries with "uuid" (16 bytes of data), "bundle_id",
//      "version" (strings), "tesk_id" and "arch" (integers)
// Only the first message other than app info counts in the life of a process. No reply is sent.
#ifndef QUORLET_DRIVER_LISTENER_H_
#define QUORLET_DRIVER_LISTENER_H_

#include <atomic>
#include <cstdint>

#include "driver/run_driver.h"
#include "drvreport/property_value.h"
#include "platform/named_service.h"
#include "platform/names.h"
#include "platform/platform.h"

namespace quorlet {

class Listener {
 public:
  Listener(Platform& platform, RunDriver& driver) : platform_(platform), driver_(driver) {}

  // Serves the service until a slice of 10 seconds passes without an event, then runs the gated
  // pass if app info was requested and never came.
  void serve();

  // The handler of listener events: accepts new peers.
  void handleListenerEvent(const ListenerEvent& event);

  // The handler of a connection's messages.
  void handlePeerMessage(const PropertyValue& message);

  // Whether the logging status was announced and the app info has not arrived yet.
  bool appInfoRequested() const { return appInfoRequested_; }

 private:
  void handleAppInfo(const Dictionary& message);
  void handleStatusOperation(std::int32_t operation, const Dictionary& message);

  Platform& platform_;
  RunDriver& driver_;
  bool appInfoRequested_ = false;
  std::atomic_flag statusHandled_;
};

// Appends the app-info record ("bundle", "version", "teskID", "arch", "uuid") of one "app_data"
// element to `records`; an element without a 16-byte uuid, bundle or version adds nothing. Returns
// true: the next element follows.
bool appInfoRecordFromMessage(const PropertyValue& element, Array& records);

}  // namespace quorlet

#endif  // QUORLET_DRIVER_LISTENER_H_
