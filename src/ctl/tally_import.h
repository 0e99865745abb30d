// Reading counters from lines (ctl/tally_lines.h) into the counter store.
#ifndef QUORLET_CTL_TALLY_IMPORT_H_
#define QUORLET_CTL_TALLY_IMPORT_H_

#include <cstdint>
#include <string>

#include "ctl/messages.h"
#include "platform/counter_store.h"

namespace quorlet {

struct ImportCounts {
  std::uint64_t scalars = 0;
  std::uint64_t values = 0;
};

// Imports every line of the file (standard input: "-") or, after a Failure that names the line,
// none. All lines are read before the store is locked; more than fits into bounded memory is
// refused.
ImportCounts ImportTallies(const std::string& file, CounterStore& store, const Messages& messages);

}  // namespace quorlet

#endif  // QUORLET_CTL_TALLY_IMPORT_H_
