// The store that is measured: a day of a busy device.
#ifndef QUORLET_BENCH_SAMPLE_STORE_H_
#define QUORLET_BENCH_SAMPLE_STORE_H_

#include <cstdint>
#include <string>
#include <vector>

#include "platform/counter_store.h"

namespace quorlet::bench {

inline constexpr int kSubsystems = 40;
inline constexpr int kScalars = 10'000;
inline constexpr int kDistributions = 500;
inline constexpr int kValuesPerDistribution = 4'000;

// What the keys of subsystem `number` (modulo kSubsystems) begin with.
std::string SubsystemPrefix(int number);
std::string ScalarKey(int number);
std::string DistributionKey(int number);

// The values of a distribution: durations in ms, the same ones in every run.
RecordedValues SampleValues(int distribution, std::int32_t day);

// Records all of it for `day`. False when the store refused.
[[nodiscard]] bool FillStore(CounterStore& store, std::int32_t day);

}  // namespace quorlet::bench

#endif  // QUORLET_BENCH_SAMPLE_STORE_H_
