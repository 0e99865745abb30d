#include "platform/linux/drives/drive_statistics.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <limits>

#include "platform/linux/drives/nvme_pages.h"
#include "platform/statistics_keys.h"
#include "values/byte_reader.h"
#include "values/byte_writer.h"

namespace quorlet {
namespace {

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
  void add(std::uint16_t key, std::uint64_t value) {
    bytes_.u64((std::uint64_t{1} << 32) | key).u64(value);
  }
  Data take() { return bytes_.take(); }

 private:
  ByteWriter bytes_;
};

void AddHealthPage(std::span<const std::byte> bytes, Export& out) {
  ByteReader page(bytes);
  out.add(StatisticsIdOf("smartCritWarnings"), page.little<std::uint8_t>());
  page.seek(kDataUnitsRead);
  for (const std::uint16_t key : {StatisticsIdOf("hostReads"), StatisticsIdOf("hostWrites")}) {
    // 0 also stands for a figure that the drive does not report.
    const std::uint64_t units = TakeCounter(page);
    if (units != 0) out.add(key, SaturatingProduct(units, kSectorsPerDataUnit));
  }
  out.add(StatisticsIdOf("hostReadXacts"), TakeCounter(page));
  out.add(StatisticsIdOf("hostWriteXacts"), TakeCounter(page));
  (void)TakeCounter(page);  // controller busy time
  out.add(StatisticsIdOf("boots"), TakeCounter(page));
  out.add(StatisticsIdOf("powerOnHours"), TakeCounter(page));
  out.add(StatisticsIdOf("uncleanBoots"), TakeCounter(page));
  out.add(StatisticsIdOf("ueccReads"), TakeCounter(page));
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
  out.add(StatisticsIdOf("exportVersion"), kVersion);
  if (facts.healthPage.size() == kNvmePageBytes) AddHealthPage(facts.healthPage, out);
  const std::pair<std::uint16_t, DriveFigure> media[] = {
      {StatisticsIdOf("nandWrites"), DriveFigure::kMediaBytesWritten},
      {StatisticsIdOf("nandReads"), DriveFigure::kMediaBytesRead}};
  for (const auto& [key, figure] : media) {
    if (const auto bytes = facts.figures[figure]) {
      out.add(key, static_cast<std::uint64_t>(*bytes) / kSectorBytes);
    }
  }
  if (facts.usedBytes) out.add(StatisticsIdOf("validLbas"), *facts.usedBytes / kSectorBytes);
  if (facts.counters) {
    out.add(StatisticsIdOf("numFlushes"), facts.counters->flushes);
    out.add(StatisticsIdOf("cmdq_flush_us"),
            SaturatingProduct(facts.counters->flushMilliseconds, 1000));
    out.add(StatisticsIdOf("numUnmap"), facts.counters->discards);
    out.add(StatisticsIdOf("numUnmapSec"), facts.counters->discardedSectors / (kSectorBytes / 512));
    out.add(StatisticsIdOf("cmdq_unmap_us"),
            SaturatingProduct(facts.counters->discardMilliseconds, 1000));
  }
  return out.take();
}

}  // namespace quorlet
