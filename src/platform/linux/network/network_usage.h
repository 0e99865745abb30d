// How much each service has transferred: from a file, or as the service manager and the network
// links tell. This is the head of its room; what is given must outlive the service.
#ifndef QUORLET_PLATFORM_LINUX_NETWORK_NETWORK_USAGE_H_
#define QUORLET_PLATFORM_LINUX_NETWORK_NETWORK_USAGE_H_

#include <memory>

#include "platform/linux/base/files.h"
#include "platform/network_usage.h"
#include "platform/system_log.h"

namespace quorlet {

// Answers from /var/db/vigil/usage.plist, which is read anew for every query: an array of records,
// or {Delay (seconds), Records (array)} for a reply that comes later. Without that file the
// machine's services are the records (ReadUnitUsage), if that takes no longer than 100 ms.
//
// A file that is damaged gives one error line and no records; a service manager that does not
// answer in time gives one error line, and no reply. The destructor drops the replies that have not
// come and waits for the rest; an exception that leaves a reply becomes an error line. Safe to use
// from any thread.
std::unique_ptr<NetworkUsage> MakeLinuxNetworkUsage(const Root& root, SystemLog& log);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_NETWORK_NETWORK_USAGE_H_
