// A driver registry in memory: entries that a test lays out, drivers that answer from tables.
#ifndef QUORLET_TESTS_FAKES_FAKE_DRIVER_REGISTRY_H_
#define QUORLET_TESTS_FAKES_FAKE_DRIVER_REGISTRY_H_

#include <algorithm>
#include <cstring>
#include <functional>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "drvreport/driver_registry.h"

namespace quorlet {

struct FakeEntry {
  std::uint64_t id = 0;
  std::string name;
  std::string className;
  Dictionary properties;
  KernelReturn openStatus = 0;
  KernelReturn closeStatus = 0;
  KernelReturn mapStatus = 0;
  KernelReturn nameStatus = 0;
  KernelReturn idStatus = 0;
  // What the driver does when it is called; none: every call fails.
  std::function<KernelReturn(std::uint32_t method, DriverCall& call)> driver;
  Data memory;  // what MapDriverMemory maps
};

class FakeDriverRegistry : public DriverRegistry {
 public:
  RegistryHandle FindServiceByClass(std::string_view className) override {
    for (std::size_t i = 0; i < entries.size(); ++i) {
      if (entries[i].className == className) return retain(i);
    }
    return 0;
  }
  KernelReturn FindServicesMatching(const Dictionary& match, RegistryHandle& iterator) override {
    if (findStatus != 0) return findStatus;
    Visit visit;
    for (std::size_t i = 0; i < entries.size(); ++i) {
      if (matches(entries[i], match)) visit.found.push_back(i);
    }
    iterator = ++lastHandle_;
    visits_[iterator] = visit;
    return 0;
  }
  RegistryHandle IteratorNext(RegistryHandle iterator) override {
    Visit& visit = visits_.at(iterator);
    return visit.next < visit.found.size() ? retain(visit.found[visit.next++]) : 0;
  }
  // Changes after `changesAfter` services, and stays changed.
  bool IteratorIsValid(RegistryHandle iterator) override {
    return visits_.at(iterator).next < changesAfter;
  }
  void ReleaseHandle(RegistryHandle handle) override {
    if (visits_.erase(handle) + services_.erase(handle) != 1) ++wrongReleases;
  }
  std::uint32_t HandleRetainCount(RegistryHandle handle) override {
    return services_.contains(handle) ? 1 : 0;
  }
  KernelReturn OpenDriverConnection(RegistryHandle service, std::uint32_t,
                                    RegistryHandle& connection) override {
    const std::size_t index = services_.at(service);
    ++opens;
    if (entries[index].openStatus != 0) return entries[index].openStatus;
    connection = ++lastHandle_;
    connections_[connection] = index;
    return 0;
  }
  KernelReturn CloseDriverConnection(RegistryHandle connection) override {
    const std::size_t index = connections_.at(connection);
    connections_.erase(connection);
    return entries[index].closeStatus;
  }
  KernelReturn CallDriverMethod(RegistryHandle connection, std::uint32_t method,
                                DriverCall& call) override {
    FakeEntry& entry = entries[connections_.at(connection)];
    return entry.driver ? entry.driver(method, call) : kKernelUnsupported;
  }
  KernelReturn MapDriverMemory(RegistryHandle connection, std::uint32_t memoryType,
                               std::span<const std::byte>& memory) override {
    FakeEntry& entry = entries[connections_.at(connection)];
    if (entry.mapStatus != 0) return entry.mapStatus;
    memory = entry.memory;
    mapped.insert(memoryType);
    return 0;
  }
  void UnmapDriverMemory(RegistryHandle, std::uint32_t memoryType,
                         std::span<const std::byte>) override {
    if (mapped.erase(memoryType) != 1) ++wrongReleases;
  }
  std::optional<PropertyValue> CopyEntryProperty(RegistryHandle entry,
                                                 std::string_view key) override {
    const PropertyValue* value = entries[services_.at(entry)].properties.find(key);
    return value != nullptr ? std::optional(value->deepCopy()) : std::nullopt;
  }
  std::optional<PropertyValue> SearchEntryProperty(RegistryHandle entry,
                                                   std::string_view key) override {
    return CopyEntryProperty(entry, key);
  }
  KernelReturn GetEntryName(RegistryHandle entry, std::string& name) override {
    name = entries[services_.at(entry)].name;
    return entries[services_.at(entry)].nameStatus;
  }
  KernelReturn GetEntryID(RegistryHandle entry, std::uint64_t& id) override {
    id = entries[services_.at(entry)].id;
    return entries[services_.at(entry)].idStatus;
  }

  // Whether every handle was released, every connection closed, every mapping undone, once.
  bool isBalanced() const {
    return visits_.empty() && services_.empty() && connections_.empty() && mapped.empty() &&
           wrongReleases == 0;
  }

  std::vector<FakeEntry> entries;
  KernelReturn findStatus = 0;
  std::size_t changesAfter = SIZE_MAX;
  std::multiset<std::uint32_t> mapped;  // memory types
  int opens = 0;
  int wrongReleases = 0;

 private:
  struct Visit {
    std::vector<std::size_t> found;
    std::size_t next = 0;
  };

  static bool matches(const FakeEntry& entry, const Dictionary& match) {
    const std::string* className = StringEntry(match, kMatchClassName);
    if (className != nullptr && *className != entry.className) return false;
    const Dictionary* wanted = DictionaryEntry(match, kMatchProperties);
    return wanted == nullptr || std::all_of(wanted->begin(), wanted->end(), [&](const auto& item) {
             const PropertyValue* value = entry.properties.find(item.first);
             return value != nullptr && *value == item.second;
           });
  }
  RegistryHandle retain(std::size_t index) {
    services_[++lastHandle_] = index;
    return lastHandle_;
  }

  RegistryHandle lastHandle_ = 0;
  std::map<RegistryHandle, Visit> visits_;
  std::map<RegistryHandle, std::size_t> services_;
  std::map<RegistryHandle, std::size_t> connections_;
};

}  // namespace quorlet

#endif  // QUORLET_TESTS_FAKES_FAKE_DRIVER_REGISTRY_H_
