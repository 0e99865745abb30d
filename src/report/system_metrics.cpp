// The scalars that the report measures itself, rather than reads from the counter store.
#include <array>
#include <cstddef>
#include <limits>
#include <span>

#include "report/report.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

constexpr std::string_view kDatabaseSize = "nuvex.diagwell.tallyd.database.size";
constexpr std::string_view kCorruptions = "nuvex.diagwell.tallyd.database.corruptions";
constexpr std::string_view kCpuUptime = "nuvex.usage.cur_boot_session_cpu_uptime";
constexpr char kDatabaseFile[] = "%s/Library/TallyLedger/TLDataStore.sqlitedb";
constexpr std::uint64_t kMebibyte = 1048576;
constexpr char kAggregatedDomain[] = "nuvex.aggregated";
constexpr char kCorruptionCount[] = "DatabaseCorruptionCount";
constexpr char kReaderName[] = "DGWPreferencesGetIntegerValue";
constexpr char kWriterName[] = "DGWPreferencesSetValue";

// A kernel parameter that is reported: its value is the first `width` bytes of a record that is
// `recordSize` bytes long.
struct KernelMetric {
  std::string_view key;
  std::string_view parameter;
  std::size_t recordSize;
  std::size_t width;
};

constexpr auto kKernelMetrics = std::to_array<KernelMetric>({
    // clang-format off
    {"nuvex.kernel.memorystatus_freeze_count", "kern.memorystatus_freeze_count", 4, 4},
    {"nuvex.kernel.memorystatus_freeze_pageouts", "kern.memorystatus_freeze_pageouts", 8, 8},
    {"nuvex.kernel.memorystatus_freeze_budget_pages_remaining", "kern.memorystatus_freeze_budget_pages_remaining", 8, 8},
    {"nuvex.kernel.memorystatus_thaw_count", "kern.memorystatus_thaw_count", 4, 4},
    {"nuvex.kernel.swapusage", "vm.swapusage", 32, 8},
    // clang-format on
});

std::int64_t ReadKernelMetric(KernelParameters& parameters, const KernelMetric& metric) {
  std::array<std::byte, 32> record{};
  std::size_t length = metric.recordSize;
  const auto buffer = std::span(record).first(metric.recordSize);
  const int error = parameters.sysctlbyname(metric.parameter, buffer, length);
  if (error != 0 || length < metric.width) return -1;
  ByteReader reader(buffer);
  return metric.width == 4 ? static_cast<std::int64_t>(reader.little<std::uint32_t>())
                           : static_cast<std::int64_t>(reader.little<std::uint64_t>());
}

void BindPreferenceFunctions(SupportLibrary& library, SystemLog& log) {
  if (!library.load()) {
    log.error("Failed to dynamically load the FaultScribeSupport framework");
    return;
  }
  if (library.integerReader == nullptr) {
    library.integerReader =
        reinterpret_cast<IntegerPreferenceReader>(library.findFunction(kReaderName));
  }
  if (library.integerReader == nullptr) {
    log.error("Failed to dyanmically link DGWPreferencesGetIntegerValue");
  }
  if (library.integerWriter == nullptr) {
    library.integerWriter =
        reinterpret_cast<IntegerPreferenceWriter>(library.findFunction(kWriterName));
  }
  if (library.integerWriter == nullptr) {
    log.error("Failed to dynamically link DGWPreferencesSetValue");
  }
}

// The corruptions that no log has told yet; what is told is taken off the count.
std::int64_t TakeCorruptionCount(Platform& platform, UsedUp& usedUp) {
  SupportLibrary& library = platform.supportLibrary;
  if (library.integerReader == nullptr || library.integerWriter == nullptr) {
    BindPreferenceFunctions(library, platform.log);
  }
  if (library.integerReader == nullptr || library.integerWriter == nullptr) {
    return usedUp.corruptions;
  }
  const std::int64_t count =
      library.integerReader(platform.preferences, kCorruptionCount, kAggregatedDomain);
  library.integerWriter(platform.preferences, kCorruptionCount, 0, kAggregatedDomain);
  usedUp.corruptionsTaken = count;
  const std::int64_t most = std::numeric_limits<std::int64_t>::max();
  if (__builtin_add_overflow(usedUp.corruptions, count, &usedUp.corruptions)) {
    usedUp.corruptions = most;
  }
  return usedUp.corruptions;
}

std::int64_t DatabaseSize(Platform& platform) {
  const auto home = platform.queries.dataHomePath();
  if (!home) return -1;
  const auto status = platform.environment.stat(FormatText(kDatabaseFile, *home));
  return status ? static_cast<std::int64_t>(status->size / kMebibyte) : -1;
}

// Whole minutes since boot.
std::int64_t CpuUptime(Platform& platform) {
  const std::uint64_t ticks = platform.environment.TickClockNow();
  std::uint32_t numerator = 0;
  std::uint32_t denominator = 0;
  if (platform.environment.TickTimebase(numerator, denominator) != 0 || denominator == 0) {
    platform.log.error("Could not retrieve the tick timebase");
    return -1;
  }
  const double minutes = static_cast<double>(numerator) * 1e-9 / static_cast<double>(denominator) /
                         60 * static_cast<double>(ticks);
  return minutes < 0x1p63 ? static_cast<std::int64_t>(minutes)
                          : std::numeric_limits<std::int64_t>::max();
}

}  // namespace

void TLReport::reportDatabaseSize() {
  addScalarForKeyByExecutingBlock(kDatabaseSize, [this] { return DatabaseSize(_platform); });
  addScalarForKeyByExecutingBlock(kCorruptions,
                                  [this] { return TakeCorruptionCount(_platform, _usedUp); });
}

void TLReport::reportCPUUptime() {
  addScalarForKeyByExecutingBlock(kCpuUptime, [this] { return CpuUptime(_platform); });
}

void TLReport::reportVMStats() {
  for (const KernelMetric& metric : kKernelMetrics) {
    addScalarForKeyByExecutingBlock(
        metric.key, [&] { return ReadKernelMetric(_platform.kernelParameters, metric); });
  }
}

}  // namespace quorlet
