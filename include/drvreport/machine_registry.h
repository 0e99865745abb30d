// The driver registry of this machine, for programs that have no other.
#ifndef DRVREPORT_MACHINE_REGISTRY_H_
#define DRVREPORT_MACHINE_REGISTRY_H_

#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "drvreport/driver_registry.h"

namespace quorlet {

// The entries that files in /var/db/drivers describe, and what Linux reports about itself: idle
// states, disks, temperatures and the like. Paths lie below `root`; /proc and /sys are those below
// it where they exist there, otherwise the machine's own. Nothing is read before it is asked for.
// The registry must not be used by two threads at once.
// `report`, which may be empty, is told about driver files that cannot be used, one line each.
std::shared_ptr<DriverRegistry> MakeMachineDriverRegistry(
    const std::string& root = "/", std::function<void(std::string_view)> report = {});

}  // namespace quorlet

#endif  // DRVREPORT_MACHINE_REGISTRY_H_
