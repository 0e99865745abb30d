// The services of another platform, each call of which can be made to fail, or be the last one.
#ifndef QUORLET_TESTS_FAKES_FAILING_PLATFORM_H_
#define QUORLET_TESTS_FAKES_FAILING_PLATFORM_H_

#include <cerrno>
#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/platform.h"

namespace quorlet {

// The process ends here. No std::exception, which steps of a pass would survive.
struct Killed {};

// Asked before each call that can fail, with its name: true makes it fail without having done
// anything. It may throw instead. Calls that release something never fail.
using Strike = std::function<bool(const char* call)>;

class FailingPlatform {
 public:
  FailingPlatform(const Platform& real, Strike strike)
      : real_(real), strike_(std::move(strike)), queries_(deviceInfo_, environment_, real.log) {}

  Platform services() {
    return {real_.log,       real_.clock,       preferences_,       counterStore_,
            diagnostics_,    crashSupport_,     supportLibrary_,    deviceInfo_,
            osVersion_,      kernelParameters_, environment_,       queries_,
            applications_,   locale_,           passLock_,          real_.namedService,
            notifications_,  networkUsage_,     real_.semaphores,   drives_,
            driverRegistry_, taskSnapshot_,     real_.standardError};
  }

 private:
  // What every service here is made of. `call` is not made when it is to fail.
  struct Service {
    explicit Service(FailingPlatform& platform) : real(platform.real_), strike(platform.strike_) {}
    template <typename Call>
    void make(const char* name, const Call& call) {
      if (!strike(name)) call();
    }
    template <typename Result, typename Call>
    Result make(const char* name, Result failure, const Call& call) {
      return strike(name) ? failure : call();
    }
    const Platform& real;
    const Strike& strike;
  };

  struct FailingDrives : Drives, Service {
    using Service::Service;
    std::vector<Drive> read() override {
      return make<std::vector<Drive>>("drives", {}, [&] { return real.drives.read(); });
    }
  };

  struct FailingPreferences : Preferences, Service {
    using Service::Service;
    std::optional<PropertyValue> DGWPreferencesGetValue(std::string_view key,
                                                        std::string_view domain) override {
      return real.preferences.DGWPreferencesGetValue(key, domain);
    }
    void DGWPreferencesSetValue(std::string_view key, std::optional<PropertyValue> value,
                                std::string_view domain) override {
      // In memory, it cannot fail but for want of memory.
      static_cast<void>(strike("set a preference"));
      real.preferences.DGWPreferencesSetValue(key, std::move(value), domain);
    }
    bool DGWPreferencesSynchronize(std::string_view domain) override {
      return make("synchronize preferences", false,
                  [&] { return real.preferences.DGWPreferencesSynchronize(domain); });
    }
    void addToInteger(std::string_view key, std::int64_t delta, std::string_view domain) override {
      static_cast<void>(strike("add to a preference"));
      real.preferences.addToInteger(key, delta, domain);
    }
    bool isReadable(std::string_view domain) override {
      return make("read preferences", false, [&] { return real.preferences.isReadable(domain); });
    }
  };

  struct FailingCounterStore : CounterStore, Service {
    using Service::Service;
    std::int32_t TLDaysSince1970() override { return real.counterStore.TLDaysSince1970(); }
    Date dateForDaysSince1970(std::int32_t day) override {
      return real.counterStore.dateForDaysSince1970(day);
    }
    void TLClientCheckpoint() override {
      make("checkpoint", [&] { real.counterStore.TLClientCheckpoint(); });
    }
    bool write(const StoreChanges& changes) override {
      return make("write counters", false, [&] { return real.counterStore.write(changes); });
    }
    bool readNote(std::string_view name, std::optional<Dictionary>& value) override {
      return make("read a note", false, [&] { return real.counterStore.readNote(name, value); });
    }
    std::unique_ptr<TLHistory> initWithDefaultPath() override {
      if (strike("read counters")) return std::make_unique<FailedHistory>();
      return real.counterStore.initWithDefaultPath();
    }
    struct FailedHistory : TLHistory {
      void scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
          std::string_view, std::int32_t, std::int32_t, const ScalarHandler&) override {}
      void distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
          std::string_view, std::int32_t, std::int32_t, const DistributionHandler&) override {}
      bool failed() const override { return true; }
    };
  };

  struct FailingDiagnostics : Diagnostics, Service {
    using Service::Service;
    bool DiagnosticLogSubmissionEnabled() override {
      return real.diagnostics.DiagnosticLogSubmissionEnabled();
    }
    std::string DGWOSVersion() override { return real.diagnostics.DGWOSVersion(); }
    std::optional<PropertyValue> DGWGetDATaskingValue(std::string_view name) override {
      return real.diagnostics.DGWGetDATaskingValue(name);
    }
    bool writeLog(const LogRequest& request, const LogWriter& writer) override {
      return make("write a log", false, [&] { return real.diagnostics.writeLog(request, writer); });
    }
    bool hasLog(const std::string& fileName) override { return real.diagnostics.hasLog(fileName); }
    bool removeLogs(std::span<const std::string> fileNames) override {
      return make("remove logs", false, [&] { return real.diagnostics.removeLogs(fileNames); });
    }
    bool removeAllLogs() override {
      return make("remove all logs", false, [&] { return real.diagnostics.removeAllLogs(); });
    }
    void SubmitDiagnosticLogs() override {
      make("submit logs", [&] { real.diagnostics.SubmitDiagnosticLogs(); });
    }
  };

  struct FailingCrashSupport : CrashSupport, Service {
    using Service::Service;
    bool logEntries(std::int32_t type, std::span<const Dictionary> entries) override {
      return make("log entries", false,
                  [&] { return real.crashSupport.logEntries(type, entries); });
    }
    bool syncStructuredData() override {
      return make("sync entries", false, [&] { return real.crashSupport.syncStructuredData(); });
    }
    bool stageEntries() override {
      return make("stage entries", false, [&] { return real.crashSupport.stageEntries(); });
    }
    bool publishStagedEntries() override {
      return make("publish entries", false,
                  [&] { return real.crashSupport.publishStagedEntries(); });
    }
    void FSDumpAllOldStructuredDataLogs() override {
      make("move old entries", [&] { real.crashSupport.FSDumpAllOldStructuredDataLogs(); });
    }
    void rollCarewellLogs() override {
      make("rotate logs", [&] { real.crashSupport.rollCarewellLogs(); });
    }
    std::string GetSysIDWithDescription() override {
      return real.crashSupport.GetSysIDWithDescription();
    }
    std::string GetHardwareModel() override { return real.crashSupport.GetHardwareModel(); }
    std::string GetSystemVersion() override { return real.crashSupport.GetSystemVersion(); }
    std::string GetIncidentID() override { return real.crashSupport.GetIncidentID(); }
  };

  struct FailingSupportLibrary : SupportLibrary, Service {
    using Service::Service;
    bool load() override {
      return make("load the library", false, [&] { return real.supportLibrary.load(); });
    }
    Function findFunction(const char* name) override {
      return strike("find a function") ? nullptr : real.supportLibrary.findFunction(name);
    }
  };

  struct FailingDeviceInfo : DeviceInfo, Service {
    using Service::Service;
    std::optional<PropertyValue> DQCopyAnswer(std::string_view question) override {
      return make("ask the device", std::optional<PropertyValue>(),
                  [&] { return real.deviceInfo.DQCopyAnswer(question); });
    }
  };

  struct FailingOSVersion : OSVersion, Service {
    using Service::Service;
    std::optional<Dictionary> CopySystemVersionDictionary() override {
      return make("read the version", std::optional<Dictionary>(),
                  [&] { return real.osVersion.CopySystemVersionDictionary(); });
    }
  };

  struct FailingKernelParameters : KernelParameters, Service {
    using Service::Service;
    int sysctlbyname(std::string_view name, std::span<std::byte> buffer,
                     std::size_t& length) override {
      return make("read a parameter", EIO,
                  [&] { return real.kernelParameters.sysctlbyname(name, buffer, length); });
    }
    bool removeTaken(std::string_view name) override {
      return make("remove parameters", false,
                  [&] { return real.kernelParameters.removeTaken(name); });
    }
    void returnTaken(std::string_view name) override { real.kernelParameters.returnTaken(name); }
  };

  struct FailingEnvironment : Environment, Service {
    using Service::Service;
    std::optional<FileStatus> stat(std::string_view path) override {
      return make("look at a file", std::optional<FileStatus>(),
                  [&] { return real.environment.stat(path); });
    }
    std::optional<std::string> readFile(std::string_view path, std::size_t limit) override {
      return make("read a file", std::optional<std::string>(),
                  [&] { return real.environment.readFile(path, limit); });
    }
    std::optional<std::string> SystemGroupContainerPath(std::string_view identifier,
                                                        std::uint64_t& error) override {
      error = EIO;
      return make("find a container", std::optional<std::string>(),
                  [&] { return real.environment.SystemGroupContainerPath(identifier, error); });
    }
    bool CheckMultiUserMode(std::int32_t& mode) override {
      return make("ask for users", false,
                  [&] { return real.environment.CheckMultiUserMode(mode); });
    }
    std::uint64_t TickClockNow() override { return real.environment.TickClockNow(); }
    int TickTimebase(std::uint32_t& numerator, std::uint32_t& denominator) override {
      return make("ask for the timebase", 1,
                  [&] { return real.environment.TickTimebase(numerator, denominator); });
    }
  };

  struct FailingApplications : Applications, Service {
    using Service::Service;
    bool EnumerateApplicationBundles(
        const std::function<void(ApplicationBundleType)>& visit) override {
      return make("list applications", false,
                  [&] { return real.applications.EnumerateApplicationBundles(visit); });
    }
  };

  struct FailingLocale : LocaleService, Service {
    using Service::Service;
    using Languages = std::vector<std::string>;
    Languages PreferredLanguages() override {
      return make("ask for languages", Languages(),
                  [&] { return real.locale.PreferredLanguages(); });
    }
    Languages SystemLanguages() override {
      return make("list languages", Languages(), [&] { return real.locale.SystemLanguages(); });
    }
    Languages PreferredLocalizations(const Languages& available,
                                     const Languages& preferred) override {
      return real.locale.PreferredLocalizations(available, preferred);
    }
    std::optional<std::string> CurrentRegionCode() override {
      return make("ask for the region", std::optional<std::string>(),
                  [&] { return real.locale.CurrentRegionCode(); });
    }
  };

  struct FailingPassLock : PassLock, Service {
    using Service::Service;
    bool lock() override {
      return make("take the lock", false, [&] { return real.passLock.lock(); });
    }
    void unlock() override { real.passLock.unlock(); }
  };

  struct FailingNotifications : Notifications, Service {
    using Service::Service;
    void PostNotification(std::string_view name) override {
      make("post a notification", [&] { real.notifications.PostNotification(name); });
    }
  };

  struct FailingNetworkUsage : NetworkUsage, Service {
    using Service::Service;
    void QueryProcessDataUsage(const std::vector<std::string>& nameFilter, UsageNameKind kind,
                               Reply reply) override {
      make("ask for usage",
           [&] { real.networkUsage.QueryProcessDataUsage(nameFilter, kind, std::move(reply)); });
    }
  };

  struct FailingDriverRegistry : DriverRegistry, Service {
    using Service::Service;
    RegistryHandle FindServiceByClass(std::string_view className) override {
      return make("find a driver", RegistryHandle{},
                  [&] { return real.driverRegistry.FindServiceByClass(className); });
    }
    KernelReturn FindServicesMatching(const Dictionary& match, RegistryHandle& iterator) override {
      return make("find drivers", kKernelError,
                  [&] { return real.driverRegistry.FindServicesMatching(match, iterator); });
    }
    RegistryHandle IteratorNext(RegistryHandle iterator) override {
      return make("go to the next driver", RegistryHandle{},
                  [&] { return real.driverRegistry.IteratorNext(iterator); });
    }
    bool IteratorIsValid(RegistryHandle iterator) override {
      return real.driverRegistry.IteratorIsValid(iterator);
    }
    void ReleaseHandle(RegistryHandle handle) override {
      real.driverRegistry.ReleaseHandle(handle);
    }
    std::uint32_t HandleRetainCount(RegistryHandle handle) override {
      return real.driverRegistry.HandleRetainCount(handle);
    }
    KernelReturn OpenDriverConnection(RegistryHandle service, std::uint32_t type,
                                      RegistryHandle& connection) override {
      return make("open a driver", kKernelError, [&] {
        return real.driverRegistry.OpenDriverConnection(service, type, connection);
      });
    }
    KernelReturn CloseDriverConnection(RegistryHandle connection) override {
      return real.driverRegistry.CloseDriverConnection(connection);
    }
    KernelReturn CallDriverMethod(RegistryHandle connection, std::uint32_t method,
                                  DriverCall& call) override {
      return make("call a driver", kKernelError,
                  [&] { return real.driverRegistry.CallDriverMethod(connection, method, call); });
    }
    KernelReturn MapDriverMemory(RegistryHandle connection, std::uint32_t memoryType,
                                 std::span<const std::byte>& memory) override {
      return make("map a driver's memory", kKernelError, [&] {
        return real.driverRegistry.MapDriverMemory(connection, memoryType, memory);
      });
    }
    void UnmapDriverMemory(RegistryHandle connection, std::uint32_t memoryType,
                           std::span<const std::byte> memory) override {
      real.driverRegistry.UnmapDriverMemory(connection, memoryType, memory);
    }
    std::optional<PropertyValue> CopyEntryProperty(RegistryHandle entry,
                                                   std::string_view key) override {
      return make("read a property", std::optional<PropertyValue>(),
                  [&] { return real.driverRegistry.CopyEntryProperty(entry, key); });
    }
    std::optional<PropertyValue> SearchEntryProperty(RegistryHandle entry,
                                                     std::string_view key) override {
      return make("search a property", std::optional<PropertyValue>(),
                  [&] { return real.driverRegistry.SearchEntryProperty(entry, key); });
    }
    KernelReturn GetEntryName(RegistryHandle entry, std::string& name) override {
      return make("read a name", kKernelError,
                  [&] { return real.driverRegistry.GetEntryName(entry, name); });
    }
    KernelReturn GetEntryID(RegistryHandle entry, std::uint64_t& id) override {
      return make("read an ID", kKernelError,
                  [&] { return real.driverRegistry.GetEntryID(entry, id); });
    }
  };

  struct FailingTaskSnapshot : TaskSnapshot, Service {
    using Service::Service;
    std::optional<Data> CaptureTaskSnapshot(std::uint32_t flags) override {
      return make("take a snapshot", std::optional<Data>(),
                  [&] { return real.taskSnapshot.CaptureTaskSnapshot(flags); });
    }
  };

  Platform real_;
  Strike strike_;
  FailingPreferences preferences_{*this};
  FailingCounterStore counterStore_{*this};
  FailingDiagnostics diagnostics_{*this};
  FailingCrashSupport crashSupport_{*this};
  FailingSupportLibrary supportLibrary_{*this};
  FailingDeviceInfo deviceInfo_{*this};
  FailingOSVersion osVersion_{*this};
  FailingKernelParameters kernelParameters_{*this};
  FailingEnvironment environment_{*this};
  FailingApplications applications_{*this};
  FailingLocale locale_{*this};
  FailingPassLock passLock_{*this};
  FailingNotifications notifications_{*this};
  FailingNetworkUsage networkUsage_{*this};
  FailingDrives drives_{*this};
  FailingDriverRegistry driverRegistry_{*this};
  FailingTaskSnapshot taskSnapshot_{*this};
  EnvironmentQueries queries_;
};

}  // namespace quorlet

#endif  // QUORLET_TESTS_FAKES_FAILING_PLATFORM_H_
