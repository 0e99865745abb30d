#include "platform/platform.h"

namespace quorlet {

Platform Platform::with(const Others& others) const {
  return {
      .log = log,
      .clock = clock,
      .preferences = others.preferences != nullptr ? *others.preferences : preferences,
      .counterStore = others.counterStore != nullptr ? *others.counterStore : counterStore,
      .diagnostics = others.diagnostics != nullptr ? *others.diagnostics : diagnostics,
      .crashSupport = others.crashSupport != nullptr ? *others.crashSupport : crashSupport,
      .supportLibrary = supportLibrary,
      .deviceInfo = deviceInfo,
      .osVersion = osVersion,
      .kernelParameters = kernelParameters,
      .environment = environment,
      .queries = queries,
      .applications = applications,
      .locale = locale,
      .passLock = passLock,
      .namedService = namedService,
      .notifications = notifications,
      .networkUsage = networkUsage,
      .semaphores = semaphores,
      .drives = drives,
      .driverRegistry = others.driverRegistry != nullptr ? *others.driverRegistry : driverRegistry,
      .taskSnapshot = taskSnapshot,
      .standardError = others.standardError != nullptr ? *others.standardError : standardError};
}

}  // namespace quorlet
