// The network usage of the machine's services, as the service manager (systemd) counts it.
//
// The manager counts the IP bytes of every unit that has IPAccounting=yes, and hands the counts out
// over D-Bus only. It does not count by interface, so the bytes get a kind only where there is one
// (SoleLinkKind); elsewhere nothing is reported. What a service sends to itself or its neighbours
// on the machine is counted with the rest: nothing tells it apart.
#ifndef QUORLET_PLATFORM_LINUX_NETWORK_UNIT_USAGE_H_
#define QUORLET_PLATFORM_LINUX_NETWORK_UNIT_USAGE_H_

#include <chrono>
#include <optional>

#include "drvreport/property_value.h"
#include "platform/linux/base/files.h"

namespace quorlet {

// One usage record for each service that the manager counts: "procName" is the unit's name without
// ".service", "since" its last start, the counts of the other kind of network are 0. A service that
// is just starting is left out. Empty where there is no manager or no sole kind of network. nullopt
// when a manager is there that does not answer in full within `limit`, or not in its protocol.
std::optional<Array> ReadUnitUsage(const Root& root, std::chrono::milliseconds limit);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_NETWORK_UNIT_USAGE_H_
