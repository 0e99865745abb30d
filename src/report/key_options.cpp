#include "report/key_options.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include "values/text.h"

namespace quorlet {
namespace {

// A name with more wrong letters than this is no slip.
constexpr std::size_t kMostSlips = 2;

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

// Bounds that do not ascend are used as they are, but nobody can have meant them.
std::optional<std::string_view> BoundsFault(const PropertyValue& value) {
  if (const auto fault = IntervalsFault(value)) return fault;
  const Array& bounds = *value.asArray();
  for (std::size_t i = 1; i < bounds.size(); ++i) {
    if (!(bounds[i - 1].asNumber()->toDouble() < bounds[i].asNumber()->toDouble())) {
      return "has bounds that do not ascend";
    }
  }
  return std::nullopt;
}

std::optional<std::int64_t> LastDay(const PropertyValue& value) {
  if (const std::string* text = value.asString()) return ParseDate(*text);
  const Date* date = value.asDate();
  if (date == nullptr || !std::isfinite(date->secondsSince1970)) return std::nullopt;
  return Number::Real(NumberKind::kDouble, std::floor(date->secondsSince1970 / 86400)).toInt64();
}

std::optional<std::string_view> ValueFault(OptionType type, const PropertyValue& value) {
  const bool isText = value.asString() != nullptr;
  switch (type) {
    case OptionType::kRounding:
      return RoundingFault(value);
    case OptionType::kIntervals:
      return BoundsFault(value);
    case OptionType::kText:
      return isText ? std::nullopt : std::optional<std::string_view>("is not a text");
    case OptionType::kDate:
      return LastDay(value)
                 ? std::nullopt
                 : std::optional<std::string_view>("is neither a date nor \"YYYY-MM-DD\"");
  }
  return std::nullopt;
}

const OptionRule* FindRule(std::string_view name) {
  const auto* found = std::ranges::find(kOptionRules, name, &OptionRule::name);
  return found != kOptionRules.end() ? found : nullptr;
}

// How many letters must be put in, taken out or replaced to make one name of the other.
std::size_t EditDistance(std::string_view one, std::string_view other) {
  std::vector<std::size_t> row(other.size() + 1);
  for (std::size_t j = 0; j < row.size(); ++j) row[j] = j;
  for (std::size_t i = 1; i <= one.size(); ++i) {
    std::size_t diagonal = std::exchange(row[0], i);
    for (std::size_t j = 1; j < row.size(); ++j) {
      const std::size_t replaced = diagonal + (one[i - 1] == other[j - 1] ? 0 : 1);
      diagonal = row[j];
      row[j] = std::min({replaced, row[j] + 1, row[j - 1] + 1});
    }
  }
  return row.back();
}

// The option that was probably meant, or nothing.
std::string_view NearestOption(std::string_view name) {
  std::string_view nearest;
  std::size_t fewest = kMostSlips + 1;
  for (const OptionRule& rule : kOptionRules) {
    // Also spares the work on names of any length.
    if (name.size() > rule.name.size() + kMostSlips) continue;
    const std::size_t slips = EditDistance(name, rule.name);
    if (slips < fewest && slips < rule.name.size()) {
      fewest = slips;
      nearest = rule.name;
    }
  }
  return nearest;
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

std::optional<std::int64_t> ExpiryOption(const KeyOptions& options) {
  const PropertyValue* value = options.find(kExpires);
  return value != nullptr ? LastDay(*value) : std::nullopt;
}

std::optional<std::string> UnknownOptionFault(std::string_view name) {
  if (FindRule(name) != nullptr) return std::nullopt;
  std::string fault = FormatText("\"%@\" is not an option", name);
  if (const std::string_view nearest = NearestOption(name); !nearest.empty()) {
    fault += FormatText(", did you mean \"%@\"?", nearest);
  }
  return fault;
}

std::vector<std::string> KeyOptionFaults(const KeyOptions& options, KeyKind kind) {
  std::vector<std::string> faults;
  for (const auto& [name, value] : options) {
    if (auto unknown = UnknownOptionFault(name)) {
      faults.push_back(*std::move(unknown));
      continue;
    }
    const OptionRule& rule = *FindRule(name);
    if (rule.kind && *rule.kind != kind) {
      faults.push_back(FormatText("\"%@\" is for %s only", name,
                                  *rule.kind == KeyKind::kScalar ? "scalars" : "distributions"));
    } else if (const auto fault = ValueFault(rule.type, value)) {
      faults.push_back(FormatText("\"%@\" %@", name, *fault));
    }
  }
  return faults;
}

}  // namespace quorlet
