#include "platform/linux/live/running_totals.h"

#include <algorithm>

namespace quorlet {

std::int64_t RunningTotals::add(std::uint64_t id, std::size_t slot, std::uint64_t reading,
                                std::uint64_t range, std::uint64_t life) {
  Counter& counter = counters_[{id, slot}];  // from 0: the first reading is all growth
  std::uint64_t growth = reading;
  if (life != counter.life) {
    counter.life = life;
  } else if (reading >= counter.last) {
    growth = reading - counter.last;
  } else if (counter.last <= range && range - counter.last + reading < range / 2) {
    growth = range - counter.last + reading;
  }
  counter.last = reading;
  counter.total += std::min<std::uint64_t>(growth, INT64_MAX - counter.total);
  return static_cast<std::int64_t>(counter.total);
}

}  // namespace quorlet
