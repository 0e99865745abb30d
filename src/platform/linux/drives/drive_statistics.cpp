#include "platform/linux/drives/drive_statistics.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <limits>

#include "platform/linux/drives/nvme_pages.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

enum Key : std::uint32_t {
  kHostWriteXacts = 2,
  kHostReadXacts = 3,
  kHostWrites = 4,
  kHostReads = 7,
  kValidLbas = 8,
  kBoots = 10,
  kUncleanBoots = 11,
  kNandWrites = 18,
  kNandReads = 19,
  kPowerOnHours = 34,
  kSmartCritWarnings = 36,
  kNumFlushes = 37,
  kNumUnmap = 38,
  kNumUnmapSec = 39,
  kExportVersion = 53,
  kCmdqFlushMicroseconds = 59,
  kCmdqUnmapMicroseconds = 60,
  kUeccReads = 172,
};

// The lowest version whose dictionary is complete.
constexpr std::uint64_t kVersion = 0x20002;
constexpr std::uint64_t kSectorBytes = 4096;
// A data unit is a thousand times 512 bytes.
constexpr std::uint64_t kSectorsPerDataUnit = 1000 * 512 / kSectorBytes;
static_assert(kSectorsPerDataUnit * kSectorBytes == 1000 * 512);

// Where the health page has its counters of 16 bytes.
constexpr std::size_t kDataUnitsRead = 32;

// What reads the figures takes them for signed numbers.
constexpr std::uint64_t kLargest = std::numeric_limits<std::int64_t>::max();

std::uint64_t SaturatingProduct(std::uint64_t value, std::uint64_t factor) {
  std::uint64_t product = 0;
  return __builtin_mul_overflow(value, factor, &product) ? kLargest : std::min(product, kLargest);
}

// A counter of 16 bytes, saturated.
std::uint64_t TakeCounter(ByteReader& page) {
  const auto low = page.little<std::uint64_t>();
  const auto high = page.little<std::uint64_t>();
  return high == 0 ? std::min(low, kLargest) : kLargest;
}

class Export {
 public:
  void add(Key key, std::uint64_t value) {
    put((std::uint64_t{1} << 32) | key);
    put(value);
  }
  Data take() { return std::move(bytes_); }

 private:
  void put(std::uint64_t word) {
    for (int i = 0; i < 8; ++i) bytes_.push_back(static_cast<std::byte>((word >> (8 * i)) & 0xFF));
  }
  Data bytes_;
};

void AddHealthPage(std::span<const std::byte> bytes, Export& out) {
  ByteReader page(bytes);
  out.add(kSmartCritWarnings, page.little<std::uint8_t>());
  page.seek(kDataUnitsRead);
  for (const Key key : {kHostReads, kHostWrites}) {
    // 0 also stands for a figure that the drive does not report.
    const std::uint64_t units = TakeCounter(page);
    if (units != 0) out.add(key, SaturatingProduct(units, kSectorsPerDataUnit));
  }
  out.add(kHostReadXacts, TakeCounter(page));
  out.add(kHostWriteXacts, TakeCounter(page));
  (void)TakeCounter(page);  // controller busy time
  out.add(kBoots, TakeCounter(page));
  out.add(kPowerOnHours, TakeCounter(page));
  out.add(kUncleanBoots, TakeCounter(page));
  out.add(kUeccReads, TakeCounter(page));
}

}  // namespace

bool AddBlockCounters(std::string_view line, BlockCounters& counters) {
  // Reads, merged, sectors, ms; the same of writes; in flight, busy ms, weighted ms; the same four
  // of discards; flushes, ms.
  std::array<std::uint64_t, 17> fields{};
  const char* at = line.data();
  const char* const end = at + line.size();
  for (std::uint64_t& field : fields) {
    while (at != end && *at == ' ') ++at;
    const auto [stopped, error] = std::from_chars(at, end, field);
    if (error != std::errc() || (stopped != end && *stopped != ' ' && *stopped != '\n')) {
      return false;
    }
    at = stopped;
  }
  counters.discards += fields[11];
  counters.discardedSectors += fields[13];
  counters.discardMilliseconds += fields[14];
  counters.flushes += fields[15];
  counters.flushMilliseconds += fields[16];
  return true;
}

Data EncodeDriveStatistics(const DriveFacts& facts) {
  Export out;
  out.add(kExportVersion, kVersion);
  if (facts.healthPage.size() == kNvmePageBytes) AddHealthPage(facts.healthPage, out);
  const std::pair<Key, DriveFigure> media[] = {{kNandWrites, DriveFigure::kMediaBytesWritten},
                                               {kNandReads, DriveFigure::kMediaBytesRead}};
  for (const auto& [key, figure] : media) {
    if (const auto bytes = facts.figures[figure]) {
      out.add(key, static_cast<std::uint64_t>(*bytes) / kSectorBytes);
    }
  }
  if (facts.usedBytes) out.add(kValidLbas, *facts.usedBytes / kSectorBytes);
  if (facts.counters) {
    out.add(kNumFlushes, facts.counters->flushes);
    out.add(kCmdqFlushMicroseconds, SaturatingProduct(facts.counters->flushMilliseconds, 1000));
    out.add(kNumUnmap, facts.counters->discards);
    out.add(kNumUnmapSec, facts.counters->discardedSectors / (kSectorBytes / 512));
    out.add(kCmdqUnmapMicroseconds, SaturatingProduct(facts.counters->discardMilliseconds, 1000));
  }
  return out.take();
}

}  // namespace quorlet
