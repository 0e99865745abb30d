// Counters of the kernel as totals that never fall while the program runs.
#ifndef QUORLET_PLATFORM_LINUX_LIVE_RUNNING_TOTALS_H_
#define QUORLET_PLATFORM_LINUX_LIVE_RUNNING_TOTALS_H_

#include <cstddef>
#include <cstdint>
#include <map>
#include <utility>

namespace quorlet {

// The first reading of a counter is its total; later ones add what it has grown by. A counter that
// falls has run over its range when it would have grown by less than half the range that way, and
// has started again from 0 otherwise.
class RunningTotals {
 public:
  // Reading `slot` of channel `id`. `range` is what the counter counts up to before it starts at 0
  // again, 0 for one that never does. A reading of another `life` is of a counter that was started
  // anew. At most the largest signed 64-bit number.
  std::int64_t add(std::uint64_t id, std::size_t slot, std::uint64_t reading,
                   std::uint64_t range = 0, std::uint64_t life = 0);

 private:
  struct Counter {
    std::uint64_t last = 0;
    std::uint64_t total = 0;
    std::uint64_t life = 0;
  };
  std::map<std::pair<std::uint64_t, std::size_t>, Counter> counters_;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_LIVE_RUNNING_TOTALS_H_
