// KeyOptions: what the whitelist asks for one key, and how its entries are read.
#ifndef QUORLET_REPORT_KEY_OPTIONS_H_
#define QUORLET_REPORT_KEY_OPTIONS_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "values/property_value.h"

namespace quorlet {

// Entries understood: "sig_fig" and "bucket_interval" (non-negative integers, scalars), "intervals"
// (array of numbers, distributions). An empty dictionary reports the value as read.
using KeyOptions = Dictionary;

inline constexpr std::string_view kSigFig = "sig_fig";
inline constexpr std::string_view kBucketInterval = "bucket_interval";
inline constexpr std::string_view kIntervals = "intervals";

enum class KeyKind { kScalar, kDistribution };

// A rounding option (fractions truncated, larger than 64 bits saturated), or nothing when it is
// absent or will not work.
std::optional<std::uint64_t> RoundingOption(const KeyOptions& options, std::string_view name);

// The "intervals" entry when every element is a number other than NaN, otherwise nothing.
std::optional<Array> IntervalsOption(const KeyOptions& options);

// One reason for each entry that will not work for a key of this kind: "\"sig_fig\" is negative".
std::vector<std::string> KeyOptionFaults(const KeyOptions& options, KeyKind kind);

}  // namespace quorlet

#endif  // QUORLET_REPORT_KEY_OPTIONS_H_
