// The tasking that the diagnostics service hands down through preferences: values to be written
// into preference domains, with an identifier and a digest.
#ifndef QUORLET_DRIVER_TASKING_H_
#define QUORLET_DRIVER_TASKING_H_

#include "platform/platform.h"

namespace quorlet {

// Notes a change of the OS build, replaces the applied tasking when the scheduled one or the build
// differs, and triggers log submission on the days after an OS change that tasking sets. Stored
// values of the wrong type count as absent; a payload entry without "Key" or "Domain" is skipped.
void updateTasking(Platform& platform);

}  // namespace quorlet

#endif  // QUORLET_DRIVER_TASKING_H_
