#include "ctl/log_summary.h"

#include <algorithm>
#include <vector>

#include "ctl/figure_text.h"
#include "ctl/output.h"
#include "ctl/terminal.h"

namespace quorlet {
namespace {

constexpr std::size_t kNumberWidth = 8;
constexpr std::size_t kWidestBar = 40;

// A key, then its figures at the end of the line; on the next line where both do not fit.
std::string KeyLine(std::string_view key, const std::string& figures, std::size_t columns) {
  const std::string start = "  " + Escape(key);
  if (start.size() + 1 + figures.size() <= columns) {
    return start + RightAligned(figures, columns - start.size()) + "\n";
  }
  std::string lines;
  for (std::string_view rest = start; !rest.empty();) {
    const std::string_view line = FitColumns(rest, columns);
    lines.append(line) += '\n';
    if (line.empty()) break;
    rest.remove_prefix(line.size());
  }
  return lines + RightAligned(figures, std::max(columns, figures.size())) + "\n";
}

std::string Column(const std::string& number) {
  return " " + RightAligned(number, std::max(kNumberWidth, number.size()));
}

// Units stand under each other, and so do the numbers before them.
std::string Scalars(const ExportedLog& log, std::size_t columns) {
  if (log.scalars.empty()) return "";
  std::size_t unitWidth = 0;
  for (const ScalarRow& scalar : log.scalars) {
    unitWidth = std::max(unitWidth, UnitText(scalar.key).size());
  }
  std::string text = log.isStatusLog ? "\nFigures\n" : "\nScalars\n";
  for (const ScalarRow& scalar : log.scalars) {
    text += KeyLine(scalar.key, ValueText(scalar) + LeftAligned(UnitText(scalar.key), unitWidth),
                    columns);
  }
  return text;
}

std::string Distributions(const ExportedLog& log, std::size_t columns) {
  if (log.distributions.empty()) return "";
  std::string titles;
  for (const char* title : {"count", "minimum", "mean", "spread", "maximum"}) {
    titles += Column(title);
  }
  const std::string heading = "Distributions";
  std::string text =
      "\n" + heading + RightAligned(titles, columns - std::min(columns, heading.size())) + "\n";
  for (const DistributionRow& row : log.distributions) {
    text += KeyLine(row.key,
                    Column(FigureText(static_cast<double>(row.count))) +
                        Column(FigureText(row.minimum)) + Column(FigureText(row.mean)) +
                        Column(FigureText(Spread(row))) + Column(FigureText(row.maximum)),
                    columns);
  }
  return text;
}

std::string Histogram(const HistogramRow& row, std::size_t columns) {
  std::string text = "  " + Escape(row.key) + "\n";
  std::vector<std::pair<std::string, std::string>> labels;
  std::size_t labelWidth = 0;
  std::size_t countWidth = 0;
  std::uint64_t most = 1;
  for (const LoggedBucket& bucket : row.buckets) {
    labels.emplace_back(Escape(BucketText(bucket, &bucket == &row.buckets.back())),
                        FigureText(static_cast<double>(bucket.count)));
    labelWidth = std::max(labelWidth, labels.back().first.size());
    countWidth = std::max(countWidth, labels.back().second.size());
    most = std::max(most, bucket.count);
  }
  const std::size_t used = 4 + labelWidth + 1 + countWidth + 1;
  const std::size_t room = columns > used + 4 ? std::min(columns - used - 2, kWidestBar) : 0;
  for (std::size_t i = 0; i < labels.size(); ++i) {
    const double share = static_cast<double>(row.buckets[i].count) / static_cast<double>(most);
    text += "    " + LeftAligned(labels[i].first, labelWidth) + " " +
            RightAligned(labels[i].second, countWidth) + (room == 0 ? "" : " " + Bar(share, room)) +
            "\n";
  }
  return text;
}

}  // namespace

std::string LogSummary(const ExportedLog& log, std::size_t columns) {
  std::string text = LogTitle(log) + "\n";
  const auto add = [&](const char* name, const std::string& value) {
    if (!value.empty()) text += "  " + LeftAligned(name, 11) + Escape(value) + "\n";
  };
  add("written", log.created);
  add("OS", log.osVersion.value_or(""));
  add("whitelist", log.whitelist.value_or(""));
  add("tasking", log.tasking.value_or(""));
  text += Scalars(log, columns) + Distributions(log, columns);
  if (!log.histograms.empty()) text += "\nHistograms\n";
  for (const HistogramRow& row : log.histograms) text += Histogram(row, columns);
  return text;
}

}  // namespace quorlet
