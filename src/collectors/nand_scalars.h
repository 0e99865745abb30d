// The storage step of the daily pass.
#ifndef QUORLET_COLLECTORS_NAND_SCALARS_H_
#define QUORLET_COLLECTORS_NAND_SCALARS_H_

#include "platform/platform.h"

namespace quorlet {

// Writes the storage structured log (and the status log), if `logsStorage`, then puts the counter
// of each number of the NAND information dictionary into `counters`. When there is none, one line
// in the system log says so.
void PushNANDInfoScalars(Platform& platform, CounterBatch& counters, bool logsStorage);

}  // namespace quorlet

#endif  // QUORLET_COLLECTORS_NAND_SCALARS_H_
