// Which kind of network the machine's traffic went over.
#ifndef QUORLET_PLATFORM_LINUX_NETWORK_NETWORK_LINKS_H_
#define QUORLET_PLATFORM_LINUX_NETWORK_NETWORK_LINKS_H_

#include <optional>
#include <variant>

#include "platform/linux/base/files.h"

namespace quorlet {

enum class LinkKind { kWifi, kCellular };

// What the interfaces are, or the errno of why nobody knows.
using SoleLink = std::variant<std::optional<LinkKind>, int>;

// The one kind of all the network interfaces in /sys/class/net that have carried anything since
// they appeared; nullopt when they are of several kinds or of another kind (a cable), or when there
// are none.
//
// - Wi-Fi: DEVTYPE=wlan in "uevent", or "phy80211" or "wireless" is there.
// - Cellular: DEVTYPE=wwan, or raw IP without a link layer, which only modems have.
// - Loopback and interfaces without a device (bridges, tunnels, containers) do not count: what they
//   carry stays on the machine or leaves it over another interface. A point-to-point link (PPP)
//   counts, as one of another kind: nothing says what is below it.
//
// It does not matter which interface is in use now: a total that began earlier may have gone over
// every one of them. An interface that is gone cannot be known any more; what went over it counts
// as the others'.
SoleLink SoleLinkKind(const Root& root);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_NETWORK_NETWORK_LINKS_H_
