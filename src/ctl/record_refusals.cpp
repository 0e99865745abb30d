#include "ctl/record_refusals.h"

#include <algorithm>
#include <numeric>

#include "ctl/output.h"

namespace quorlet {
namespace {

constexpr std::size_t kMostSenders = 64;
// In the order of Refusal.
constexpr std::array<const char*, kRefusalCount> kReasons = {
    "not readable",
    "key too long",
    "key with blanks or control bytes",
    "sets",
    "events",
    "service checks",
    "key that no whitelist entry names",
    "reserved key",
    "too many keys today",
    "too many keys of one user today",
    "too many values of one key today",
    "the store is full",
};

}  // namespace

void RecordRefusals::add(Refusal reason, Sender sender) {
  ++byReason_[static_cast<std::size_t>(reason)];
  if (bySender_.size() < kMostSenders || bySender_.contains(sender)) ++bySender_[sender];
}

std::optional<std::string> RecordRefusals::take() {
  const std::uint64_t all = std::accumulate(byReason_.begin(), byReason_.end(), std::uint64_t{0});
  if (all == 0) return std::nullopt;
  std::string text = "The recording socket refused " + Counted(all, "line") + ": ";
  const char* separator = "";
  for (std::size_t i = 0; i < kRefusalCount; ++i) {
    if (byReason_[i] == 0) continue;
    text += separator + std::string(kReasons[i]) + " " + std::to_string(byReason_[i]);
    separator = ", ";
  }
  const auto most =
      std::ranges::max_element(bySender_, {}, [](const auto& sender) { return sender.second; });
  text += "; most of them, " + std::to_string(most->second) + ", from ";
  text += most->first ? "uid " + std::to_string(*most->first) : "an unknown user";
  *this = {};
  return text;
}

}  // namespace quorlet
