// One platform in memory: every service holds plain state that a test sets up and looks at.
#ifndef QUORLET_TESTS_FAKES_FAKE_PLATFORM_H_
#define QUORLET_TESTS_FAKES_FAKE_PLATFORM_H_

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstring>
#include <deque>
#include <exception>
#include <map>
#include <set>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "fakes/fake_clock.h"
#include "fakes/fake_counter_store.h"
#include "fakes/fake_driver_registry.h"
#include "fakes/fake_preferences.h"
#include "fakes/fake_system_log.h"
#include "platform/platform.h"

namespace quorlet {

struct SubmittedLog {
  std::string typeCode;
  std::string name;
  std::optional<Dictionary> metadata;
  std::string body;
  std::string fileName;
};

class FakeDiagnostics : public Diagnostics {
 public:
  bool DiagnosticLogSubmissionEnabled() override { return submissionEnabled; }
  std::string DGWOSVersion() override { return osVersion; }
  std::optional<PropertyValue> DGWGetDATaskingValue(std::string_view name) override {
    const PropertyValue* value = tasking.find(name);
    return value != nullptr ? std::optional(*value) : std::nullopt;
  }
  bool writeLog(const LogRequest& request, const LogWriter& writer) override {
    struct Output : LogOutput {
      bool write(std::string_view bytes) override {
        text += bytes;
        return true;
      }
      std::string text;
    } output;
    if (!submissionEnabled || diskIsFull || !writer(output)) return false;
    const std::string fileName = std::string(request.name) + "-" + std::to_string(++written);
    if (request.beforePublication) request.beforePublication(fileName);
    logs.push_back({std::string(request.typeCode), std::string(request.name), request.metadata,
                    output.text, fileName});
    return true;
  }
  bool hasLog(const std::string& fileName) override {
    return std::ranges::find(logs, fileName, &SubmittedLog::fileName) != logs.end();
  }
  bool removeLogs(std::span<const std::string> fileNames) override {
    std::erase_if(logs, [&](const SubmittedLog& log) {
      return std::ranges::find(fileNames, log.fileName) != fileNames.end();
    });
    return true;
  }
  bool removeAllLogs() override {
    logs.clear();
    return true;
  }
  void SubmitDiagnosticLogs() override { ++submissions; }

  bool submissionEnabled = true;
  bool diskIsFull = false;
  std::string osVersion = "TestOS 1 (A1)";
  Dictionary tasking;
  std::vector<SubmittedLog> logs;
  int submissions = 0;
  int written = 0;
};

class FakeCrashSupport : public CrashSupport {
 public:
  bool logEntries(std::int32_t type, std::span<const Dictionary> list) override {
    for (const Dictionary& entry : list) {
      if (!isFull) (isStaging ? staged : entries).emplace_back(type, entry.deepCopy());
    }
    return !isFull;
  }
  bool stageEntries() override {
    staged.clear();
    return isStaging = true;
  }
  bool publishStagedEntries() override {
    entries.insert(entries.end(), staged.begin(), staged.end());
    staged.clear();
    isStaging = false;
    return true;
  }
  bool syncStructuredData() override { return !isFull && !isStaging; }
  void FSDumpAllOldStructuredDataLogs() override { ++dumps; }
  void rollCarewellLogs() override { ++rolls; }
  std::string GetSysIDWithDescription() override { return "system-1"; }
  std::string GetHardwareModel() override { return "Model 9"; }
  std::string GetSystemVersion() override { return "TestOS 1 (A1)"; }
  std::string GetIncidentID() override { return "INCIDENT-" + std::to_string(++incidents); }
  std::vector<std::pair<std::int32_t, Dictionary>> entries;
  std::vector<std::pair<std::int32_t, Dictionary>> staged;  // outlive the process, as entries do
  bool isStaging = false;
  bool isFull = false;  // no entry can be added
  int incidents = 0;
  int dumps = 0;
  int rolls = 0;
};

class FakeSupportLibrary : public SupportLibrary {
 public:
  bool load() override {
    ++loads;
    return present;
  }
  Function findFunction(const char* name) override {
    if (missing.contains(name)) return nullptr;
    const std::string_view text = name;
    if (text == "DGWPreferencesGetIntegerValue") return reinterpret_cast<Function>(&ReadInteger);
    if (text == "DGWPreferencesSetValue") return reinterpret_cast<Function>(&WriteInteger);
    return nullptr;
  }
  bool present = true;
  std::set<std::string, std::less<>> missing;
  int loads = 0;

 private:
  static std::int64_t ReadInteger(Preferences& preferences, const char* key, const char* domain) {
    return preferences.DGWPreferencesGetIntegerValue(key, domain);
  }
  static void WriteInteger(Preferences& preferences, const char* key, std::int64_t value,
                           const char* domain) {
    preferences.DGWPreferencesSetValue(key, Int64(value), domain);
  }
};

class FakeDeviceInfo : public DeviceInfo {
 public:
  std::optional<PropertyValue> DQCopyAnswer(std::string_view question) override {
    const PropertyValue* answer = answers.find(question);
    return answer != nullptr ? std::optional(answer->deepCopy()) : std::nullopt;
  }
  Dictionary answers;
};

class FakeOSVersion : public OSVersion {
 public:
  std::optional<Dictionary> CopySystemVersionDictionary() override {
    if (!build) return std::nullopt;
    return Dictionary{{"ProductBuildVersion", *build}};
  }
  std::optional<std::string> build = "A1";
};

class FakeKernelParameters : public KernelParameters {
 public:
  int sysctlbyname(std::string_view name, std::span<std::byte> buffer,
                   std::size_t& length) override {
    asked.emplace_back(name);
    const auto queue = queues.find(name);
    std::size_t& next = taken[std::string(name)];
    if (queue != queues.end() && next < queue->second.size()) {
      const int error = copyOut(queue->second[next], buffer, length);
      if (error == 0) ++next;
      return error;
    }
    const auto found = values.find(name);
    return found != values.end() ? copyOut(found->second, buffer, length) : missing;
  }
  bool removeTaken(std::string_view name) override {
    auto& queue = queues[std::string(name)];
    const auto count = static_cast<std::ptrdiff_t>(std::exchange(taken[std::string(name)], 0));
    queue.erase(queue.begin(), queue.begin() + count);
    return true;
  }
  void returnTaken(std::string_view name) override { taken[std::string(name)] = 0; }

  std::map<std::string, std::string, std::less<>> values;
  std::map<std::string, std::deque<std::string>, std::less<>> queues;
  std::map<std::string, std::size_t> taken;  // how many of a queue were handed out
  int missing = ENOENT;                      // what a read of anything else fails with
  std::vector<std::string> asked;

 private:
  static int copyOut(const std::string& bytes, std::span<std::byte> buffer, std::size_t& length) {
    if (bytes.size() > buffer.size()) return ENOMEM;
    if (!bytes.empty()) std::memcpy(buffer.data(), bytes.data(), bytes.size());
    length = bytes.size();
    return 0;
  }
};

class FakeEnvironment : public Environment {
 public:
  std::optional<FileStatus> stat(std::string_view path) override {
    const auto size = sizes.find(path);
    if (size != sizes.end()) return FileStatus{size->second};
    const auto file = files.find(path);
    if (file != files.end()) return FileStatus{file->second.size()};
    return std::nullopt;
  }
  std::optional<std::string> readFile(std::string_view path, std::size_t limit) override {
    const auto file = files.find(path);
    if (file == files.end() || file->second.size() > limit) return std::nullopt;
    return file->second;
  }
  std::optional<std::string> SystemGroupContainerPath(std::string_view identifier,
                                                      std::uint64_t& error) override {
    if (containerError == 0) return "/containers/" + std::string(identifier);
    error = containerError;
    return std::nullopt;
  }
  bool CheckMultiUserMode(std::int32_t& mode) override {
    if (!userMode) return false;
    mode = *userMode;
    return true;
  }
  std::uint64_t TickClockNow() override { return ticks; }
  int TickTimebase(std::uint32_t& numerator, std::uint32_t& denominator) override {
    numerator = timebaseNumerator;
    denominator = timebaseDenominator;
    return timebaseStatus;
  }

  std::map<std::string, std::string, std::less<>> files;
  std::map<std::string, std::uint64_t, std::less<>> sizes;  // of files without content
  std::uint64_t containerError = 0;
  std::optional<std::int32_t> userMode;
  std::uint64_t ticks = 0;
  std::uint32_t timebaseNumerator = 1;
  std::uint32_t timebaseDenominator = 1;
  int timebaseStatus = 0;
};

class FakeApplications : public Applications {
 public:
  bool EnumerateApplicationBundles(
      const std::function<void(ApplicationBundleType)>& visit) override {
    ++enumerations;
    for (const ApplicationBundleType type : bundles) visit(type);
    return true;
  }
  std::vector<ApplicationBundleType> bundles;
  int enumerations = 0;
};

class FakeLocale : public LocaleService {
 public:
  std::vector<std::string> PreferredLanguages() override { return preferred; }
  std::vector<std::string> SystemLanguages() override { return system; }
  std::vector<std::string> PreferredLocalizations(const std::vector<std::string>& available,
                                                  const std::vector<std::string>& wanted) override {
    std::vector<std::string> shown;
    std::ranges::copy_if(wanted, std::back_inserter(shown), [&](const std::string& language) {
      return std::ranges::find(available, language) != available.end();
    });
    return shown;
  }
  std::optional<std::string> CurrentRegionCode() override { return region; }
  std::vector<std::string> preferred;
  std::vector<std::string> system;
  std::optional<std::string> region;
};

class FakePassLock : public PassLock {
 public:
  bool lock() override { return held = isFree; }
  void unlock() override { held = false; }
  bool isFree = true;
  bool held = false;
};

// Nobody ever calls.
class FakeNamedService : public NamedService {
 public:
  bool ListenNamedService(std::string_view, ListenerHandler) override { return canListen; }
  void AcceptPeerConnection(Peer&, MessageHandler) override {}
  MainLoopResult RunMainLoop(double seconds, bool) override {
    sliceSeconds.push_back(seconds);
    return MainLoopResult::kTimedOut;
  }

  bool canListen = true;
  std::vector<double> sliceSeconds;
};

class FakeNotifications : public Notifications {
 public:
  void PostNotification(std::string_view name) override {
    if (beforePosting) beforePosting();
    posted.emplace_back(name);
  }
  std::vector<std::string> posted;
  std::function<void()> beforePosting;  // may throw: nothing is posted
};

// Replies on a thread of its own, before the query returns unless the reply is held back.
class FakeNetworkUsage : public NetworkUsage {
 public:
  void QueryProcessDataUsage(const std::vector<std::string>& nameFilter, UsageNameKind,
                             Reply reply) override {
    filters.push_back(nameFilter);
    held_ = std::move(reply);
    if (!holdsBack) deliver();
  }
  // Delivers the reply that was held back.
  void deliver() {
    std::exception_ptr thrown;  // nobody else would take it
    std::thread([&] {
      try {
        held_(&records);
      } catch (...) {
        thrown = std::current_exception();
      }
    }).join();
    held_ = nullptr;
    if (thrown) std::rethrow_exception(thrown);
  }

  bool holdsBack = false;
  Array records;
  std::vector<std::vector<std::string>> filters;

 private:
  Reply held_;
};

// Waiting ends at once, and takes no time.
class FakeSemaphores : public Semaphores {
 public:
  std::shared_ptr<Semaphore> create() override { return std::make_shared<Counted>(waits); }
  std::vector<std::chrono::nanoseconds> waits;  // the limits asked for

 private:
  struct Counted : Semaphore {
    explicit Counted(std::vector<std::chrono::nanoseconds>& asked) : limits(asked) {}
    void signal() override { ++count; }
    bool wait(std::chrono::nanoseconds limit) override {
      limits.push_back(limit);
      if (count == 0) return false;
      --count;
      return true;
    }
    std::vector<std::chrono::nanoseconds>& limits;
    std::atomic<int> count = 0;
  };
};

class FakeTaskSnapshot : public TaskSnapshot {
 public:
  std::optional<Data> CaptureTaskSnapshot(std::uint32_t flags) override {
    return flags == kTaskSnapshotTaggedItems ? buffer : std::nullopt;
  }
  std::optional<Data> buffer;
};

class FakeStandardError : public StandardError {
 public:
  void write(std::string_view written) override { text += written; }
  std::string text;
};

class FakeDrives : public Drives {
 public:
  std::vector<Drive> read() override { return drives; }
  std::vector<Drive> drives;
};

// The services, bundled. The clock starts at noon of day 20000.
struct FakePlatform {
  FakePlatform();
  ~FakePlatform();
  FakePlatform(const FakePlatform&) = delete;
  FakePlatform& operator=(const FakePlatform&) = delete;

  FakeSystemLog log;
  FakeClock clock;
  FakePreferences preferences;
  FakeCounterStore counterStore{clock};
  FakeDiagnostics diagnostics;
  FakeCrashSupport crashSupport;
  FakeSupportLibrary supportLibrary;
  FakeDeviceInfo deviceInfo;
  FakeOSVersion osVersion;
  FakeKernelParameters kernelParameters;
  FakeEnvironment environment;
  EnvironmentQueries queries{deviceInfo, environment, log};
  FakeApplications applications;
  FakeLocale locale;
  FakePassLock passLock;
  FakeNamedService namedService;
  FakeNotifications notifications;
  FakeNetworkUsage networkUsage;
  FakeSemaphores semaphores;
  FakeDrives drives;
  FakeDriverRegistry driverRegistry;
  FakeTaskSnapshot taskSnapshot;
  FakeStandardError standardError;
  Platform services{log,
                    clock,
                    preferences,
                    counterStore,
                    diagnostics,
                    crashSupport,
                    supportLibrary,
                    deviceInfo,
                    osVersion,
                    kernelParameters,
                    environment,
                    queries,
                    applications,
                    locale,
                    passLock,
                    namedService,
                    notifications,
                    networkUsage,
                    semaphores,
                    drives,
                    driverRegistry,
                    taskSnapshot,
                    standardError};
};

}  // namespace quorlet

#endif  // QUORLET_TESTS_FAKES_FAKE_PLATFORM_H_
