// The one walk over an aggregate that every operation on more than one channel goes through.
#ifndef QUORLET_CHANNELS_WALK_H_
#define QUORLET_CHANNELS_WALK_H_

#include <functional>
#include <optional>

#include "drvreport/drvreport.h"

namespace quorlet {

using IterateCallback = std::function<int(Dictionary& channel)>;
using PruneCallback = std::function<int(Dictionary& channel)>;
// 0 puts the new channel into the result, kDrvReportLeaveOut leaves it out.
using CloneCallback = std::function<int(const Dictionary& channel, Dictionary& newChannel)>;
// The new channel is a copy of `channel` with the partner's records, their values all invalid.
using CompareCallback = std::function<int(const Dictionary& partner, const Dictionary& channel,
                                          Dictionary& newChannel)>;

// What a walk is for: the first of these that is there.
struct WalkContext {
  IterateCallback iterate = {};
  PruneCallback prune = {};
  CloneCallback clone = {};
  CompareCallback compare = {};
};

// Walks `aggregate`; see "Walking" in drvreport.h for the result. To compare, `partner` is the
// other aggregate; to clone and compare, `out` receives the new one.
int iterateAggregate(const Dictionary& aggregate, const Dictionary* partner,
                     const WalkContext& context, std::optional<Dictionary>* out);

// A new aggregate of copies of the channels, without options; nothing when the walk failed.
std::optional<Dictionary> cloneAggregate(const Dictionary& aggregate, const CloneCallback& clone);

// A new aggregate of the second one's channels, each compared with its partner in the first, the
// channel of the same driver ID, channel ID and type word. A channel without a partner is copied.
// Nothing unless the walk's result is 0.
std::optional<Dictionary> compareAggregates(const Dictionary& first, const Dictionary& second,
                                            const CompareCallback& compare);

}  // namespace quorlet

#endif  // QUORLET_CHANNELS_WALK_H_
