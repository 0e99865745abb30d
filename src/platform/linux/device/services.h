// What the machine says about itself and about what is installed on it.
// What the services are given by reference must outlive them; none of them opens or reads anything
// before it is used.
#ifndef QUORLET_PLATFORM_LINUX_DEVICE_SERVICES_H_
#define QUORLET_PLATFORM_LINUX_DEVICE_SERVICES_H_

#include <functional>
#include <memory>

#include "platform/applications.h"
#include "platform/device_info.h"
#include "platform/environment.h"
#include "platform/kernel_parameters.h"
#include "platform/linux/base/access.h"
#include "platform/linux/base/logging_root.h"
#include "platform/locale.h"
#include "platform/os_version.h"
#include "platform/support_library.h"
#include "platform/system_log.h"
#include "platform/task_snapshot.h"

namespace quorlet {

// os-release; an entry that it does not give is left out, and with no entry there is no dictionary.
std::unique_ptr<OSVersion> MakeLinuxOSVersion(const Root& root, SystemLog& log);

// The program itself is the library: the functions are part of it and exported by name.
std::unique_ptr<SupportLibrary> MakeLinuxSupportLibrary();

// Safe to use from any thread.
std::unique_ptr<DeviceInfo> MakeLinuxDeviceInfo(const Root& root, SystemLog& log);

// With read-only access reading a queue leaves its files.
std::unique_ptr<KernelParameters> MakeLinuxKernelParameters(const Root& root, Access access,
                                                            SystemLog& log);

// /var/db/kernel/task-snapshot, otherwise what /proc says.
std::unique_ptr<TaskSnapshot> MakeLinuxTaskSnapshot(const Root& root, SystemLog& log);

std::unique_ptr<Environment> MakeLinuxEnvironment(const Root& root, DeviceInfo& deviceInfo,
                                                  SystemLog& log);

std::unique_ptr<Applications> MakeLinuxApplications(const Root& root, SystemLog& log);

// The value of an environment variable, or nullptr.
using EnvironmentVariable = std::function<const char*(const char* name)>;

std::unique_ptr<LocaleService> MakeLinuxLocale(const LoggingRoot& root,
                                               EnvironmentVariable environment);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_DEVICE_SERVICES_H_
