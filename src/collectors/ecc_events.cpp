// An event as the kernel hands it out, 72 bytes, little-endian:
//   0  u8      event identifier
//   1  u8      number of valid registers
//   2  6 bytes not read
//   8  8 x u64 registers
#include "collectors/ecc_events.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "values/byte_reader.h"

namespace quorlet {
namespace {

constexpr char kParameter[] = "kern.next_ecc_event";
constexpr std::size_t kRecordSize = 72;
constexpr std::size_t kRegisters = 8;
constexpr std::size_t kEventsPerPass = 10;
constexpr std::int32_t kStructuredLogType = 172;

using Record = std::array<std::byte, kRecordSize>;

// A count beyond the eight registers is reported as it is; the registers end with the record.
Dictionary EntryFromRecord(const Record& record) {
  ByteReader reader(record);
  const auto id = reader.little<std::uint8_t>();
  const auto count = reader.little<std::uint8_t>();
  reader.skip(6);
  Dictionary entry{{"id", Int32(id)}, {"count", Int32(count)}};
  for (std::size_t i = 0; i < std::min<std::size_t>(count, kRegisters); ++i) {
    entry["reg" + std::to_string(i)] =
        Int64(static_cast<std::int64_t>(reader.little<std::uint64_t>()));
  }
  return entry;
}

}  // namespace

void logECCEvents(KernelParameters& kernel, CrashSupport& support, SystemLog& log) {
  // Events that an earlier pass in this process could not log are still there.
  kernel.returnTaken(kParameter);
  std::vector<Dictionary> entries;
  std::size_t length = kRecordSize;
  while (entries.size() < kEventsPerPass) {
    // Zero for each event, so that a short one does not show the registers of the one before.
    Record record{};
    const auto buffer = std::span(record).first(std::min(length, kRecordSize));
    const int error = kernel.sysctlbyname(kParameter, buffer, length);
    if (error == ENOENT || error == EBUSY) break;
    if (error != 0) {
      log.log("Unexpected errno (%d) reading ECC events from kernel", error);
      break;
    }
    entries.push_back(EntryFromRecord(record));
  }
  if (entries.empty()) return;
  // Removed once they are durable: a kill between the two logs them twice, but loses none.
  if (support.logEntries(kStructuredLogType, entries) && support.syncStructuredData()) {
    kernel.removeTaken(kParameter);
  }
}

}  // namespace quorlet
