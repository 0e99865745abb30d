// Every platform service in one bundle, handed down explicitly.
#ifndef QUORLET_PLATFORM_PLATFORM_H_
#define QUORLET_PLATFORM_PLATFORM_H_

#include "drvreport/driver_registry.h"
#include "platform/applications.h"
#include "platform/clock.h"
#include "platform/counter_store.h"
#include "platform/crash_support.h"
#include "platform/device_info.h"
#include "platform/diagnostics.h"
#include "platform/drives.h"
#include "platform/environment.h"
#include "platform/environment_queries.h"
#include "platform/kernel_parameters.h"
#include "platform/locale.h"
#include "platform/named_service.h"
#include "platform/network_usage.h"
#include "platform/notifications.h"
#include "platform/os_version.h"
#include "platform/pass_lock.h"
#include "platform/preferences.h"
#include "platform/semaphores.h"
#include "platform/standard_error.h"
#include "platform/support_library.h"
#include "platform/system_log.h"
#include "platform/task_snapshot.h"

namespace quorlet {

// Borrows the services; whoever makes the bundle owns them and outlives its users.
struct Platform {
  SystemLog& log;
  Clock& clock;
  Preferences& preferences;
  CounterStore& counterStore;
  Diagnostics& diagnostics;
  CrashSupport& crashSupport;
  SupportLibrary& supportLibrary;
  DeviceInfo& deviceInfo;
  OSVersion& osVersion;
  KernelParameters& kernelParameters;
  Environment& environment;
  EnvironmentQueries& queries;
  Applications& applications;
  LocaleService& locale;
  PassLock& passLock;
  NamedService& namedService;
  Notifications& notifications;
  NetworkUsage& networkUsage;
  Semaphores& semaphores;
  Drives& drives;
  DriverRegistry& driverRegistry;
  TaskSnapshot& taskSnapshot;
  StandardError& standardError;

  struct Others {
    Preferences* preferences = nullptr;
    CounterStore* counterStore = nullptr;
    Diagnostics* diagnostics = nullptr;
    CrashSupport* crashSupport = nullptr;
    DriverRegistry* driverRegistry = nullptr;
    StandardError* standardError = nullptr;
  };
  // The same services, but for those given.
  Platform with(const Others& others) const;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_PLATFORM_H_
