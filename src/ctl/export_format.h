// The formats of an export. Each appends the lines of one log.
#ifndef QUORLET_CTL_EXPORT_FORMAT_H_
#define QUORLET_CTL_EXPORT_FORMAT_H_

#include <string>

#include "ctl/export_log.h"

namespace quorlet {

// One JSON object for each row, schema "quorlet.metrics/1".
void AppendNdjson(const ExportedLog& log, std::string& lines);

// One ExportMetricsServiceRequest in the JSON of OTLP; nothing for a log without a metric. False
// when the log's day is none that OTLP's nanoseconds hold.
[[nodiscard]] bool AppendOtlpJson(const ExportedLog& log, std::string& lines);

}  // namespace quorlet

#endif  // QUORLET_CTL_EXPORT_FORMAT_H_
