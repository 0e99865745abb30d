// What reading and recording cost in the counter store, beside the same arithmetic on memory.
#include <benchmark/benchmark.h>

#include <cstdlib>
#include <filesystem>
#include <system_error>

#include "platform/linux/linux_platform.h"
#include "sample_store.h"

namespace quorlet::bench {
namespace {

constexpr std::int32_t kDay = 20000;
constexpr std::int64_t kValues = std::int64_t{kDistributions} * kValuesPerDistribution;

// A filled store in a root of its own, made once.
class SampleStore {
 public:
  static SampleStore& instance() {
    static SampleStore store;
    return store;
  }
  CounterStore& store() { return platform_.services().counterStore; }

 private:
  SampleStore() : directory_(makeDirectory()), platform_(Root(directory_), Access::kReadWrite) {
    if (!FillStore(store(), kDay)) std::abort();
  }
  ~SampleStore() {
    std::error_code ignored;
    std::filesystem::remove_all(directory_, ignored);
  }
  static std::string makeDirectory() {
    std::string pattern = (std::filesystem::temp_directory_path() / "quorlet-bench-XXXXXX");
    if (mkdtemp(pattern.data()) == nullptr) std::abort();
    return pattern;
  }

  std::string directory_;
  LinuxPlatform platform_;
};

// One step of a running mean and sum of squared deviations.
struct Welford {
  void add(double value) {
    ++count;
    const double delta = value - mean;
    mean += delta / static_cast<double>(count);
    deviations += delta * (value - mean);
  }
  std::int64_t count = 0;
  double mean = 0;
  double deviations = 0;
};

void ReadScalars(benchmark::State& state) {
  const auto history = SampleStore::instance().store().initWithDefaultPath();
  for (auto _ : state) {
    std::int64_t rows = 0;
    history->scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
        "", kDay - 1, kDay, [&](auto, auto, auto, bool&) { ++rows; });
    if (rows != kScalars) state.SkipWithError("rows are missing");
  }
  state.SetItemsProcessed(state.iterations() * kScalars);
}
BENCHMARK(ReadScalars)->Unit(benchmark::kMillisecond);

void ReadDistributions(benchmark::State& state) {
  const auto history = SampleStore::instance().store().initWithDefaultPath();
  for (auto _ : state) {
    std::int64_t values = 0;
    history->distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
        "", kDay - 1, kDay, [&](auto, auto, TLHistoryDistributionEnumerator& enumerator, bool&) {
          Welford welford;
          double value = 0;
          std::int32_t second = 0;
          while (enumerator.getNextValueSecondsInDayOffset(value, second)) welford.add(value);
          benchmark::DoNotOptimize(welford);
          values += welford.count;
        });
    if (values != kValues) state.SkipWithError("values missing");
  }
  state.SetItemsProcessed(state.iterations() * kValues);
}
BENCHMARK(ReadDistributions)->Unit(benchmark::kMillisecond);

// The same steps on one distribution's values in memory: what no store can go below.
void MemoryOnly(benchmark::State& state) {
  const std::vector<double> values = SampleValues(0, kDay).values;
  for (auto _ : state) {
    for (int i = 0; i < kDistributions; ++i) {
      Welford welford;
      for (const double value : values) welford.add(value);
      benchmark::DoNotOptimize(welford);
    }
  }
  state.SetItemsProcessed(state.iterations() * kValues);
}
BENCHMARK(MemoryOnly)->Unit(benchmark::kMillisecond);

// So many values in one committed transaction: of one key, or one each of many keys.
void Record(benchmark::State& state) {
  CounterStore& store = SampleStore::instance().store();
  StoreChanges changes;
  for (std::int64_t key = 0; key < state.range(1); ++key) {
    RecordedValues& recorded = changes.values.emplace_back(SampleValues(0, kDay + 1));
    recorded.key = "recorded" + std::to_string(key);
    recorded.values.resize(static_cast<std::size_t>(state.range(0)));
    recorded.runs = {{0, static_cast<std::uint32_t>(state.range(0))}};
  }
  for (auto _ : state) {
    if (!store.write(changes)) state.SkipWithError("refused");
  }
  state.SetItemsProcessed(state.iterations() * state.range(0) * state.range(1));
}
BENCHMARK(Record)
    ->Args({1, 1})
    ->Args({kValuesPerDistribution, 1})
    ->Args({1, 1000})
    ->Unit(benchmark::kMicrosecond);

}  // namespace
}  // namespace quorlet::bench

BENCHMARK_MAIN();
