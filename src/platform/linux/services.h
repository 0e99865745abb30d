// Makes the Linux services. What they are given by reference must outlive them; none of them opens
// or reads anything before it is used.
#ifndef QUORLET_PLATFORM_LINUX_SERVICES_H_
#define QUORLET_PLATFORM_LINUX_SERVICES_H_

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "platform/applications.h"
#include "platform/clock.h"
#include "platform/crash_support.h"
#include "platform/device_info.h"
#include "platform/diagnostics.h"
#include "platform/driver_registry.h"
#include "platform/environment.h"
#include "platform/kernel_parameters.h"
#include "platform/linux/access.h"
#include "platform/linux/files.h"
#include "platform/linux/registry_entry.h"
#include "platform/locale.h"
#include "platform/os_version.h"
#include "platform/pass_lock.h"
#include "platform/preferences.h"
#include "platform/standard_error.h"
#include "platform/support_library.h"
#include "platform/system_log.h"
#include "platform/task_snapshot.h"

namespace quorlet {

// The system's time of day.
std::unique_ptr<Clock> MakeLinuxClock();

// syslog(3) on the machine's own root, otherwise /var/log/quorlet.log below the root, or standard
// error where that must not or cannot be written (then errors only). Safe to use from any thread.
std::unique_ptr<SystemLog> MakeLinuxSystemLog(const Root& root, Access access, Clock& clock);

// Every message on standard error, as "level: text". Safe to use from any thread.
std::unique_ptr<SystemLog> MakeStandardErrorLog();

// Property lists in /var/mobile/Library/Preferences. The destructor makes pending changes durable.
// Safe to use from any thread. In keys,
// what a property list cannot hold becomes U+FFFD, when reading too.
std::unique_ptr<Preferences> MakeLinuxPreferences(const Root& root, Access access, SystemLog& log);

// os-release; an entry that it does not give is left out, and with no entry there is no dictionary.
std::unique_ptr<OSVersion> MakeLinuxOSVersion(const Root& root, SystemLog& log);

// "ProductName ProductVersion (ProductBuildVersion)", without what is missing; "unknown" when
// nothing is there.
std::string OSVersionText(OSVersion& osVersion);

// Logs in /var/mobile/Library/Logs/Diagwell. With read-only access writing a log fails.
std::unique_ptr<Diagnostics> MakeLinuxDiagnostics(const Root& root, Access access, Clock& clock,
                                                  Preferences& preferences, OSVersion& osVersion,
                                                  SystemLog& log);

std::unique_ptr<CrashSupport> MakeLinuxCrashSupport(const Root& root, Access access, Clock& clock,
                                                    OSVersion& osVersion, SystemLog& log);

// The program itself is the library: the functions are part of it and exported by name.
std::unique_ptr<SupportLibrary> MakeLinuxSupportLibrary();

// Safe to use from any thread.
std::unique_ptr<DeviceInfo> MakeLinuxDeviceInfo(const Root& root, SystemLog& log);

// With read-only access reading a queue leaves its files.
std::unique_ptr<KernelParameters> MakeLinuxKernelParameters(const Root& root, Access access,
                                                            SystemLog& log);

// The entries of all sources, by entry ID; of two with one ID the earlier source's counts. The
// first source, the driver files, is asked anew for each look-up of services; the others on first
// use, and again for each visit after the first. Where a later source publishes channels and no
// entry is a hub, a hub is added.
std::unique_ptr<DriverRegistry> MakeLinuxDriverRegistry(
    std::vector<std::unique_ptr<EntrySource>> sources);

// /var/db/kernel/task-snapshot, otherwise what /proc says.
std::unique_ptr<TaskSnapshot> MakeLinuxTaskSnapshot(const Root& root, SystemLog& log);

std::unique_ptr<StandardError> MakeLinuxStandardError();

std::unique_ptr<Environment> MakeLinuxEnvironment(const Root& root, DeviceInfo& deviceInfo,
                                                  SystemLog& log);

std::unique_ptr<Applications> MakeLinuxApplications(const Root& root, SystemLog& log);

// The value of an environment variable, or nullptr.
using EnvironmentVariable = std::function<const char*(const char* name)>;

std::unique_ptr<LocaleService> MakeLinuxLocale(const Root& root, EnvironmentVariable environment);

// /run/quorlet/pass.lock; with read-only access there is no lock.
std::unique_ptr<PassLock> MakeLinuxPassLock(const Root& root, Access access, SystemLog& log);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_SERVICES_H_
