// What was not recorded, for one line of the system log a minute.
#ifndef QUORLET_CTL_RECORD_REFUSALS_H_
#define QUORLET_CTL_RECORD_REFUSALS_H_

#include <sys/types.h>

#include <array>
#include <cstdint>
#include <map>
#include <optional>
#include <string>

#include "ctl/statsd_line.h"

namespace quorlet {

// Who sent a datagram, as the kernel says; nobody when it does not, as over UDP.
using Sender = std::optional<uid_t>;

// In bounded memory, whatever is sent.
class RecordRefusals {
 public:
  void add(Refusal reason, Sender sender);
  // The line for what was added since the last call; nothing when nothing was.
  std::optional<std::string> take();

 private:
  std::array<std::uint64_t, kRefusalCount> byReason_{};
  // The users told apart; the lines of further ones only count in the reasons.
  std::map<Sender, std::uint64_t> bySender_;
};

}  // namespace quorlet

#endif  // QUORLET_CTL_RECORD_REFUSALS_H_
