#include "ctl/figure_text.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>

#include "ctl/export_units.h"
#include "ctl/output.h"

namespace quorlet {
namespace {

std::string WithThousands(std::string digits) {
  const std::size_t first = digits.starts_with('-') ? 1 : 0;
  for (std::size_t at = digits.size(); at > first + 3;) {
    at -= 3;
    digits.insert(at, 1, ',');
  }
  return digits;
}

}  // namespace

std::string FigureText(double number) {
  constexpr double kIntegersEnd = 0x1p53;
  if (number == std::trunc(number) && std::fabs(number) < kIntegersEnd) {
    return WithThousands(std::to_string(static_cast<std::int64_t>(number)));
  }
  std::array<char, 32> text{};
  std::snprintf(text.data(), text.size(), "%.6g", number);
  return text.data();
}

std::string FigureText(const Number& number) {
  const bool isReal = number.kind() == NumberKind::kSingle || number.kind() == NumberKind::kDouble;
  if (isReal) return FigureText(number.toDouble());
  return WithThousands(number.kind() == NumberKind::kUInt64 ? std::to_string(number.toUInt64())
                                                            : std::to_string(number.toInt64()));
}

std::string ValueText(const ScalarRow& scalar) {
  if (const auto* number = std::get_if<Number>(&scalar.value)) return FigureText(*number);
  return Escape(std::get<std::string_view>(scalar.value));
}

std::string UnitText(std::string_view key) {
  const std::string_view unit = UnitOfKey(key);
  if (unit.empty() || unit == "1") return "";
  if (unit == "By") return " B";
  return unit.ends_with("By") ? " " + std::string(unit.substr(0, unit.size() - 1))
                              : " " + std::string(unit);
}

double Spread(const DistributionRow& distribution) {
  if (distribution.count == 0) return 0;
  return std::sqrt(std::max(distribution.squares.toDouble(), 0.0) /
                   static_cast<double>(distribution.count));
}

std::string BucketText(const LoggedBucket& bucket, bool isLast) {
  const bool isOpen = isLast && std::isinf(bucket.bounds.upper.toDouble());
  return BucketLabel(PropertyValue(bucket.bounds.lower), PropertyValue(bucket.bounds.upper),
                     isOpen);
}

std::string LogTitle(const ExportedLog& log) {
  return log.isStatusLog ? "Storage status of " + Escape(log.created)
                         : "Aggregated log of " + log.dayText;
}

}  // namespace quorlet
