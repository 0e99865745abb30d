// Figures of logs as people read them.
#ifndef QUORLET_CTL_FIGURE_TEXT_H_
#define QUORLET_CTL_FIGURE_TEXT_H_

#include <string>
#include <string_view>

#include "ctl/export_log.h"

namespace quorlet {

// "-1,234,567" for an integer, six significant digits of another number.
std::string FigureText(const Number& number);
std::string FigureText(double number);
// A scalar's value: a number, or the text of a list, escaped.
std::string ValueText(const ScalarRow& scalar);
// " MiB" behind a figure; empty for a plain count and for keys whose unit nobody knows.
std::string UnitText(std::string_view key);

// The standard deviation of the values that were counted; 0 without any.
double Spread(const DistributionRow& distribution);
// "(20, 40]"
std::string BucketText(const LoggedBucket& bucket, bool isLast);
// What the log is: "Aggregated log of 2026-03-04", or of a status log when it was made.
std::string LogTitle(const ExportedLog& log);

}  // namespace quorlet

#endif  // QUORLET_CTL_FIGURE_TEXT_H_
