// The kernel's queue of ECC (error-correcting code) events.
#ifndef QUORLET_COLLECTORS_ECC_EVENTS_H_
#define QUORLET_COLLECTORS_ECC_EVENTS_H_

#include "platform/platform.h"

namespace quorlet {

// Takes up to 10 pending events off the queue and writes each as an entry of type 172 to the
// structured log; the rest waits for the next pass. One line in the system
// log when reading fails otherwise than for want of an event.
void logECCEvents(Platform& platform);

}  // namespace quorlet

#endif  // QUORLET_COLLECTORS_ECC_EVENTS_H_
