// What the other rooms stand on: files, descriptors, kernel texts, property lists as JSON; the
// clock, the logs and standard error. What the services are given by reference must outlive them;
// none of them opens or reads anything before it is used.
#ifndef QUORLET_PLATFORM_LINUX_BASE_SERVICES_H_
#define QUORLET_PLATFORM_LINUX_BASE_SERVICES_H_

#include <memory>

#include "platform/clock.h"
#include "platform/linux/base/access.h"
#include "platform/linux/base/files.h"
#include "platform/standard_error.h"
#include "platform/system_log.h"

namespace quorlet {

// The system's time of day.
std::unique_ptr<Clock> MakeLinuxClock();

// syslog(3) on the machine's own root, otherwise /var/log/quorlet.log below the root, or standard
// error where that must not or cannot be written (then errors only). Safe to use from any thread.
std::unique_ptr<SystemLog> MakeLinuxSystemLog(const Root& root, Access access, Clock& clock);

// Every message on standard error, as "level: text". Safe to use from any thread.
std::unique_ptr<SystemLog> MakeStandardErrorLog();

std::unique_ptr<StandardError> MakeLinuxStandardError();

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_BASE_SERVICES_H_
