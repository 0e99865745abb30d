#include "platform/linux/linux_platform.h"

#include <stdlib.h>

#include <utility>
#include <vector>

#include "platform/linux/base/semaphores.h"
#include "platform/linux/base/services.h"
#include "platform/linux/device/services.h"
#include "platform/linux/drives/drive_exports.h"
#include "platform/linux/drives/drive_reader.h"
#include "platform/linux/drives/drives_publisher.h"
#include "platform/linux/live/live_source.h"
#include "platform/linux/logs/services.h"
#include "platform/linux/network/network_usage.h"
#include "platform/linux/registry/driver_files.h"
#include "platform/linux/registry/services.h"
#include "platform/linux/service/services.h"
#include "platform/linux/state/services.h"

namespace quorlet {
namespace {

// The driver files first: what they describe comes before what the machine has.
std::vector<std::unique_ptr<EntrySource>> EntrySources(const Root& root, SystemLog& log,
                                                       const std::shared_ptr<DriveReader>& drives) {
  std::vector<std::unique_ptr<EntrySource>> sources;
  sources.push_back(MakeDriverFiles(root, log));
  sources.push_back(MakeDriveExports(drives));
  sources.push_back(MakeLiveChannels(LoggingRoot(root, log), MakeDrivesPublisher(drives)));
  return sources;
}

}  // namespace

// Every service comes after those that it borrows, so destruction in reverse order is safe.
struct LinuxPlatform::Services {
  Services(Root givenRoot, Access access, std::unique_ptr<SystemLog> givenLog,
           const TallyOptions& options)
      : root(std::move(givenRoot)),
        log(givenLog ? std::move(givenLog) : MakeLinuxSystemLog(root, access, *clock)),
        preferences(MakeLinuxPreferences(root, access, *log)),
        deviceInfo(MakeLinuxDeviceInfo(root, *log)),
        environment(MakeLinuxEnvironment(root, *deviceInfo, *log)),
        queries(*deviceInfo, *environment, *log),
        counterStore(
            MakeLinuxCounterStore(root, access, *clock, queries, *preferences, *log, options)),
        osVersion(MakeLinuxOSVersion(root, *log)),
        diagnostics(MakeLinuxDiagnostics(root, access, *clock, *preferences, *osVersion, *log)),
        crashSupport(MakeLinuxCrashSupport(root, access, *clock, *osVersion, *log)),
        supportLibrary(MakeLinuxSupportLibrary()),
        kernelParameters(MakeLinuxKernelParameters(root, access, *log)),
        applications(MakeLinuxApplications(root, *log)),
        locale(MakeLinuxLocale(LoggingRoot(root, *log),
                               [](const char* name) { return getenv(name); })),
        passLock(MakeLinuxPassLock(root, access, *log)),
        namedService(MakeLinuxNamedService(root, *log)),
        notifications(MakeLinuxNotifications(root, *log)),
        drives(std::make_shared<DriveReader>(LoggingRoot(root, *log))),
        driverRegistry(MakeLinuxDriverRegistry(EntrySources(root, *log, drives))),
        taskSnapshot(MakeLinuxTaskSnapshot(root, *log)),
        networkUsage(MakeLinuxNetworkUsage(root, *log)) {}

  const Root root;
  const std::unique_ptr<Clock> clock = MakeLinuxClock();
  const std::unique_ptr<SystemLog> log;
  const std::unique_ptr<Preferences> preferences;
  const std::unique_ptr<DeviceInfo> deviceInfo;
  const std::unique_ptr<Environment> environment;
  EnvironmentQueries queries;
  const std::unique_ptr<CounterStore> counterStore;
  const std::unique_ptr<OSVersion> osVersion;
  const std::unique_ptr<Diagnostics> diagnostics;
  const std::unique_ptr<CrashSupport> crashSupport;
  const std::unique_ptr<SupportLibrary> supportLibrary;
  const std::unique_ptr<KernelParameters> kernelParameters;
  const std::unique_ptr<Applications> applications;
  const std::unique_ptr<LocaleService> locale;
  const std::unique_ptr<PassLock> passLock;
  const std::unique_ptr<NamedService> namedService;
  const std::unique_ptr<Notifications> notifications;
  const std::unique_ptr<Semaphores> semaphores = MakeLinuxSemaphores();
  const std::shared_ptr<DriveReader> drives;
  const std::unique_ptr<DriverRegistry> driverRegistry;
  const std::unique_ptr<TaskSnapshot> taskSnapshot;
  const std::unique_ptr<StandardError> standardError = MakeLinuxStandardError();
  // Last, so that it goes first: it waits for a reply that is being processed, which uses the rest.
  const std::unique_ptr<NetworkUsage> networkUsage;
  Platform bundle{.log = *log,
                  .clock = *clock,
                  .preferences = *preferences,
                  .counterStore = *counterStore,
                  .diagnostics = *diagnostics,
                  .crashSupport = *crashSupport,
                  .supportLibrary = *supportLibrary,
                  .deviceInfo = *deviceInfo,
                  .osVersion = *osVersion,
                  .kernelParameters = *kernelParameters,
                  .environment = *environment,
                  .queries = queries,
                  .applications = *applications,
                  .locale = *locale,
                  .passLock = *passLock,
                  .namedService = *namedService,
                  .notifications = *notifications,
                  .networkUsage = *networkUsage,
                  .semaphores = *semaphores,
                  .drives = *drives,
                  .driverRegistry = *driverRegistry,
                  .taskSnapshot = *taskSnapshot,
                  .standardError = *standardError};
};

LinuxPlatform::LinuxPlatform(Root root, Access access, std::unique_ptr<SystemLog> log,
                             const TallyOptions& options)
    : services_(std::make_unique<Services>(std::move(root), access, std::move(log), options)) {}

LinuxPlatform::~LinuxPlatform() = default;

Platform& LinuxPlatform::services() { return services_->bundle; }
const Root& LinuxPlatform::root() const { return services_->root; }

}  // namespace quorlet
