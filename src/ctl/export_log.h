// A log as rows: what an export tells of it.
#ifndef QUORLET_CTL_EXPORT_LOG_H_
#define QUORLET_CTL_EXPORT_LOG_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "drvreport/property_value.h"
#include "report/bucket_label.h"

namespace quorlet {

// Texts lie in the log's bytes or in its document.
struct ScalarRow {
  std::string_view key;
  std::variant<Number, std::string_view> value;  // a text for a list
};

struct DistributionRow {
  std::string_view key;
  Number minimum;
  Number maximum;
  Number mean;
  Number squares;  // the sum of squared deviations from the mean
  std::uint64_t count = 0;
};

struct LoggedBucket {
  BucketBounds bounds;
  std::uint64_t count = 0;
};

struct HistogramRow {
  std::string_view key;
  std::vector<LoggedBucket> buckets;  // by lower bound, then by upper bound
};

// The rows of each kind are in byte order of their keys.
struct ExportedLog {
  std::string type;
  std::string created;   // RFC 3339
  std::int64_t day = 0;  // since 1970
  std::string dayText;   // "2026-03-04"
  bool isStatusLog = false;
  std::optional<std::string> device;
  std::optional<std::string> osVersion;
  std::optional<std::string> whitelist;
  std::optional<std::string> tasking;
  std::vector<ScalarRow> scalars;
  std::vector<DistributionRow> distributions;
  std::vector<HistogramRow> histograms;
  PropertyValue document;  // what the keys lie in
};

// The rows of a log file, which must outlive them; or why it cannot be read. `device` is what its
// header says.
[[nodiscard]] std::variant<ExportedLog, std::string> ReadExportedLog(std::string_view bytes);

}  // namespace quorlet

#endif  // QUORLET_CTL_EXPORT_LOG_H_
