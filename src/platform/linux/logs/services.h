// The logs that are written: for submission, for support, and the structured one.
// What the services are given by reference must outlive them; none of them opens or reads anything
// before it is used.
#ifndef QUORLET_PLATFORM_LINUX_LOGS_SERVICES_H_
#define QUORLET_PLATFORM_LINUX_LOGS_SERVICES_H_

#include <memory>

#include "platform/clock.h"
#include "platform/crash_support.h"
#include "platform/diagnostics.h"
#include "platform/linux/base/access.h"
#include "platform/linux/base/files.h"
#include "platform/os_version.h"
#include "platform/preferences.h"
#include "platform/system_log.h"

namespace quorlet {

// Logs in /var/mobile/Library/Logs/Diagwell. With read-only access writing a log fails.
std::unique_ptr<Diagnostics> MakeLinuxDiagnostics(const Root& root, Access access, Clock& clock,
                                                  Preferences& preferences, OSVersion& osVersion,
                                                  SystemLog& log);

std::unique_ptr<CrashSupport> MakeLinuxCrashSupport(const Root& root, Access access, Clock& clock,
                                                    OSVersion& osVersion, SystemLog& log);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_LOGS_SERVICES_H_
