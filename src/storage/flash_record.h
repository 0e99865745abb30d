// The pass's record of how worn the drives are.
#ifndef QUORLET_STORAGE_FLASH_RECORD_H_
#define QUORLET_STORAGE_FLASH_RECORD_H_

#include "platform/platform.h"

namespace quorlet {

// Adds today's scalars of each drive that tells any to `counters`, and what has to be remembered of
// the drives when that has changed. A drive of another model or serial number than the last one at
// its place starts its history anew. Nothing is added when what is remembered cannot be read.
void RecordFlash(Platform& platform, CounterBatch& counters);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_FLASH_RECORD_H_
