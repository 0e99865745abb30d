// The difference of two samples of one channel.
#ifndef QUORLET_CHANNELS_DELTAS_H_
#define QUORLET_CHANNELS_DELTAS_H_

#include <optional>

#include "drvreport/drvreport.h"

namespace quorlet {

// Writes later - earlier into the records of `result`, a third sample of the same format that has
// records of its own; the other two are not changed. The code and the stored error on failure:
//   kKernelBadArgument        a format is unknown (0) or the formats differ
//   kDrvReportUnknownFormat   a format above 4
//   kKernelError              simple: a value cannot be read, or the result is not one record
//   1                         other formats: counts disagree, or a value cannot be read
KernelReturn _computeDelta(const Dictionary& earlier, const Dictionary& later, Dictionary& result,
                           std::optional<ErrorValue>* error = nullptr);

}  // namespace quorlet

#endif  // QUORLET_CHANNELS_DELTAS_H_
