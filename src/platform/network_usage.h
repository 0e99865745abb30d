// The network-usage service: cumulative byte counts of every process.
#ifndef QUORLET_PLATFORM_NETWORK_USAGE_H_
#define QUORLET_PLATFORM_NETWORK_USAGE_H_

#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "drvreport/property_value.h"

namespace quorlet {

// A usage record's key for the date at which its counts start.
inline constexpr std::string_view UsageSinceTimeKey = "since";

enum class UsageNameKind { kProcessName };

class NetworkUsage {
 public:
  // `records`: one dictionary for each process, with "procName", optionally "bundleName", the since
  // date, and the integers "wifiInBytes", "wifiOutBytes", "wwanInBytes" and "wwanOutBytes". Nobody
  // vouches for their shape. nullptr when the service cannot say: nothing is known then, which is
  // not the same as no traffic.
  using Reply = std::function<void(const Array* records)>;

  virtual ~NetworkUsage() = default;

  // Asks for the usage of the processes named in `nameFilter`, all of them when it is empty, and
  // returns at once. `reply` is called at most once, on another thread; the service owns it until
  // then. When the process ends, a reply that is being processed is waited for, one that has not
  // come is dropped.
  virtual void QueryProcessDataUsage(const std::vector<std::string>& nameFilter, UsageNameKind kind,
                                     Reply reply) = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_NETWORK_USAGE_H_
