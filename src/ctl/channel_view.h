// Reporting channels and their samples, as quorletctl shows them.
#ifndef QUORLET_CTL_CHANNEL_VIEW_H_
#define QUORLET_CTL_CHANNEL_VIEW_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "drvreport/drvreport.h"

namespace quorlet {

// "simple", "state", "histogram" or "array", otherwise the number.
std::string FormatName(std::uint8_t format);

// What a channel is, for JSON. IDs and the unit are texts like "0x1f": many readers of JSON have no
// numbers of 64 bits.
Dictionary DescribeChannel(Dictionary& channel);

// The same for a table: name, group and subgroup, format, unit, elements, driver; escaped.
std::vector<std::string> ListRow(Dictionary& channel);

// What a sample (or a delta) holds, for JSON: "value", "values", "states" or "buckets"; empty when
// it cannot be read.
Dictionary DescribeValues(Dictionary& sample);

// The library's description, line by line without line ends, escaped. An array has a line for each
// record. With `barWidth` each state's line ends with its share as a bar.
std::vector<std::string> SampleLines(Dictionary& sample, std::string_view prefix,
                                     std::size_t barWidth);

// A line that says of a channel what cannot be said in numbers: "unreadable", "restarted".
std::string NoteLine(Dictionary& sample, std::string_view prefix, std::string_view note);

// Whether the counters of states or buckets have begun anew between the two samples.
bool HasRestarted(Dictionary& delta);

// Lines of a table that fit `columns`: what has changed in `seconds`, and what holds now. States
// and buckets have their shares as bars.
std::string TableHeader(std::size_t columns);
std::vector<std::string> TableRows(Dictionary& sample, Dictionary& delta, double seconds,
                                   std::size_t columns);

}  // namespace quorlet

#endif  // QUORLET_CTL_CHANNEL_VIEW_H_
