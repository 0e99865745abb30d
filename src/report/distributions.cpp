// The reduction of a distribution's values to summary statistics and a histogram.
#include <algorithm>
#include <cmath>
#include <limits>
#include <new>
#include <vector>

#include "report/bucket_label.h"
#include "report/report.h"

namespace quorlet {
namespace {

// The largest bound so far at each position. The first bound not less than a value stands where
// the first of these stands, so a search by halves finds it whatever the order of the bounds.
std::vector<double> RunningMaxima(const Array& intervals) {
  std::vector<double> maxima;
  maxima.reserve(intervals.size());
  for (const PropertyValue& bound : intervals) {
    const double value = bound.asNumber()->toDouble();
    maxima.push_back(maxima.empty() ? value : std::max(maxima.back(), value));
  }
  return maxima;
}

struct HistogramCounters {
  std::vector<double> bounds;
  std::vector<std::uint64_t> counts;

  void add(double value) {
    ++counts[TLReport::determineHistBucketForValueWithIntervals(value, bounds)];
  }
};

// Minimum, maximum, mean, sum of squared deviations and count, in one pass (Welford).
class Summary {
 public:
  void add(double value) {
    if (count_ == 0) {
      minimum_ = maximum_ = mean_ = value;
      count_ = 1;
      return;
    }
    maximum_ = std::max(maximum_, value);
    minimum_ = std::min(minimum_, value);
    ++count_;
    const double delta = value - mean_;
    mean_ += delta / static_cast<double>(count_);
    squares_ += delta * (value - mean_);
  }

  Array distributionStats() const {
    constexpr std::int64_t kMaxCount = std::numeric_limits<std::int32_t>::max();
    return {Double(minimum_), Double(maximum_), Double(mean_), Double(squares_),
            Int32(static_cast<std::int32_t>(std::min(count_, kMaxCount)))};
  }

 private:
  double minimum_ = 0;
  double maximum_ = 0;
  double mean_ = 0;
  double squares_ = 0;
  std::int64_t count_ = 0;
};

// Calls `use` for each value but NaN, which has no place among the others.
template <typename Use>
void ForEachValue(TLHistoryDistributionEnumerator& values, Use use) {
  double value = 0;
  std::int32_t secondsInDay = 0;
  while (values.getNextValueSecondsInDayOffset(value, secondsInDay)) {
    if (!std::isnan(value)) use(value);
  }
}

}  // namespace

void TLReport::computeAndAddDistributionForKeyWithOptions(TLHistoryDistributionEnumerator& values,
                                                          std::string_view key,
                                                          const KeyOptions& options) {
  reportFaultyOptions(options, key, KeyKind::kDistribution);
  const auto intervals = IntervalsOption(options);
  std::optional<HistogramCounters> histogram;
  if (intervals) {
    _platform.log.debug("Treating key %@ as a histogram", key);
    try {
      histogram.emplace(HistogramCounters{RunningMaxima(*intervals),
                                          std::vector<std::uint64_t>(intervals->size() + 1)});
    } catch (const std::bad_alloc&) {
      _platform.log.log(
          "Couldn't allocate histCounts for key %@. Will not calculate histogram values", key);
    }
  }

  Summary summary;
  if (histogram) {
    ForEachValue(values, [&](double value) {
      summary.add(value);
      histogram->add(value);
    });
  } else {
    ForEachValue(values, [&](double value) { summary.add(value); });
  }
  if (values.failed()) {
    _platform.log.error("Leaving out the distribution %@: not all of its values could be read",
                        key);
    return;
  }
  if (histogram) {
    if (auto labelled = histogramDictForIntervalsWithHistCounts(*intervals, histogram->counts)) {
      _histogramsOutput[key] = std::move(*labelled);
    } else {
      _histogramsOutput.remove(key);
    }
  }
  _distributionsOutput[key] = summary.distributionStats();
}

std::uint32_t TLReport::determineHistBucketForValueWithIntervals(
    double value, std::span<const double> intervals) {
  return static_cast<std::uint32_t>(std::ranges::lower_bound(intervals, value) - intervals.begin());
}

std::optional<Dictionary> TLReport::histogramDictForIntervalsWithHistCounts(
    const Array& intervals, std::span<const std::uint64_t> counts) {
  constexpr double kInfinity = std::numeric_limits<double>::infinity();
  std::optional<Dictionary> histogram;
  const std::size_t last = intervals.size();
  for (std::size_t i = 0; i <= last; ++i) {
    if (counts[i] == 0) continue;
    const PropertyValue lower = i == 0 ? Double(-kInfinity) : intervals[i - 1];
    const bool isLast = i == last;
    const std::string label = BucketLabel(lower, isLast ? lower : intervals[i], isLast);
    if (!histogram) histogram.emplace();
    (*histogram)[label] = UInt64(counts[i]);
  }
  return histogram;
}

}  // namespace quorlet
