// The names of a histogram's buckets in the aggregated log: "(20, 40]", "(-inf, 20]", "(40, inf)".
#ifndef QUORLET_REPORT_BUCKET_LABEL_H_
#define QUORLET_REPORT_BUCKET_LABEL_H_

#include <optional>
#include <string>
#include <string_view>

#include "drvreport/property_value.h"

namespace quorlet {

// The values above `lower` and up to `upper`; the ends are infinite where there is none.
struct BucketBounds {
  Number lower;
  Number upper;
};

// A number as a log writes it: an integer keeps all its digits, anything else is a double, "inf",
// "-inf" or "nan". Nothing for a text that is no number.
std::optional<Number> ParseLoggedNumber(std::string_view text);

// `isLast`: the bucket has no upper bound, and `upper` is not read.
std::string BucketLabel(const PropertyValue& lower, const PropertyValue& upper, bool isLast);
// The bounds that a label names, or nothing for a text that BucketLabel does not make.
std::optional<BucketBounds> ParseBucketLabel(std::string_view label);

}  // namespace quorlet

#endif  // QUORLET_REPORT_BUCKET_LABEL_H_
