// The fixed sequence of collectors that push the day's fresh metrics into the counter store.
#ifndef QUORLET_COLLECTORS_PLATFORM_STATISTICS_H_
#define QUORLET_COLLECTORS_PLATFORM_STATISTICS_H_

#include <functional>

#include "platform/platform.h"

namespace quorlet {

// How far a pass that was cut short got with the storage log, which must not be doubled.
struct PassProgress {
  // Its entries are in the structured log, or staged for it.
  bool storageLogged = false;
  // Makes what says so of this pass, to be stored together with the storage figures; or empty.
  std::function<StoreNote()> storageLoggedNote;
};

// Runs every collector once, whatever the earlier ones did.
void collectPlatformStatistics(Platform& platform, const PassProgress& progress = {});

}  // namespace quorlet

#endif  // QUORLET_COLLECTORS_PLATFORM_STATISTICS_H_
