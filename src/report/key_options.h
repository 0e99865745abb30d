// KeyOptions: what the whitelist asks for one key, and how its entries are read.
#ifndef QUORLET_REPORT_KEY_OPTIONS_H_
#define QUORLET_REPORT_KEY_OPTIONS_H_

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "drvreport/property_value.h"

namespace quorlet {

// An empty dictionary reports the value as read.
using KeyOptions = Dictionary;

inline constexpr std::string_view kSigFig = "sig_fig";
inline constexpr std::string_view kBucketInterval = "bucket_interval";
inline constexpr std::string_view kIntervals = "intervals";
inline constexpr std::string_view kExpires = "expires";

enum class KeyKind { kScalar, kDistribution };
enum class OptionType {
  kRounding,   // a non-negative number
  kIntervals,  // an array of numbers
  kText,
  kDate,  // or "YYYY-MM-DD"
};

struct OptionRule {
  std::string_view name;
  std::optional<KeyKind> kind;  // none: an option of any key
  OptionType type;
};

// Every option that there is. The last two are for the people who keep the whitelist.
inline constexpr std::array<OptionRule, 5> kOptionRules{{
    {kSigFig, KeyKind::kScalar, OptionType::kRounding},
    {kBucketInterval, KeyKind::kScalar, OptionType::kRounding},
    {kIntervals, KeyKind::kDistribution, OptionType::kIntervals},
    {"why", std::nullopt, OptionType::kText},
    {kExpires, std::nullopt, OptionType::kDate},
}};

// A rounding option (fractions truncated, larger than 64 bits saturated), or nothing when it is
// absent or will not work.
std::optional<std::uint64_t> RoundingOption(const KeyOptions& options, std::string_view name);

// The "intervals" entry when every element is a number other than NaN, otherwise nothing.
std::optional<Array> IntervalsOption(const KeyOptions& options);

// The last day for which the entry answers, or nothing when it does not expire.
std::optional<std::int64_t> ExpiryOption(const KeyOptions& options);

// What is wrong with an option's name: "\"sig_figs\" is not an option, did you mean \"sig_fig\"?".
// Nothing when there is such an option.
std::optional<std::string> UnknownOptionFault(std::string_view name);

// One reason for each option that will not work, or not as meant, for a key of this kind:
// "\"sig_fig\" is negative".
std::vector<std::string> KeyOptionFaults(const KeyOptions& options, KeyKind kind);

}  // namespace quorlet

#endif  // QUORLET_REPORT_KEY_OPTIONS_H_
