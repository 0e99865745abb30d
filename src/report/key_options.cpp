#include "report/key_options.h"

#include <cmath>

#include "values/text.h"

namespace quorlet {
namespace {

// Why a rounding option will not work; nothing when it will.
std::optional<std::string_view> RoundingFault(const PropertyValue& value) {
  const Number* number = value.asNumber();
  if (number == nullptr) return "is not a number";
  if (!std::isfinite(number->toDouble())) return "is not finite";
  if (number->toDouble() < 0) return "is negative";
  return std::nullopt;
}

std::optional<std::string_view> IntervalsFault(const PropertyValue& value) {
  const Array* bounds = value.asArray();
  if (bounds == nullptr) return "is not an array";
  for (const PropertyValue& bound : *bounds) {
    const Number* number = bound.asNumber();
    if (number == nullptr || std::isnan(number->toDouble())) {
      return "holds something that is not a number";
    }
  }
  return std::nullopt;
}

}  // namespace

std::optional<std::uint64_t> RoundingOption(const KeyOptions& options, std::string_view name) {
  const PropertyValue* value = options.find(name);
  if (value == nullptr || RoundingFault(*value)) return std::nullopt;
  return value->asNumber()->toUInt64();
}

std::optional<Array> IntervalsOption(const KeyOptions& options) {
  const PropertyValue* value = options.find(kIntervals);
  if (value == nullptr || IntervalsFault(*value)) return std::nullopt;
  return *value->asArray();
}

std::vector<std::string> KeyOptionFaults(const KeyOptions& options, KeyKind kind) {
  std::vector<std::string> faults;
  const auto check = [&](std::string_view name, auto faultOf) {
    const PropertyValue* value = options.find(name);
    if (value == nullptr) return;
    if (const auto fault = faultOf(*value)) faults.push_back(FormatText("\"%@\" %@", name, *fault));
  };
  if (kind == KeyKind::kScalar) {
    check(kBucketInterval, RoundingFault);
    check(kSigFig, RoundingFault);
  } else {
    check(kIntervals, IntervalsFault);
  }
  return faults;
}

}  // namespace quorlet
