#include <cmath>

#include "ctl/export_format.h"
#include "ctl/export_json.h"
#include "ctl/export_units.h"

namespace quorlet {
namespace {

constexpr std::string_view kSchema = "quorlet.metrics/1";

void AppendMember(std::string& json, std::string_view name,
                  const std::optional<std::string>& text) {
  if (!text) return;
  json.append(",\"").append(name).append("\":");
  AppendJsonString(json, *text);
}

void AppendFigure(std::string& json, std::string_view name, const Number& number) {
  json.append(",\"").append(name).append("\":");
  AppendJsonNumber(json, number);
}

// An array with what `append` gives for each bucket.
template <typename Append>
void AppendBuckets(std::string& json, std::string_view name, const HistogramRow& row,
                   Append append) {
  json.append(",\"").append(name).append("\":[");
  bool isFirst = true;
  for (const LoggedBucket& bucket : row.buckets) {
    if (!isFirst) json += ',';
    isFirst = false;
    append(bucket);
  }
  json += ']';
}

class NdjsonWriter {
 public:
  NdjsonWriter(const ExportedLog& log, std::string& lines) : lines_(lines) {
    shared_ = "{\"schema\":";
    AppendJsonString(shared_, kSchema);
    AppendMember(shared_, "device", log.device);
    AppendMember(shared_, "day", log.dayText);
    AppendMember(shared_, "created", log.created);
    AppendMember(shared_, "os_version", log.osVersion);
    AppendMember(shared_, "log", log.type);
    AppendMember(shared_, "whitelist", log.whitelist);
    AppendMember(shared_, "tasking", log.tasking);
    shared_ += ",\"kind\":\"";
  }

  void scalar(const ScalarRow& row, std::string_view kind) {
    open(kind, row.key);
    lines_ += ",\"value\":";
    if (const auto* number = std::get_if<Number>(&row.value)) {
      AppendJsonNumber(lines_, *number);
    } else {
      AppendJsonString(lines_, std::get<std::string_view>(row.value));
    }
    lines_ += "}\n";
  }

  void distribution(const DistributionRow& row) {
    open("distribution", row.key);
    AppendFigure(lines_, "min", row.minimum);
    AppendFigure(lines_, "max", row.maximum);
    AppendFigure(lines_, "mean", row.mean);
    AppendFigure(lines_, "m2", row.squares);
    AppendFigure(lines_, "count", Number::Unsigned(row.count));
    lines_ += "}\n";
  }

  void histogram(const HistogramRow& row) {
    open("histogram", row.key);
    AppendBuckets(lines_, "lower", row, [this](const LoggedBucket& bucket) {
      AppendJsonNumber(lines_, bucket.bounds.lower);
    });
    AppendBuckets(lines_, "upper", row, [this](const LoggedBucket& bucket) {
      AppendJsonNumber(lines_, bucket.bounds.upper);
    });
    AppendBuckets(lines_, "counts", row,
                  [this](const LoggedBucket& bucket) { AppendDecimal(lines_, bucket.count); });
    lines_ += "}\n";
  }

 private:
  void open(std::string_view kind, std::string_view key) {
    lines_.append(shared_).append(kind).append("\",\"key\":");
    AppendJsonString(lines_, key);
    if (const std::string_view unit = UnitOfKey(key); !unit.empty()) {
      lines_.append(",\"unit\":\"").append(unit) += '"';
    }
  }

  std::string& lines_;
  std::string shared_;  // what all rows of the log begin with
};

}  // namespace

void AppendNdjson(const ExportedLog& log, std::string& lines) {
  NdjsonWriter writer(log, lines);
  for (const ScalarRow& row : log.scalars) {
    writer.scalar(row, log.isStatusLog ? "status" : "scalar");
  }
  for (const DistributionRow& row : log.distributions) writer.distribution(row);
  for (const HistogramRow& row : log.histograms) writer.histogram(row);
}

}  // namespace quorlet
