// The line format in which counters are imported and dumped. Fields are separated by one tab:
//
//   scalar DAY KEY VALUE           DAY: a number, not in the future; VALUE: signed 64-bit integer
//   value  DAY KEY SECOND NUMBER   SECOND: 0 to 86399; NUMBER: also "inf", "-inf", "nan"
//
// A key is written with backslash escapes (ctl/output.h), so it may hold any bytes. A number is
// written in a short form that reads back as the same number.
#ifndef QUORLET_CTL_TALLY_LINES_H_
#define QUORLET_CTL_TALLY_LINES_H_

#include <cstdint>
#include <string>
#include <string_view>
#include <variant>

#include "platform/counter_store.h"

namespace quorlet {

struct ScalarLine {
  std::int32_t day = 0;
  std::string key;
  std::int64_t value = 0;
};

struct SampleLine {
  std::int32_t day = 0;
  std::string key;
  DistributionSample sample;
};

// `line` without its line break; a text says why it is neither.
std::variant<ScalarLine, SampleLine, std::string> ParseTallyLine(std::string_view line);

// Both append a whole line. `escapedKey`: Escape(key), so that a row's samples share the work.
void AppendScalarLine(std::int32_t day, std::string_view escapedKey, std::int64_t value,
                      std::string& lines);
void AppendSampleLine(std::int32_t day, std::string_view escapedKey,
                      const DistributionSample& sample, std::string& lines);

// A short text that reads back as the same number.
std::string RealText(double number);

}  // namespace quorlet

#endif  // QUORLET_CTL_TALLY_LINES_H_
