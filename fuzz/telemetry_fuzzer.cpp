// Any list of the storage driver and any task snapshot is read without harm, and what is logged of
// it is bounded by its size.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <span>
#include <string>

#include "fakes/fake_platform.h"
#include "storage/structured_log.h"
#include "storage/telemetry.h"
#include "storage/vm_freezer.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

// The first eight bytes are the number of channels, the next two say which device it is.
void ReadTelemetry(FakePlatform& platform, std::span<const std::byte> bytes) {
  ByteReader reader(bytes);
  const auto channels = static_cast<std::int64_t>(reader.little<std::uint64_t>());
  const std::uint8_t chip = reader.little<std::uint8_t>();
  const std::size_t digits = reader.little<std::uint8_t>();
  const auto text = reader.take(std::min(digits, reader.remaining()));
  const Dictionary characteristics{
      {"chip-id", chip % 3 == 0   ? "K3A"
                  : chip % 3 == 1 ? "K4A"
                                  : ""},
      {"manufacturer-id", std::string(reinterpret_cast<const char*>(text.data()), text.size())},
      {"num-bus", Int64(channels)}};
  const auto list = reader.take(reader.remaining());
  LogTelemetryList(platform.crashSupport, platform.standardError, list, characteristics);
  if (platform.crashSupport.entries.size() > list.size() / 4128) std::abort();
}

void ReadOne(std::uint8_t which, std::span<const std::byte> bytes) {
  FakePlatform platform;
  switch (which % 4) {
    case 0:
      ReadTelemetry(platform, bytes);
      break;
    case 1: {
      StorageLogState state;
      state.gNeedValidityList = true;
      const bool written = LogValidityList(platform.services, state, bytes);
      if (written != (platform.diagnostics.logs.size() == 1)) std::abort();
      break;
    }
    case 2:
      LogDefectsList(platform.services, bytes, bytes.size());
      if (platform.crashSupport.entries.size() > 1 + bytes.size() / 28) std::abort();
      break;
    case 3:
      platform.taskSnapshot.buffer = Data(bytes.begin(), bytes.end());
      if (CopyVMFreezerNANDInfo(platform.taskSnapshot, platform.standardError).empty())
        std::abort();
      break;
  }
}

}  // namespace
}  // namespace quorlet

// The first byte says which reader gets the rest.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size != 0) quorlet::ReadOne(data[0], std::as_bytes(std::span(data, size)).subspan(1));
  return 0;
}
