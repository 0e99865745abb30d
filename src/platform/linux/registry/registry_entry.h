// What the Linux driver registry is put together from: sources of entries, each with its drivers.
#ifndef QUORLET_PLATFORM_LINUX_REGISTRY_REGISTRY_ENTRY_H_
#define QUORLET_PLATFORM_LINUX_REGISTRY_REGISTRY_ENTRY_H_

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "drvreport/driver_registry.h"
#include "drvreport/property_value.h"

namespace quorlet {

// Serves the connections to one entry. A driver lives as long as the registry holds its entry or a
// connection to it.
class EntryDriver {
 public:
  virtual ~EntryDriver() = default;
  virtual KernelReturn open(std::uint32_t type) = 0;
  virtual KernelReturn close() = 0;
  // As DriverRegistry::CallDriverMethod.
  virtual KernelReturn call(std::uint32_t method, DriverCall& call) = 0;
  // Whether call() knows the method.
  virtual bool hasMethod(std::uint32_t method) const {
    (void)method;
    return false;
  }
  // As DriverRegistry::MapDriverMemory and UnmapDriverMemory.
  virtual KernelReturn map(std::uint32_t memoryType, std::span<const std::byte>& memory) {
    (void)memoryType;
    (void)memory;
    return kKernelUnsupported;
  }
  virtual void unmap(std::uint32_t memoryType) { (void)memoryType; }
};

struct RegistryEntry {
  std::uint64_t id = 0;
  std::string name;
  std::string className;
  std::optional<std::uint64_t> parentID;
  Dictionary properties;
  std::shared_ptr<EntryDriver> driver;  // none: connections are refused
  // The entry is left out when an earlier source has one of any of these classes.
  std::vector<std::string> standsInFor;
};

// Publishes entries, and what the channels that their legends describe report.
class EntrySource {
 public:
  virtual ~EntrySource() = default;

  // The entries that are there now, in any order. Entry IDs of one source are distinct and stay
  // the same for the same device.
  virtual std::vector<RegistryEntry> entries() = 0;

  // Changes whenever entries come or go. For sources that are asked for entries on every look-up;
  // the others never seem to change.
  virtual std::string entrySet() { return {}; }

  // Reads anew what the channels report. The hub calls it once for each update, before it asks for
  // elements.
  virtual void refreshElements() {}

  // The channel's run of raw element records, n × 64 bytes, as of the last refresh; empty when the
  // channel is not known or could not be read. Valid until the next refresh.
  virtual std::span<const std::byte> elements(std::uint64_t driverID, std::uint64_t channelID) {
    (void)driverID;
    (void)channelID;
    return {};
  }
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_REGISTRY_REGISTRY_ENTRY_H_
