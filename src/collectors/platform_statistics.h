// The fixed sequence of collectors that push the day's fresh metrics into the counter store.
#ifndef QUORLET_COLLECTORS_PLATFORM_STATISTICS_H_
#define QUORLET_COLLECTORS_PLATFORM_STATISTICS_H_

#include "platform/platform.h"

namespace quorlet {

// Runs every collector once, whatever the earlier ones did.
void collectPlatformStatistics(Platform& platform);

}  // namespace quorlet

#endif  // QUORLET_COLLECTORS_PLATFORM_STATISTICS_H_
