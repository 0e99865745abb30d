// OTLP in JSON: 64-bit integers are strings, doubles are numbers, what is absent is left out.
#include <cmath>
#include <limits>

#include "ctl/export_format.h"
#include "ctl/export_json.h"
#include "ctl/export_units.h"

namespace quorlet {
namespace {

constexpr std::uint64_t kNanosecondsPerDay = 86'400'000'000'000;
// The last day whose end 64 unsigned bits hold.
constexpr std::int64_t kLastDayInNanoseconds =
    static_cast<std::int64_t>(std::numeric_limits<std::uint64_t>::max() / kNanosecondsPerDay) - 1;

// `counts` is one longer than `bounds`.
struct ExplicitBuckets {
  std::vector<double> bounds;
  std::vector<std::uint64_t> counts;
};

// The whole line of numbers, from the log's buckets: what lies between and beyond them is empty.
// Nothing when they overlap.
std::optional<ExplicitBuckets> CoverTheLine(const std::vector<LoggedBucket>& buckets) {
  constexpr double kInfinity = std::numeric_limits<double>::infinity();
  ExplicitBuckets line;
  double covered = -kInfinity;
  for (const LoggedBucket& bucket : buckets) {
    const double lower = bucket.bounds.lower.toDouble();
    const double upper = bucket.bounds.upper.toDouble();
    if (lower < covered || upper <= lower) return std::nullopt;
    if (lower > covered) {
      line.bounds.push_back(lower);
      line.counts.push_back(0);
    }
    line.counts.push_back(bucket.count);
    if (upper < kInfinity) line.bounds.push_back(upper);
    covered = upper;
  }
  if (covered < kInfinity) line.counts.push_back(0);
  return line;
}

std::optional<std::uint64_t> Total(const std::vector<LoggedBucket>& buckets) {
  std::uint64_t total = 0;
  for (const LoggedBucket& bucket : buckets) {
    if (__builtin_add_overflow(total, bucket.count, &total)) return std::nullopt;
  }
  return total;
}

class OtlpWriter {
 public:
  OtlpWriter(const ExportedLog& log, std::string& json) : json_(json) {
    const auto start = static_cast<std::uint64_t>(log.day) * kNanosecondsPerDay;
    times_ = "\"startTimeUnixNano\":\"" + std::to_string(start) + "\",\"timeUnixNano\":\"" +
             std::to_string(start + kNanosecondsPerDay) + '"';
    json_ += "{\"resourceMetrics\":[{\"resource\":{\"attributes\":[";
    attribute("service.name", "quorlet");
    if (log.device) attribute("device.id", *log.device);
    if (log.osVersion) attribute("os.version", *log.osVersion);
    json_ += "]},\"scopeMetrics\":[{\"scope\":{\"name\":\"quorlet\"},\"metrics\":[";
  }
  void finish() { json_ += "]}]}]}\n"; }
  bool isEmpty() const { return isFirst_; }

  void gauge(const ScalarRow& row) {
    const auto* number = std::get_if<Number>(&row.value);
    if (number == nullptr || !IsFinite(*number)) return;
    open(row.key);
    json_.append(",\"gauge\":{\"dataPoints\":[{").append(times_);
    // Integers of OTLP are signed.
    const bool isInteger = !number->isReal() && (number->kind() != NumberKind::kUInt64 ||
                                                 number->toUInt64() <= kLargestInteger);
    if (isInteger) {
      json_ += ",\"asInt\":\"";
      AppendJsonNumber(json_, *number);
      json_ += '"';
    } else {
      json_ += ",\"asDouble\":";
      AppendJsonNumber(json_, number->toDouble());
    }
    json_ += "}]}}";
  }

  void histogram(const DistributionRow& row, const HistogramRow* buckets) {
    openHistogram(row.key);
    json_ += ",\"attributes\":[";
    bool isFirstAttribute = true;
    const auto figure = [&](std::string_view name, const Number& number) {
      if (!IsFinite(number)) return;
      if (!isFirstAttribute) json_ += ',';
      isFirstAttribute = false;
      json_.append("{\"key\":\"").append(name).append("\",\"value\":{\"doubleValue\":");
      AppendJsonNumber(json_, number.toDouble());
      json_ += "}}";
    };
    figure("mean", row.mean);
    figure("m2", row.squares);
    json_ += "],\"count\":\"";
    AppendDecimal(json_, row.count);
    json_ += '"';
    summary(row);
    // Counts that do not add up, as those beyond what the log's count can say, would make the
    // point wrong.
    if (buckets != nullptr && Total(buckets->buckets) == row.count) explicitBuckets(*buckets);
    json_ += "}]}}";
  }

  // A histogram whose distribution the log does not have.
  void histogram(const HistogramRow& row) {
    const auto total = Total(row.buckets);
    if (!total) return;
    openHistogram(row.key);
    json_ += ",\"count\":\"";
    AppendDecimal(json_, *total);
    json_ += '"';
    explicitBuckets(row);
    json_ += "}]}}";
  }

 private:
  static constexpr std::uint64_t kLargestInteger = std::numeric_limits<std::int64_t>::max();

  void attribute(std::string_view key, std::string_view value) {
    if (json_.back() != '[') json_ += ',';
    json_.append("{\"key\":\"").append(key).append("\",\"value\":{\"stringValue\":");
    AppendJsonString(json_, value);
    json_ += "}}";
  }

  void open(std::string_view key) {
    json_ += isFirst_ ? "{\"name\":" : ",{\"name\":";
    isFirst_ = false;
    AppendJsonString(json_, key);
    if (const std::string_view unit = UnitOfKey(key); !unit.empty()) {
      json_.append(",\"unit\":\"").append(unit) += '"';
    }
  }

  // Up to the first point's times.
  void openHistogram(std::string_view key) {
    open(key);
    json_ += ",\"histogram\":{\"aggregationTemporality\":1,\"dataPoints\":[{";
    json_ += times_;
  }

  void summary(const DistributionRow& row) {
    const auto figure = [this](std::string_view name, double number) {
      if (!std::isfinite(number)) return;
      json_.append(",\"").append(name).append("\":");
      AppendJsonNumber(json_, number);
    };
    if (row.count == 0) {
      figure("sum", 0);
      return;
    }
    if (row.minimum.toDouble() >= 0) {
      figure("sum", row.mean.toDouble() * static_cast<double>(row.count));
    }
    figure("min", row.minimum.toDouble());
    figure("max", row.maximum.toDouble());
  }

  void explicitBuckets(const HistogramRow& row) {
    const auto line = CoverTheLine(row.buckets);
    if (!line) return;
    json_ += ",\"bucketCounts\":[";
    for (std::size_t i = 0; i < line->counts.size(); ++i) {
      json_ += i == 0 ? "\"" : ",\"";
      AppendDecimal(json_, line->counts[i]);
      json_ += '"';
    }
    json_ += "],\"explicitBounds\":[";
    for (std::size_t i = 0; i < line->bounds.size(); ++i) {
      if (i != 0) json_ += ',';
      AppendJsonNumber(json_, line->bounds[i]);
    }
    json_ += ']';
  }

  std::string& json_;
  std::string times_;
  bool isFirst_ = true;
};

}  // namespace

bool AppendOtlpJson(const ExportedLog& log, std::string& lines) {
  if (log.day < 0 || log.day > kLastDayInNanoseconds) return false;
  const std::size_t before = lines.size();
  OtlpWriter writer(log, lines);
  for (const ScalarRow& row : log.scalars) writer.gauge(row);
  auto histogram = log.histograms.begin();
  const auto end = log.histograms.end();
  for (const DistributionRow& row : log.distributions) {
    for (; histogram != end && histogram->key < row.key; ++histogram) writer.histogram(*histogram);
    const bool hasBuckets = histogram != end && histogram->key == row.key;
    writer.histogram(row, hasBuckets ? &*histogram++ : nullptr);
  }
  for (; histogram != end; ++histogram) writer.histogram(*histogram);
  writer.finish();
  if (writer.isEmpty()) lines.resize(before);
  return true;
}

}  // namespace quorlet
