// The entries of drivers, put together from sources, and the hub that serves their channels.
// What the services are given by reference must outlive them; none of them opens or reads anything
// before it is used.
#ifndef QUORLET_PLATFORM_LINUX_REGISTRY_SERVICES_H_
#define QUORLET_PLATFORM_LINUX_REGISTRY_SERVICES_H_

#include <memory>
#include <vector>

#include "drvreport/driver_registry.h"
#include "platform/linux/registry/registry_entry.h"

namespace quorlet {

// The entries of all sources, by entry ID; of two with one ID the earlier source's counts. The
// first source, the driver files, is asked anew for each look-up of services; the others on first
// use, and again for each visit after the first. Where a later source publishes channels and no
// entry is a hub, a hub is added.
std::unique_ptr<DriverRegistry> MakeLinuxDriverRegistry(
    std::vector<std::unique_ptr<EntrySource>> sources);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_REGISTRY_SERVICES_H_
