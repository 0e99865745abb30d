#include "report/bucket_label.h"

#include <cstdint>
#include <limits>

#include "values/digits.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr std::string_view kSeparator = ", ";

}  // namespace

std::optional<Number> ParseLoggedNumber(std::string_view text) {
  if (const auto integer = ParseNumber<std::int64_t>(text)) {
    return Number::Signed(NumberKind::kInt64, *integer);
  }
  if (const auto integer = ParseNumber<std::uint64_t>(text)) return Number::Unsigned(*integer);
  if (const auto real = ParseNumber<double>(text)) return Number::Real(NumberKind::kDouble, *real);
  return std::nullopt;
}

std::string BucketLabel(const PropertyValue& lower, const PropertyValue& upper, bool isLast) {
  if (!isLast) return FormatText("(%@, %@]", lower, upper);
  return FormatText("(%@, %@)", lower, Double(std::numeric_limits<double>::infinity()));
}

std::optional<BucketBounds> ParseBucketLabel(std::string_view label) {
  if (!label.starts_with('(') || !(label.ends_with(']') || label.ends_with(')'))) {
    return std::nullopt;
  }
  label = label.substr(1, label.size() - 2);
  const std::size_t separator = label.find(kSeparator);
  if (separator == std::string_view::npos) return std::nullopt;
  const auto lower = ParseLoggedNumber(label.substr(0, separator));
  const auto upper = ParseLoggedNumber(label.substr(separator + kSeparator.size()));
  if (!lower || !upper) return std::nullopt;
  return BucketBounds{*lower, *upper};
}

}  // namespace quorlet
