// The kernel's queue of ECC (error-correcting code) events.
#ifndef QUORLET_COLLECTORS_ECC_EVENTS_H_
#define QUORLET_COLLECTORS_ECC_EVENTS_H_

#include "platform/crash_support.h"
#include "platform/kernel_parameters.h"
#include "platform/system_log.h"

namespace quorlet {

// Writes up to 10 pending events as entries of type 172 to the structured log and, once these are
// durable, takes them off the queue; the rest waits for the next pass, as do all of them when the
// log cannot be written. One line in the system log when reading fails otherwise than for want of
// an event.
void logECCEvents(KernelParameters& kernel, CrashSupport& support, SystemLog& log);

}  // namespace quorlet

#endif  // QUORLET_COLLECTORS_ECC_EVENTS_H_
