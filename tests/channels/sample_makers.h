// Samples for the tests of values, deltas and descriptions.
#ifndef QUORLET_TESTS_CHANNELS_SAMPLE_MAKERS_H_
#define QUORLET_TESTS_CHANNELS_SAMPLE_MAKERS_H_

#include <array>
#include <vector>

#include "drvreport/drvreport.h"
#include "values/byte_writer.h"

namespace quorlet {

inline constexpr std::int64_t kNone = kDrvReportInvalidValue;

// The four values and the time stamp of each record.
using Records = std::vector<std::array<std::int64_t, 5>>;

// A sample of channel 0x1234567890 in the format (1 simple, 2 state, 3 histogram, 4 array),
// whose type word counts the records, or `surplus` more.
inline Dictionary Sample(std::uint8_t format, const Records& records, std::size_t surplus = 0) {
  const auto type = static_cast<std::int64_t>((records.size() + surplus) << 32 | 1 << 24 | format);
  ByteWriter data;
  for (const auto& [v0, v1, v2, v3, time] : records) {
    for (const auto word : {std::int64_t{5}, 0x1234567890, type, time, v0, v1, v2, v3}) {
      data.u64(static_cast<std::uint64_t>(word));
    }
  }
  return {{"LegendChannel", Array{Int64(0x1234567890), Int64(type)}}, {"RawElements", data.take()}};
}

}  // namespace quorlet

#endif  // QUORLET_TESTS_CHANNELS_SAMPLE_MAKERS_H_
