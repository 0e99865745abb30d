#include "sample_store.h"

#include <cmath>
#include <random>

namespace quorlet::bench {

std::string SubsystemPrefix(int number) {
  return "nuvex.bench.subsystem" + std::to_string(number % kSubsystems) + ".";
}

std::string ScalarKey(int number) {
  return SubsystemPrefix(number) + "count" + std::to_string(number);
}

std::string DistributionKey(int number) {
  return SubsystemPrefix(number) + "time" + std::to_string(number);
}

RecordedValues SampleValues(int distribution, std::int32_t day) {
  std::mt19937 random(static_cast<unsigned>(distribution));
  std::lognormal_distribution<double> duration(3, 1.5);
  RecordedValues recorded;
  recorded.key = DistributionKey(distribution);
  recorded.day = day;
  for (int i = 0; i < kValuesPerDistribution; ++i) {
    recorded.add(duration(random), i * 86400 / kValuesPerDistribution);
  }
  return recorded;
}

bool FillStore(CounterStore& store, std::int32_t day) {
  StoreChanges changes;
  for (int i = 0; i < kScalars; ++i) {
    changes.scalars.push_back(
        {ScalarChange::Kind::kSet, ScalarKey(i), std::int64_t{i} * 7919, day});
  }
  for (int i = 0; i < kDistributions; ++i) changes.values.push_back(SampleValues(i, day));
  return store.write(changes);
}

}  // namespace quorlet::bench
