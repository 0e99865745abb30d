// The services of another platform, each call of which can be made to fail, or be the last one.
#ifndef QUORLET_TESTS_FAKES_FAILING_PLATFORM_H_
#define QUORLET_TESTS_FAKES_FAILING_PLATFORM_H_

#include <cerrno>
#include <functional>
#include <memory>
#include <string>
#include <type_traits>
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
  // What every service here is made of. A call is not made when it is to fail.
  template <typename Interface>
  struct Service : Interface {
    Service(Interface& given, const Strike& asked) : real(given), strike(asked) {}
    template <typename Result, typename... Parameters>
    Result attempt(const char* name, std::type_identity_t<Result> failure,
                   Result (Interface::*method)(Parameters...),
                   std::type_identity_t<Parameters>... arguments) {
      if (strike(name)) return failure;
      return (real.*method)(std::forward<Parameters>(arguments)...);
    }
    template <typename... Parameters>
    void attempt(const char* name, void (Interface::*method)(Parameters...),
                 std::type_identity_t<Parameters>... arguments) {
      if (!strike(name)) (real.*method)(std::forward<Parameters>(arguments)...);
    }
    Interface& real;
    const Strike& strike;
  };

  struct FailingDrives : Service<Drives> {
    using Service::Service;
    std::vector<Drive> read() override { return attempt("drives", {}, &Drives::read); }
  };

  struct FailingPreferences : Service<Preferences> {
    using Service::Service;
    std::optional<PropertyValue> DGWPreferencesGetValue(std::string_view key,
                                                        std::string_view domain) override {
      return real.DGWPreferencesGetValue(key, domain);
    }
    void DGWPreferencesSetValue(std::string_view key, std::optional<PropertyValue> value,
                                std::string_view domain) override {
      // In memory, it cannot fail but for want of memory.
      static_cast<void>(strike("set a preference"));
      real.DGWPreferencesSetValue(key, std::move(value), domain);
    }
    bool DGWPreferencesSynchronize(std::string_view domain) override {
      return attempt("synchronize preferences", false, &Preferences::DGWPreferencesSynchronize,
                     domain);
    }
    void addToInteger(std::string_view key, std::int64_t delta, std::string_view domain) override {
      static_cast<void>(strike("add to a preference"));
      real.addToInteger(key, delta, domain);
    }
    bool isReadable(std::string_view domain) override {
      return attempt("read preferences", false, &Preferences::isReadable, domain);
    }
  };

  struct FailingCounterStore : Service<CounterStore> {
    using Service::Service;
    std::int32_t TLDaysSince1970() override { return real.TLDaysSince1970(); }
    Date dateForDaysSince1970(std::int32_t day) override { return real.dateForDaysSince1970(day); }
    void TLClientCheckpoint() override { attempt("checkpoint", &CounterStore::TLClientCheckpoint); }
    bool write(const StoreChanges& changes) override {
      return attempt("write counters", false, &CounterStore::write, changes);
    }
    bool readNote(std::string_view name, std::optional<Dictionary>& value) override {
      return attempt("read a note", false, &CounterStore::readNote, name, value);
    }
    bool takesKey(std::string_view key) override { return real.takesKey(key); }
    bool keysOfDay(std::int32_t day, const DayKeyHandler& handler) override {
      return real.keysOfDay(day, handler);
    }
    bool isSound() override { return real.isSound(); }
    std::unique_ptr<TLHistory> initWithDefaultPath() override {
      if (strike("read counters")) return std::make_unique<FailedHistory>();
      return real.initWithDefaultPath();
    }
    struct FailedHistory : TLHistory {
      void scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
          std::string_view, std::int32_t, std::int32_t, const ScalarHandler&) override {}
      void distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
          std::string_view, std::int32_t, std::int32_t, const DistributionHandler&) override {}
      bool failed() const override { return true; }
    };
  };

  struct FailingDiagnostics : Service<Diagnostics> {
    using Service::Service;
    bool DiagnosticLogSubmissionEnabled() override { return real.DiagnosticLogSubmissionEnabled(); }
    std::string DGWOSVersion() override { return real.DGWOSVersion(); }
    std::optional<PropertyValue> DGWGetDATaskingValue(std::string_view name) override {
      return real.DGWGetDATaskingValue(name);
    }
    bool writeLog(const LogRequest& request, const LogWriter& writer) override {
      return attempt("write a log", false, &Diagnostics::writeLog, request, writer);
    }
    bool hasLog(const std::string& fileName) override { return real.hasLog(fileName); }
    bool removeLogs(std::span<const std::string> fileNames) override {
      return attempt("remove logs", false, &Diagnostics::removeLogs, fileNames);
    }
    bool removeAllLogs() override {
      return attempt("remove all logs", false, &Diagnostics::removeAllLogs);
    }
    void SubmitDiagnosticLogs() override {
      attempt("submit logs", &Diagnostics::SubmitDiagnosticLogs);
    }
  };

  struct FailingCrashSupport : Service<CrashSupport> {
    using Service::Service;
    bool logEntries(std::int32_t type, std::span<const Dictionary> entries) override {
      return attempt("log entries", false, &CrashSupport::logEntries, type, entries);
    }
    bool syncStructuredData() override {
      return attempt("sync entries", false, &CrashSupport::syncStructuredData);
    }
    bool stageEntries() override {
      return attempt("stage entries", false, &CrashSupport::stageEntries);
    }
    bool publishStagedEntries() override {
      return attempt("publish entries", false, &CrashSupport::publishStagedEntries);
    }
    void FSDumpAllOldStructuredDataLogs() override {
      attempt("move old entries", &CrashSupport::FSDumpAllOldStructuredDataLogs);
    }
    void rollCarewellLogs() override { attempt("rotate logs", &CrashSupport::rollCarewellLogs); }
    std::string GetSysIDWithDescription() override { return real.GetSysIDWithDescription(); }
    std::string GetHardwareModel() override { return real.GetHardwareModel(); }
    std::string GetSystemVersion() override { return real.GetSystemVersion(); }
    std::string GetIncidentID() override { return real.GetIncidentID(); }
  };

  struct FailingSupportLibrary : Service<SupportLibrary> {
    using Service::Service;
    bool load() override { return attempt("load the library", false, &SupportLibrary::load); }
    Function findFunction(const char* name) override {
      return strike("find a function") ? nullptr : real.findFunction(name);
    }
  };

  struct FailingDeviceInfo : Service<DeviceInfo> {
    using Service::Service;
    std::optional<PropertyValue> DQCopyAnswer(std::string_view question) override {
      return attempt("ask the device", std::nullopt, &DeviceInfo::DQCopyAnswer, question);
    }
  };

  struct FailingOSVersion : Service<OSVersion> {
    using Service::Service;
    std::optional<Dictionary> CopySystemVersionDictionary() override {
      return attempt("read the version", std::nullopt, &OSVersion::CopySystemVersionDictionary);
    }
  };

  struct FailingKernelParameters : Service<KernelParameters> {
    using Service::Service;
    int sysctlbyname(std::string_view name, std::span<std::byte> buffer,
                     std::size_t& length) override {
      return attempt("read a parameter", EIO, &KernelParameters::sysctlbyname, name, buffer,
                     length);
    }
    bool removeTaken(std::string_view name) override {
      return attempt("remove parameters", false, &KernelParameters::removeTaken, name);
    }
    void returnTaken(std::string_view name) override { real.returnTaken(name); }
  };

  struct FailingEnvironment : Service<Environment> {
    using Service::Service;
    std::optional<FileStatus> stat(std::string_view path) override {
      return attempt("look at a file", std::nullopt, &Environment::stat, path);
    }
    std::optional<std::string> readFile(std::string_view path, std::size_t limit) override {
      return attempt("read a file", std::nullopt, &Environment::readFile, path, limit);
    }
    std::optional<std::string> SystemGroupContainerPath(std::string_view identifier,
                                                        std::uint64_t& error) override {
      error = EIO;
      return attempt("find a container", std::nullopt, &Environment::SystemGroupContainerPath,
                     identifier, error);
    }
    bool CheckMultiUserMode(std::int32_t& mode) override {
      return attempt("ask for users", false, &Environment::CheckMultiUserMode, mode);
    }
    std::uint64_t TickClockNow() override { return real.TickClockNow(); }
    int TickTimebase(std::uint32_t& numerator, std::uint32_t& denominator) override {
      return attempt("ask for the timebase", 1, &Environment::TickTimebase, numerator, denominator);
    }
  };

  struct FailingApplications : Service<Applications> {
    using Service::Service;
    bool EnumerateApplicationBundles(
        const std::function<void(ApplicationBundleType)>& visit) override {
      return attempt("list applications", false, &Applications::EnumerateApplicationBundles, visit);
    }
  };

  struct FailingLocale : Service<LocaleService> {
    using Service::Service;
    using Languages = std::vector<std::string>;
    Languages PreferredLanguages() override {
      return attempt("ask for languages", {}, &LocaleService::PreferredLanguages);
    }
    Languages SystemLanguages() override {
      return attempt("list languages", {}, &LocaleService::SystemLanguages);
    }
    Languages PreferredLocalizations(const Languages& available,
                                     const Languages& preferred) override {
      return real.PreferredLocalizations(available, preferred);
    }
    std::optional<std::string> CurrentRegionCode() override {
      return attempt("ask for the region", std::nullopt, &LocaleService::CurrentRegionCode);
    }
  };

  struct FailingPassLock : Service<PassLock> {
    using Service::Service;
    bool lock() override { return attempt("take the lock", false, &PassLock::lock); }
    void unlock() override { real.unlock(); }
  };

  struct FailingNotifications : Service<Notifications> {
    using Service::Service;
    void PostNotification(std::string_view name) override {
      attempt("post a notification", &Notifications::PostNotification, name);
    }
  };

  struct FailingNetworkUsage : Service<NetworkUsage> {
    using Service::Service;
    void QueryProcessDataUsage(const std::vector<std::string>& nameFilter, UsageNameKind kind,
                               Reply reply) override {
      attempt("ask for usage", &NetworkUsage::QueryProcessDataUsage, nameFilter, kind,
              std::move(reply));
    }
  };

  struct FailingDriverRegistry : Service<DriverRegistry> {
    using Service::Service;
    RegistryHandle FindServiceByClass(std::string_view className) override {
      return attempt("find a driver", {}, &DriverRegistry::FindServiceByClass, className);
    }
    KernelReturn FindServicesMatching(const Dictionary& match, RegistryHandle& iterator) override {
      return attempt("find drivers", kKernelError, &DriverRegistry::FindServicesMatching, match,
                     iterator);
    }
    RegistryHandle IteratorNext(RegistryHandle iterator) override {
      return attempt("go to the next driver", {}, &DriverRegistry::IteratorNext, iterator);
    }
    bool IteratorIsValid(RegistryHandle iterator) override {
      return real.IteratorIsValid(iterator);
    }
    void ReleaseHandle(RegistryHandle handle) override { real.ReleaseHandle(handle); }
    std::uint32_t HandleRetainCount(RegistryHandle handle) override {
      return real.HandleRetainCount(handle);
    }
    KernelReturn OpenDriverConnection(RegistryHandle service, std::uint32_t type,
                                      RegistryHandle& connection) override {
      return attempt("open a driver", kKernelError, &DriverRegistry::OpenDriverConnection, service,
                     type, connection);
    }
    KernelReturn CloseDriverConnection(RegistryHandle connection) override {
      return real.CloseDriverConnection(connection);
    }
    KernelReturn CallDriverMethod(RegistryHandle connection, std::uint32_t method,
                                  DriverCall& call) override {
      return attempt("call a driver", kKernelError, &DriverRegistry::CallDriverMethod, connection,
                     method, call);
    }
    KernelReturn MapDriverMemory(RegistryHandle connection, std::uint32_t memoryType,
                                 std::span<const std::byte>& memory) override {
      return attempt("map a driver's memory", kKernelError, &DriverRegistry::MapDriverMemory,
                     connection, memoryType, memory);
    }
    void UnmapDriverMemory(RegistryHandle connection, std::uint32_t memoryType,
                           std::span<const std::byte> memory) override {
      real.UnmapDriverMemory(connection, memoryType, memory);
    }
    std::optional<PropertyValue> CopyEntryProperty(RegistryHandle entry,
                                                   std::string_view key) override {
      return attempt("read a property", std::nullopt, &DriverRegistry::CopyEntryProperty, entry,
                     key);
    }
    std::optional<PropertyValue> SearchEntryProperty(RegistryHandle entry,
                                                     std::string_view key) override {
      return attempt("search a property", std::nullopt, &DriverRegistry::SearchEntryProperty, entry,
                     key);
    }
    KernelReturn GetEntryName(RegistryHandle entry, std::string& name) override {
      return attempt("read a name", kKernelError, &DriverRegistry::GetEntryName, entry, name);
    }
    KernelReturn GetEntryID(RegistryHandle entry, std::uint64_t& id) override {
      return attempt("read an ID", kKernelError, &DriverRegistry::GetEntryID, entry, id);
    }
  };

  struct FailingTaskSnapshot : Service<TaskSnapshot> {
    using Service::Service;
    std::optional<Data> CaptureTaskSnapshot(std::uint32_t flags) override {
      return attempt("take a snapshot", std::nullopt, &TaskSnapshot::CaptureTaskSnapshot, flags);
    }
  };

  Platform real_;
  Strike strike_;
  FailingPreferences preferences_{real_.preferences, strike_};
  FailingCounterStore counterStore_{real_.counterStore, strike_};
  FailingDiagnostics diagnostics_{real_.diagnostics, strike_};
  FailingCrashSupport crashSupport_{real_.crashSupport, strike_};
  FailingSupportLibrary supportLibrary_{real_.supportLibrary, strike_};
  FailingDeviceInfo deviceInfo_{real_.deviceInfo, strike_};
  FailingOSVersion osVersion_{real_.osVersion, strike_};
  FailingKernelParameters kernelParameters_{real_.kernelParameters, strike_};
  FailingEnvironment environment_{real_.environment, strike_};
  FailingApplications applications_{real_.applications, strike_};
  FailingLocale locale_{real_.locale, strike_};
  FailingPassLock passLock_{real_.passLock, strike_};
  FailingNotifications notifications_{real_.notifications, strike_};
  FailingNetworkUsage networkUsage_{real_.networkUsage, strike_};
  FailingDrives drives_{real_.drives, strike_};
  FailingDriverRegistry driverRegistry_{real_.driverRegistry, strike_};
  FailingTaskSnapshot taskSnapshot_{real_.taskSnapshot, strike_};
  EnvironmentQueries queries_;
};

}  // namespace quorlet

#endif  // QUORLET_TESTS_FAKES_FAILING_PLATFORM_H_
