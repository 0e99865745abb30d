// What outlives a run: the preferences, and the lock that lets one pass run at a time.
// What the services are given by reference must outlive them; none of them opens or reads anything
// before it is used.
#ifndef QUORLET_PLATFORM_LINUX_STATE_SERVICES_H_
#define QUORLET_PLATFORM_LINUX_STATE_SERVICES_H_

#include <memory>

#include "platform/linux/base/access.h"
#include "platform/linux/base/files.h"
#include "platform/pass_lock.h"
#include "platform/preferences.h"
#include "platform/system_log.h"

namespace quorlet {

// Property lists in /var/mobile/Library/Preferences. The destructor makes pending changes durable.
// Safe to use from any thread. In keys,
// what a property list cannot hold becomes U+FFFD, when reading too.
std::unique_ptr<Preferences> MakeLinuxPreferences(const Root& root, Access access, SystemLog& log);

// /run/quorlet/pass.lock; with read-only access there is no lock.
std::unique_ptr<PassLock> MakeLinuxPassLock(const Root& root, Access access, SystemLog& log);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_STATE_SERVICES_H_
