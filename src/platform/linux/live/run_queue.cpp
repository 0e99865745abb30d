// How long tasks wait for a CPU: /proc/schedstat, one histogram channel, in nanoseconds.
//
// The kernel counts time slices and the time that tasks waited for them, for each CPU:
//   cpu0 0 0 0 0 0 0 <time run> <time waited> <time slices>
// It does not say how single waits were spread. Each reading puts the slices that a CPU has given
// since the last one (the first time: since it was started) into the bucket of their mean wait. So
// hits and sums are exact, minimum and maximum are those of the means.
#include <algorithm>
#include <array>

#include "platform/linux/base/kernel_text.h"
#include "platform/linux/live/publishers.h"

namespace quorlet {
namespace {

constexpr char kStatistics[] = "/proc/schedstat";
constexpr std::size_t kMaxStatisticsBytes = std::size_t{8} << 20;
constexpr std::uint64_t kChannel = PackedID("runqwait");
constexpr std::uint64_t kOldestVersion = 15;
// Up to 4, 16, 64, ... 4^16 ns, which is 4.3 s; what is longer is in the last one too.
constexpr std::uint32_t kBase = 4;
constexpr std::size_t kBuckets = 16;

enum BucketValue { kHits, kMinimum, kMaximum, kSum };

// One segment of bounds: base, exponential, unused, number of buckets, 32 bits each.
Data BucketConfig() {
  Data config;
  for (const std::uint32_t word : {kBase, 1u, 0u, static_cast<std::uint32_t>(kBuckets)}) {
    for (unsigned shift = 0; shift < 32; shift += 8) {
      config.push_back(static_cast<std::byte>((word >> shift) & 0xFF));
    }
  }
  return config;
}

std::size_t BucketOf(std::uint64_t wait) {
  std::uint64_t bound = kBase;
  std::size_t bucket = 0;
  while (wait > bound && bucket + 1 < kBuckets) {
    bound *= kBase;
    ++bucket;
  }
  return bucket;
}

struct Waits {
  std::uint64_t slices = 0;
  std::uint64_t nanoseconds = 0;
};

// Nothing when the file is of another version, or a CPU's line is odd.
std::optional<std::map<std::uint64_t, Waits>> ParseStatistics(std::string_view text) {
  const auto version = NumberBehind("version ", TakeLine(text));
  if (!version || *version < kOldestVersion) return std::nullopt;
  std::map<std::uint64_t, Waits> waits;
  while (!text.empty()) {
    const std::string_view line = TakeLine(text);
    if (!line.starts_with("cpu")) continue;
    const auto words = Words(line);
    const auto cpu = NumberBehind("cpu", words.front());
    if (!cpu || words.size() != 10) return std::nullopt;
    const auto nanoseconds = ParseCounter(words[8]);
    const auto slices = ParseCounter(words[9]);
    if (!nanoseconds || !slices) return std::nullopt;
    waits[*cpu] = {*slices, *nanoseconds};
  }
  return waits;
}

class RunQueuePublisher : public LivePublisher {
 public:
  explicit RunQueuePublisher(const LoggingRoot& root) : root_(root) {}

  LiveLegend describe() override {
    LiveLegend legend;
    if (readStatistics()) {
      legend.add({.group = "Scheduler",
                  .subgroup = "",
                  .unit = kNanoseconds,
                  .bucketConfig = BucketConfig()},
                 {.id = kChannel,
                  .name = "run queue wait",
                  .format = ReportFormat::kHistogram,
                  .elements = kBuckets});
    }
    return legend;
  }

  void read(LiveRuns& runs) override {
    const auto waits = readStatistics();
    if (!waits) return;
    for (const auto& [cpu, now] : *waits) {
      Waits& last = last_[cpu];
      if (now.slices > last.slices && now.nanoseconds >= last.nanoseconds) {
        count(now.slices - last.slices, now.nanoseconds - last.nanoseconds);
      }
      last = now;  // counters that have fallen start again from here
    }
    runs.add(kChannel, buckets_);
  }

 private:
  std::optional<std::map<std::uint64_t, Waits>> readStatistics() const {
    const auto text = ReadKernelText(root_.kernelPath(kStatistics), kMaxStatisticsBytes);
    return text ? ParseStatistics(*text) : std::nullopt;
  }

  void count(std::uint64_t slices, std::uint64_t nanoseconds) {
    const std::uint64_t mean = nanoseconds / slices;
    const auto wait = static_cast<std::int64_t>(mean);
    LiveValues& bucket = buckets_[BucketOf(mean)];
    bucket[kMinimum] = bucket[kHits] == 0 ? wait : std::min(bucket[kMinimum], wait);
    bucket[kMaximum] = std::max(bucket[kMaximum], wait);
    addUpTo(bucket[kHits], slices);
    addUpTo(bucket[kSum], nanoseconds);
  }

  static void addUpTo(std::int64_t& total, std::uint64_t growth) {
    const auto room = static_cast<std::uint64_t>(INT64_MAX - total);
    total += static_cast<std::int64_t>(std::min(growth, room));
  }

  const LoggingRoot root_;
  std::map<std::uint64_t, Waits> last_;
  std::array<LiveValues, kBuckets> buckets_{};
};

}  // namespace

std::unique_ptr<LivePublisher> MakeRunQueuePublisher(const LoggingRoot& root) {
  return std::make_unique<RunQueuePublisher>(root);
}

}  // namespace quorlet
