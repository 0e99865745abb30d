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

std::vector<DistributionSample> SampleValues(int distribution) {
  std::mt19937 random(static_cast<unsigned>(distribution));
  std::lognormal_distribution<double> duration(3, 1.5);
  std::vector<DistributionSample> samples;
  samples.reserve(kValuesPerDistribution);
  for (int i = 0; i < kValuesPerDistribution; ++i) {
    samples.push_back({duration(random), i * 86400 / kValuesPerDistribution});
  }
  return samples;
}

bool FillLedger(TallyLedger& ledger, std::int32_t day) {
  return ledger.inTransaction([&] {
    for (int i = 0; i < kScalars; ++i) {
      if (!ledger.setScalar(ScalarKey(i), day, std::int64_t{i} * 7919)) return false;
    }
    for (int i = 0; i < kDistributions; ++i) {
      if (!ledger.recordValues(DistributionKey(i), day, SampleValues(i))) return false;
    }
    return true;
  });
}

}  // namespace quorlet::bench
