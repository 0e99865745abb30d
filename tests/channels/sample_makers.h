// Samples for the tests of values, deltas and descriptions.
#ifndef QUORLET_TESTS_CHANNELS_SAMPLE_MAKERS_H_
#define QUORLET_TESTS_CHANNELS_SAMPLE_MAKERS_H_

#include <array>
#include <vector>

#include "channels/drvreport.h"

namespace quorlet {

inline constexpr std::int64_t kNone = kDrvReportInvalidValue;

// The four values and the time stamp of each record.
using Records = std::vector<std::array<std::int64_t, 5>>;

inline void AppendWord(Data& data, std::int64_t word) {
  for (unsigned shift = 0; shift < 64; shift += 8) {
    data.push_back(static_cast<std::byte>(word >> shift));
  }
}

// A sample of channel 0x1234567890 in the format (1 simple, 2 state, 3 histogram, 4 array),
// whose type word counts the records, or `surplus` more.
inline Dictionary Sample(std::uint8_t format, const Records& records, std::size_t surplus = 0) {
  const auto type = static_cast<std::int64_t>((records.size() + surplus) << 32 | 1 << 24 | format);
  Data data;
  for (const auto& [v0, v1, v2, v3, time] : records) {
    for (const auto word : {std::int64_t{5}, 0x1234567890, type, time, v0, v1, v2, v3}) {
      AppendWord(data, word);
    }
  }
  return {{"LegendChannel", Array{Int64(0x1234567890), Int64(type)}}, {"RawElements", data}};
}

}  // namespace quorlet

#endif  // QUORLET_TESTS_CHANNELS_SAMPLE_MAKERS_H_
