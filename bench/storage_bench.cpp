// Parsing a full statistics export, every key with as many values as are kept of it, beside a plain
// pass over the same words; and building the NAND information dictionary of it.
#include <benchmark/benchmark.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "fakes/fake_platform.h"
#include "storage/nand_info.h"
#include "storage/statistics_parser.h"

namespace quorlet::bench {
namespace {

std::vector<std::uint64_t> FullExport() {
  std::vector<std::uint64_t> words;
  std::uint64_t random = 1;
  for (const StatisticsKey& key : kStatisticsKeys) {
    words.push_back(key.id | std::uint64_t{key.cap} << 32);
    for (int i = 0; i < key.cap; ++i) {
      random = random * 6364136223846793005 + 1442695040888963407;
      words.push_back(random >> (random >> 58));
    }
  }
  return words;
}

// Time for each of `values`.
void ReportValues(benchmark::State& state, std::size_t values) {
  state.counters["values"] = static_cast<double>(values);
  state.counters["time/value"] = benchmark::Counter(
      static_cast<double>(values),
      benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}

void ParseFullExport(benchmark::State& state) {
  const auto words = FullExport();
  std::size_t values = 0;
  for (auto _ : state) {
    FSPParseContext context;
    if (!FSPParseBufferToCxt(context, std::as_bytes(std::span(words)))) std::abort();
    benchmark::DoNotOptimize(context.pairs.data());
    values = context.pairs.size();
  }
  ReportValues(state, values);
}
BENCHMARK(ParseFullExport);

// The peer: nothing but reading every word and writing it somewhere.
void PlainPass(benchmark::State& state) {
  const auto words = FullExport();
  std::size_t values = 0;
  for (auto _ : state) {
    std::vector<std::uint64_t> copy;
    copy.reserve(words.size());
    for (const std::uint64_t& word : words) {
      std::uint64_t value = 0;
      std::memcpy(&value, &word, sizeof value);
      benchmark::DoNotOptimize(value);
      copy.push_back(value);
    }
    benchmark::DoNotOptimize(copy.data());
    values = copy.size();
  }
  ReportValues(state, values);
}
BENCHMARK(PlainPass);

void BuildDictionary(benchmark::State& state) {
  const auto words = FullExport();
  FakePlatform platform;
  FSPParseContext context;
  if (!FSPParseBufferToCxt(context, std::as_bytes(std::span(words)))) std::abort();
  context.exportVersion = 0x20002;
  std::size_t entries = 0;
  for (auto _ : state) {
    const auto dictionary = BuildNANDInfoDictionary(platform.services, context, false);
    entries = dictionary->size();
  }
  ReportValues(state, entries);
}
BENCHMARK(BuildDictionary);

// The peer: a dictionary of its own kind with the same keys.
void FillDictionary(benchmark::State& state) {
  const auto words = FullExport();
  FakePlatform platform;
  FSPParseContext context;
  if (!FSPParseBufferToCxt(context, std::as_bytes(std::span(words)))) std::abort();
  context.exportVersion = 0x20002;
  const auto pattern = BuildNANDInfoDictionary(platform.services, context, false);
  for (auto _ : state) {
    Dictionary dictionary;
    for (const auto& [key, value] : *pattern) dictionary[key] = value;
    benchmark::DoNotOptimize(dictionary.identity());
  }
  ReportValues(state, pattern->size());
}
BENCHMARK(FillDictionary);

}  // namespace
}  // namespace quorlet::bench

BENCHMARK_MAIN();
