// The kernel's driver registry: entries with properties, and connections to their drivers.
//
// Handles of services, iterators and connections are opaque and not 0; 0 means none. Services and
// iterators are released with ReleaseHandle, connections closed with CloseDriverConnection, each
// once. Operations return the kernel's 32-bit return codes; 0 is success. A registry must not be
// used by two threads at once.
#ifndef DRVREPORT_DRIVER_REGISTRY_H_
#define DRVREPORT_DRIVER_REGISTRY_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "drvreport/property_value.h"

namespace quorlet {

// A return code of the kernel.
using KernelReturn = std::uint32_t;
inline constexpr KernelReturn kKernelSuccess = 0;
inline constexpr KernelReturn kKernelError = 0xE00002BC;     // general failure
inline constexpr KernelReturn kKernelNoMemory = 0xE00002BD;  // an object could not be made
inline constexpr KernelReturn kKernelBadArgument = 0xE00002C2;
inline constexpr KernelReturn kKernelUnsupported = 0xE00002C7;  // the driver has no such method
inline constexpr KernelReturn kKernelNotFound = 0xE00002F0;

using RegistryHandle = std::uint32_t;

// A boolean property of a storage driver's entry: a figure that its statistics export lacks is not
// known, rather than 0.
inline constexpr std::string_view kTellsOnlyWhatItHas = "QuorletTellsOnlyWhatItHas";

// Keys of a match dictionary; an entry must satisfy all that are there.
inline constexpr std::string_view kMatchClassName = "ClassName";  // string: the entry's class
inline constexpr std::string_view kMatchProperties =
    "PropertyMatch";  // dictionary: properties that the entry holds with equal values

// Input and output of CallDriverMethod; the counts of what the driver wrote are set by the call.
struct DriverCall {
  std::span<const std::uint64_t> scalarInput;
  std::span<const std::byte> structInput;
  std::span<std::uint64_t> scalarOutput;
  std::span<std::byte> structOutput;
  std::size_t scalarsWritten = 0;
  std::size_t bytesWritten = 0;
};

class DriverRegistry {
 public:
  virtual ~DriverRegistry() = default;

  // The first service of the class (in order of entry ID), or 0. The caller releases it.
  virtual RegistryHandle FindServiceByClass(std::string_view className) = 0;

  // Starts a visit of the services that match. The caller releases `iterator` and each service.
  virtual KernelReturn FindServicesMatching(const Dictionary& match, RegistryHandle& iterator) = 0;
  // The next service, or 0.
  virtual RegistryHandle IteratorNext(RegistryHandle iterator) = 0;
  // False when the registry has changed since the visit started.
  virtual bool IteratorIsValid(RegistryHandle iterator) = 0;

  virtual void ReleaseHandle(RegistryHandle handle) = 0;
  // 0 for a handle that is not alive.
  virtual std::uint32_t HandleRetainCount(RegistryHandle handle) = 0;

  virtual KernelReturn OpenDriverConnection(RegistryHandle service, std::uint32_t type,
                                            RegistryHandle& connection) = 0;
  virtual KernelReturn CloseDriverConnection(RegistryHandle connection) = 0;

  // Calls a driver method. What is written never exceeds the output spans.
  virtual KernelReturn CallDriverMethod(RegistryHandle connection, std::uint32_t method,
                                        DriverCall& call) = 0;

  // Struct input and output only; `written` is the number of bytes that the driver wrote.
  KernelReturn CallDriverStruct(RegistryHandle connection, std::uint32_t method,
                                std::span<const std::byte> input, std::span<std::byte> output,
                                std::size_t& written);
  // Scalar input and output only; `written` is the number of scalars that the driver wrote.
  KernelReturn CallDriverScalar(RegistryHandle connection, std::uint32_t method,
                                std::span<const std::uint64_t> input,
                                std::span<std::uint64_t> output, std::size_t& written);

  // Maps memory of the driver into the process, read-only; valid until it is unmapped. The driver
  // changes it during calls on the connection only.
  virtual KernelReturn MapDriverMemory(RegistryHandle connection, std::uint32_t memoryType,
                                       std::span<const std::byte>& memory) = 0;
  virtual void UnmapDriverMemory(RegistryHandle connection, std::uint32_t memoryType,
                                 std::span<const std::byte> memory) = 0;

  // A property of the entry, or nothing; the caller owns the copy.
  virtual std::optional<PropertyValue> CopyEntryProperty(RegistryHandle entry,
                                                         std::string_view key) = 0;
  // The same, searched in the entry's parents too.
  virtual std::optional<PropertyValue> SearchEntryProperty(RegistryHandle entry,
                                                           std::string_view key) = 0;
  // At most 127 bytes.
  virtual KernelReturn GetEntryName(RegistryHandle entry, std::string& name) = 0;
  virtual KernelReturn GetEntryID(RegistryHandle entry, std::uint64_t& id) = 0;
};

}  // namespace quorlet

#endif  // DRVREPORT_DRIVER_REGISTRY_H_
