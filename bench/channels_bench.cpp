// Samples and deltas of 100 to 100,000 channels, beside a plain copy of the same bytes, and the
// memory that a channel takes.
#include <benchmark/benchmark.h>
#include <malloc.h>

#include <cstdlib>
#include <cstring>
#include <vector>

#include "drvreport/drvreport.h"

namespace quorlet::bench {
namespace {

constexpr std::uint64_t kSimple = 0x100000001;
constexpr std::int64_t kChannelsOfADriver = 1000;

void Append(Data& data, std::uint64_t word) {
  for (unsigned shift = 0; shift < 64; shift += 8) {
    data.push_back(static_cast<std::byte>((word >> shift) & 0xFF));
  }
}

// Simple channels of drivers with a thousand each, filed under them, and what the hub delivers.
struct Machine {
  explicit Machine(std::int64_t channelCount) {
    const std::size_t before = mallinfo2().uordblks;
    channels = DrvReportCreateAggregate(kDrvReportByDriver);
    for (std::int64_t i = 0; i < channelCount; ++i) {
      const auto driver = static_cast<std::uint64_t>(i / kChannelsOfADriver + 1);
      const auto id = static_cast<std::uint64_t>(i % kChannelsOfADriver + 1);
      DrvReportAddChannelDescription(channels, driver, "driver" + std::to_string(driver), id,
                                     kSimple, "channel" + std::to_string(id), "Group", {}, nullptr);
    }
    bytesOfChannel =
        static_cast<double>(mallinfo2().uordblks - before) / static_cast<double>(channelCount);
    DrvReportIterate(channels, [this](Dictionary& channel) {
      Append(buffer, static_cast<std::uint64_t>(DrvReportChannelGetDriverID(channel)));
      Append(buffer, static_cast<std::uint64_t>(DrvReportChannelGetChannelID(channel)));
      for (const std::uint64_t word : {kSimple, 0uL, 1uL, 0uL, 0uL, 0uL}) Append(buffer, word);
      return 0;
    });
  }
  Dictionary channels;
  Data buffer;
  double bytesOfChannel = 0;
};

void PerChannel(benchmark::State& state) {
  state.counters["per channel"] = benchmark::Counter(
      static_cast<double>(state.range(0)),
      benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}

void Samples(benchmark::State& state) {
  const Machine machine(state.range(0));
  for (auto _ : state) {
    auto samples = DrvReportCreateSamplesRaw(&machine.channels, machine.buffer);
    if (!samples || DrvReportGetChannelCount(*samples) != state.range(0)) std::abort();
    state.PauseTiming();
    samples.reset();
    state.ResumeTiming();
  }
  PerChannel(state);
  state.counters["bytes a channel"] = machine.bytesOfChannel;
}

void Deltas(benchmark::State& state) {
  const Machine machine(state.range(0));
  const auto before = DrvReportCreateSamplesRaw(&machine.channels, machine.buffer);
  const auto after = DrvReportCreateSamplesRaw(&machine.channels, machine.buffer);
  for (auto _ : state) {
    auto delta = DrvReportCreateSamplesDelta(*before, *after);
    if (!delta) std::abort();
    state.PauseTiming();
    delta.reset();
    state.ResumeTiming();
  }
  PerChannel(state);
}

void RawCopy(benchmark::State& state) {
  const Machine machine(state.range(0));
  Data copy(machine.buffer.size());
  for (auto _ : state) {
    std::memcpy(copy.data(), machine.buffer.data(), copy.size());
    benchmark::DoNotOptimize(copy.data());
    benchmark::ClobberMemory();
  }
  PerChannel(state);
}

BENCHMARK(Samples)->RangeMultiplier(10)->Range(100, 100'000);
BENCHMARK(Deltas)->RangeMultiplier(10)->Range(100, 100'000);
BENCHMARK(RawCopy)->RangeMultiplier(10)->Range(100, 100'000);

}  // namespace
}  // namespace quorlet::bench

BENCHMARK_MAIN();
