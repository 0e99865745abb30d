// The pass's record of how worn the drives are.
#ifndef QUORLET_COLLECTORS_FLASH_WEAR_H_
#define QUORLET_COLLECTORS_FLASH_WEAR_H_

#include "platform/counter_store.h"
#include "platform/drives.h"

namespace quorlet {

// Adds today's scalars of each drive that tells any to `counters`, and what has to be remembered of
// the drives when that has changed. A drive of another model or serial number than the last one at
// its place starts its history anew. Nothing is added when what is remembered cannot be read.
void RecordFlash(Drives& drives, CounterStore& store, CounterBatch& counters);

}  // namespace quorlet

#endif  // QUORLET_COLLECTORS_FLASH_WEAR_H_
