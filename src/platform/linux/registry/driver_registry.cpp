#include "drvreport/driver_registry.h"

#include <algorithm>
#include <map>
#include <memory>
#include <utility>

#include "platform/linux/registry/report_hub.h"
#include "platform/linux/registry/services.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr std::size_t kMaxNameBytes = 127;
constexpr std::string_view kPublishesChannels = "DrvReportLegendPublic";
// The added hub's, unless an entry has it already.
constexpr std::uint64_t kHubID = 0x4C00'0000'0000'0000;

using Entries = std::vector<RegistryEntry>;  // by ID
using SharedEntries = std::shared_ptr<const Entries>;

bool HasClass(const Entries& entries, std::string_view className) {
  return std::ranges::find(entries, className, &RegistryEntry::className) != entries.end();
}

// What a service handle stands for: one of the entries as they were when it was looked up.
struct Service {
  SharedEntries entries;
  std::size_t index = 0;
  const RegistryEntry& entry() const { return (*entries)[index]; }
};

struct Visit {
  SharedEntries entries;
  std::vector<std::size_t> found;
  std::size_t next = 0;
  std::string entrySet;
};

bool Matches(const RegistryEntry& entry, const Dictionary& match) {
  const std::string* className = StringEntry(match, kMatchClassName);
  if (className != nullptr && *className != entry.className) return false;
  const Dictionary* wanted = DictionaryEntry(match, kMatchProperties);
  return wanted == nullptr || std::all_of(wanted->begin(), wanted->end(), [&](const auto& item) {
           const PropertyValue* value = entry.properties.find(item.first);
           return value != nullptr && *value == item.second;
         });
}

class LinuxDriverRegistry : public DriverRegistry {
 public:
  explicit LinuxDriverRegistry(std::vector<std::unique_ptr<EntrySource>> sources)
      : sources_(std::move(sources)) {}

  RegistryHandle FindServiceByClass(std::string_view className) override {
    const SharedEntries entries = lookUp();
    const auto found = std::ranges::find(*entries, className, &RegistryEntry::className);
    if (found == entries->end()) return 0;
    return addService({entries, static_cast<std::size_t>(found - entries->begin())});
  }

  KernelReturn FindServicesMatching(const Dictionary& match, RegistryHandle& iterator) override {
    Visit visit;
    visit.entrySet = entrySet();  // before the look-up: what changes meanwhile is noticed
    if (isVisited_) devices_.reset();
    visit.entries = lookUp();
    isVisited_ = true;
    for (std::size_t i = 0; i < visit.entries->size(); ++i) {
      if (Matches((*visit.entries)[i], match)) visit.found.push_back(i);
    }
    iterator = newHandle();
    visits_.emplace(iterator, std::move(visit));
    return kKernelSuccess;
  }

  RegistryHandle IteratorNext(RegistryHandle iterator) override {
    const auto visit = visits_.find(iterator);
    if (visit == visits_.end() || visit->second.next == visit->second.found.size()) return 0;
    return addService({visit->second.entries, visit->second.found[visit->second.next++]});
  }

  bool IteratorIsValid(RegistryHandle iterator) override {
    const auto visit = visits_.find(iterator);
    return visit != visits_.end() && visit->second.entrySet == entrySet();
  }

  void ReleaseHandle(RegistryHandle handle) override {
    services_.erase(handle);
    visits_.erase(handle);
  }

  std::uint32_t HandleRetainCount(RegistryHandle handle) override {
    return services_.contains(handle) || visits_.contains(handle) ? 1 : 0;
  }

  KernelReturn OpenDriverConnection(RegistryHandle service, std::uint32_t type,
                                    RegistryHandle& connection) override {
    const RegistryEntry* entry = findEntry(service);
    if (entry == nullptr) return kKernelBadArgument;
    std::shared_ptr<EntryDriver> driver = entry->driver;
    if (entry->className == kReportHubClass) driver = MakeReportHub(sourcePointers(), driver);
    if (driver == nullptr) return kKernelUnsupported;
    const KernelReturn status = driver->open(type);
    if (status != kKernelSuccess) return status;
    connection = newHandle();
    connections_.emplace(connection, std::move(driver));
    return kKernelSuccess;
  }

  KernelReturn CloseDriverConnection(RegistryHandle connection) override {
    const auto driver = takeConnection(connection);
    return driver != nullptr ? driver->close() : kKernelBadArgument;
  }

  KernelReturn CallDriverMethod(RegistryHandle connection, std::uint32_t method,
                                DriverCall& call) override {
    call.scalarsWritten = 0;
    call.bytesWritten = 0;
    EntryDriver* driver = findDriver(connection);
    return driver != nullptr ? driver->call(method, call) : kKernelBadArgument;
  }

  KernelReturn MapDriverMemory(RegistryHandle connection, std::uint32_t memoryType,
                               std::span<const std::byte>& memory) override {
    EntryDriver* driver = findDriver(connection);
    return driver != nullptr ? driver->map(memoryType, memory) : kKernelBadArgument;
  }

  void UnmapDriverMemory(RegistryHandle connection, std::uint32_t memoryType,
                         std::span<const std::byte>) override {
    if (EntryDriver* driver = findDriver(connection)) driver->unmap(memoryType);
  }

  std::optional<PropertyValue> CopyEntryProperty(RegistryHandle entry,
                                                 std::string_view key) override {
    const RegistryEntry* found = findEntry(entry);
    const PropertyValue* value = found != nullptr ? found->properties.find(key) : nullptr;
    return value != nullptr ? std::optional(value->deepCopy()) : std::nullopt;
  }

  std::optional<PropertyValue> SearchEntryProperty(RegistryHandle entry,
                                                   std::string_view key) override {
    const auto service = services_.find(entry);
    if (service == services_.end()) return std::nullopt;
    const Entries& entries = *service->second.entries;
    const RegistryEntry* current = &service->second.entry();
    // Parents may form a ring: no way through the entries is longer than their number.
    for (std::size_t i = 0; i < entries.size(); ++i) {
      if (const PropertyValue* value = current->properties.find(key)) return value->deepCopy();
      if (!current->parentID) break;
      const auto parent =
          std::ranges::lower_bound(entries, *current->parentID, {}, &RegistryEntry::id);
      if (parent == entries.end() || parent->id != *current->parentID) break;
      current = &*parent;
    }
    return std::nullopt;
  }

  KernelReturn GetEntryName(RegistryHandle entry, std::string& name) override {
    const RegistryEntry* found = findEntry(entry);
    if (found == nullptr) return kKernelBadArgument;
    name = found->name.substr(0, kMaxNameBytes);
    if (name.size() < found->name.size()) name.resize(ValidUtf8Prefix(name));
    return kKernelSuccess;
  }

  KernelReturn GetEntryID(RegistryHandle entry, std::uint64_t& id) override {
    const RegistryEntry* found = findEntry(entry);
    if (found == nullptr) return kKernelBadArgument;
    id = found->id;
    return kKernelSuccess;
  }

 private:
  std::string entrySet() const { return sources_.empty() ? "" : sources_.front()->entrySet(); }

  std::vector<EntrySource*> sourcePointers() const {
    std::vector<EntrySource*> pointers;
    for (const auto& source : sources_) pointers.push_back(source.get());
    return pointers;
  }

  SharedEntries lookUp() {
    Entries entries;
    if (!sources_.empty()) entries = sources_.front()->entries();
    readDevices();
    bool devicesPublish = false;
    for (const Entries& ofSource : *devices_) {
      const std::size_t earlier = entries.size();
      for (const RegistryEntry& entry : ofSource) {
        const bool isServed = std::ranges::any_of(entry.standsInFor, [&](const auto& className) {
          const auto end = entries.begin() + static_cast<std::ptrdiff_t>(earlier);
          return std::ranges::find(entries.begin(), end, className, &RegistryEntry::className) !=
                 end;
        });
        if (isServed) continue;
        entries.push_back(entry);
        devicesPublish = devicesPublish || entry.properties.contains(kPublishesChannels);
      }
    }
    if (devicesPublish && !HasClass(entries, kReportHubClass)) addHub(entries);
    std::ranges::stable_sort(entries, {}, &RegistryEntry::id);
    const auto hasSameID = [](const RegistryEntry& a, const RegistryEntry& b) {
      return a.id == b.id;
    };
    entries.erase(std::unique(entries.begin(), entries.end(), hasSameID), entries.end());
    return std::make_shared<const Entries>(std::move(entries));
  }

  void readDevices() {
    if (devices_) return;
    devices_.emplace();
    for (std::size_t i = 1; i < sources_.size(); ++i) devices_->push_back(sources_[i]->entries());
    isVisited_ = false;
  }

  static void addHub(Entries& entries) {
    RegistryEntry hub;
    hub.id = kHubID;
    hub.name = kReportHubClass;
    hub.className = kReportHubClass;
    while (std::ranges::find(entries, hub.id, &RegistryEntry::id) != entries.end()) ++hub.id;
    entries.push_back(std::move(hub));
  }

  RegistryHandle newHandle() {
    do {
      ++lastHandle_;
    } while (lastHandle_ == 0 || services_.contains(lastHandle_) || visits_.contains(lastHandle_) ||
             connections_.contains(lastHandle_));
    return lastHandle_;
  }

  RegistryHandle addService(Service service) {
    const RegistryHandle handle = newHandle();
    services_.emplace(handle, std::move(service));
    return handle;
  }

  const RegistryEntry* findEntry(RegistryHandle handle) const {
    const auto service = services_.find(handle);
    return service != services_.end() ? &service->second.entry() : nullptr;
  }

  EntryDriver* findDriver(RegistryHandle handle) const {
    const auto connection = connections_.find(handle);
    return connection != connections_.end() ? connection->second.get() : nullptr;
  }

  std::shared_ptr<EntryDriver> takeConnection(RegistryHandle handle) {
    const auto connection = connections_.extract(handle);
    return connection.empty() ? nullptr : connection.mapped();
  }

  const std::vector<std::unique_ptr<EntrySource>> sources_;
  std::optional<std::vector<Entries>> devices_;  // of every source but the first
  bool isVisited_ = false;                       // a visit has seen devices_
  RegistryHandle lastHandle_ = 0;
  std::map<RegistryHandle, Service> services_;
  std::map<RegistryHandle, Visit> visits_;
  std::map<RegistryHandle, std::shared_ptr<EntryDriver>> connections_;
};

}  // namespace

std::unique_ptr<DriverRegistry> MakeLinuxDriverRegistry(
    std::vector<std::unique_ptr<EntrySource>> sources) {
  return std::make_unique<LinuxDriverRegistry>(std::move(sources));
}

}  // namespace quorlet
