#include "drvreport/driver_registry.h"

namespace quorlet {

KernelReturn DriverRegistry::CallDriverStruct(RegistryHandle connection, std::uint32_t method,
                                              std::span<const std::byte> input,
                                              std::span<std::byte> output, std::size_t& written) {
  DriverCall call;
  call.structInput = input;
  call.structOutput = output;
  const KernelReturn status = CallDriverMethod(connection, method, call);
  written = call.bytesWritten;
  return status;
}

KernelReturn DriverRegistry::CallDriverScalar(RegistryHandle connection, std::uint32_t method,
                                              std::span<const std::uint64_t> input,
                                              std::span<std::uint64_t> output,
                                              std::size_t& written) {
  DriverCall call;
  call.scalarInput = input;
  call.scalarOutput = output;
  const KernelReturn status = CallDriverMethod(connection, method, call);
  written = call.scalarsWritten;
  return status;
}

}  // namespace quorlet
