#include "ctl/log_page.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <set>

#include "ctl/figure_text.h"
#include "ctl/log_page_style.h"
#include "ctl/output.h"

namespace quorlet {
namespace {

constexpr int kLineWidth = 120;
constexpr int kLineHeight = 24;

// Text in an element or an attribute.
std::string Html(std::string_view text) {
  std::string html;
  for (const char c : Escape(text)) {
    switch (c) {
      case '&':
        html += "&amp;";
        break;
      case '<':
        html += "&lt;";
        break;
      case '>':
        html += "&gt;";
        break;
      case '"':
        html += "&quot;";
        break;
      case '\'':
        html += "&#39;";
        break;
      default:
        html += c;
    }
  }
  return html;
}

std::string Cell(const std::string& text) { return "<td>" + Html(text) + "</td>"; }
std::string NumberCell(const std::string& text) {
  return "<td class=\"number\">" + Html(text) + "</td>";
}

std::string Table(std::string_view caption, std::initializer_list<std::string_view> titles) {
  std::string table =
      "<div class=\"wide\"><table><caption>" + Html(caption) + "</caption><thead><tr>";
  for (const std::string_view title : titles) {
    table += "<th scope=\"col\">" + Html(title) + "</th>";
  }
  return table + "</tr></thead><tbody>\n";
}
constexpr char kTableEnd[] = "</tbody></table></div>\n";

std::string Coordinate(double value) {
  std::array<char, 32> text{};
  std::snprintf(text.data(), text.size(), "%.1f", value);
  return text.data();
}

std::string Picture(int width, int height, const std::string& label, const std::string& content) {
  const std::string size[] = {std::to_string(width), std::to_string(height)};
  return "<svg width=\"" + size[0] + "\" height=\"" + size[1] + "\" viewBox=\"0 0 " + size[0] +
         " " + size[1] + "\" role=\"img\" aria-label=\"" + Html(label) + "\">" + content + "</svg>";
}

// How a figure went from day to day; nothing for less than two days.
std::string TrendPicture(const std::vector<double>& values) {
  if (values.size() < 2) return "";
  const auto [low, high] = std::ranges::minmax(values);
  const double span = high > low ? high - low : 1;
  std::string points;
  for (std::size_t i = 0; i < values.size(); ++i) {
    const double x =
        2 + (kLineWidth - 4) * static_cast<double>(i) / static_cast<double>(values.size() - 1);
    const double y = kLineHeight - 3 - (kLineHeight - 6) * (values[i] - low) / span;
    points += (i == 0 ? "" : " ") + Coordinate(x) + "," + Coordinate(y);
  }
  return Picture(kLineWidth, kLineHeight,
                 "from " + FigureText(values.front()) + " to " + FigureText(values.back()) +
                     " in " + std::to_string(values.size()) + " days",
                 "<polyline points=\"" + points + "\"/>");
}

// Minimum to maximum as a line, one deviation around the mean as a box.
std::string RangePicture(double minimum, double maximum, double mean, double spread) {
  if (!(maximum > minimum) || !std::isfinite(maximum - minimum)) return "";
  const auto at = [&](double value) {
    return 2 +
           (kLineWidth - 4) * (std::clamp(value, minimum, maximum) - minimum) / (maximum - minimum);
  };
  const double left = at(mean - spread);
  return Picture(kLineWidth, kLineHeight,
                 "mean " + FigureText(mean) + " between " + FigureText(minimum) + " and " +
                     FigureText(maximum),
                 "<line x1=\"2\" y1=\"12\" x2=\"118\" y2=\"12\"/><rect x=\"" + Coordinate(left) +
                     "\" y=\"6\" width=\"" + Coordinate(at(mean + spread) - left) +
                     "\" height=\"12\"/><line class=\"mean\" x1=\"" + Coordinate(at(mean)) +
                     "\" y1=\"4\" x2=\"" + Coordinate(at(mean)) + "\" y2=\"20\"/>");
}

bool IsOfStorage(std::string_view key) {
  return key.starts_with("nuvex.NANDInfo.") || key.starts_with("nuvex.flash.") ||
         (key.starts_with("nuvex.tilehall.") && key.find(".Disk") != std::string_view::npos);
}

}  // namespace

void LogPage::add(const ExportedLog& log) {
  Day& day = days_[{log.day, log.isStatusLog}];
  if (!day.created.empty() && day.created > log.created) return;
  day = {};
  day.title = LogTitle(log);
  day.date = log.dayText;
  day.created = log.created;
  day.osVersion = log.osVersion.value_or("");
  day.whitelist = log.whitelist.value_or("");
  day.tasking = log.tasking.value_or("");
  day.device = log.device.value_or("");
  day.isStatusLog = log.isStatusLog;
  for (const ScalarRow& row : log.scalars) {
    const auto* number = std::get_if<Number>(&row.value);
    day.scalars[std::string(row.key)] = {
        ValueText(row), number != nullptr ? std::optional(number->toDouble()) : std::nullopt};
  }
  for (const DistributionRow& row : log.distributions) {
    day.distributions[std::string(row.key)] = {row.minimum.toDouble(), row.maximum.toDouble(),
                                               row.mean.toDouble(), Spread(row), row.count};
  }
  for (const HistogramRow& row : log.histograms) {
    auto& buckets = day.histograms[std::string(row.key)];
    for (const LoggedBucket& bucket : row.buckets) {
      buckets.push_back({BucketText(bucket, &bucket == &row.buckets.back()), bucket.count});
    }
  }
}

void LogPage::addUnreported(std::string_view key, std::string_view why) {
  unreported_.emplace_back(key, why);
}

const LogPage::Day* LogPage::last() const {
  const Day* last = nullptr;
  for (const auto& [day, log] : days_) {
    if (!log.isStatusLog) last = &log;
  }
  return last;
}

std::string LogPage::html() const {
  std::string title = "No logs";
  if (days_.size() == 1) title = days_.begin()->second.title;
  if (days_.size() > 1) {
    title = "Logs of " + days_.begin()->second.date + " to " + days_.rbegin()->second.date;
  }
  std::string page =
      "<!DOCTYPE html>\n<html lang=\"en\"><head><meta charset=\"utf-8\">\n"
      "<meta name=\"viewport\" content=\"width=device-width, initial-scale=1\">\n"
      "<title>" +
      Html(title) + "</title>\n<style>" + kPageStyle + "</style></head>\n<body><header><h1>" +
      Html(title) + "</h1></header>\n<main>\n";
  addLogs(page);
  addScalars(page, /*ofStorage=*/false);
  addDistributions(page);
  addHistograms(page);
  addScalars(page, /*ofStorage=*/true);
  addUnreported(page);
  return page + "</main>\n<script>" + kPageScript + "</script>\n</body></html>\n";
}

void LogPage::addLogs(std::string& page) const {
  page += "<section id=\"logs\"><h2>Logs</h2>\n" +
          Table("What was written", {"Log", "Written", "Device", "OS", "Whitelist", "Tasking"});
  for (const auto& [day, log] : days_) {
    page += "<tr><th scope=\"row\">" + Html(log.title) + "</th>" + "<td class=\"when\">" +
            Html(log.created) + "</td>" + Cell(log.device) + Cell(log.osVersion) +
            Cell(log.whitelist) + Cell(log.tasking) + "</tr>\n";
  }
  page += kTableEnd + std::string("</section>\n");
}

void LogPage::addScalars(std::string& page, bool ofStorage) const {
  std::set<std::string> keys;
  for (const auto& [day, log] : days_) {
    for (const auto& [key, scalar] : log.scalars) {
      if ((log.isStatusLog || IsOfStorage(key)) == ofStorage) keys.insert(key);
    }
  }
  if (keys.empty()) return;
  page += ofStorage ? "<section id=\"storage\"><h2>Storage</h2>\n"
                    : "<section id=\"scalars\"><h2>Scalars</h2>\n"
                      "<p hidden><label>Keys that hold <input type=\"search\" id=\"wanted\">"
                      "</label></p>\n";
  page += Table(ofStorage ? "Storage health, day by day" : "Scalars, day by day",
                {"Key", "Last value", "Unit", "Change", "Trend"});
  for (const std::string& key : keys) addScalar(page, key);
  page += kTableEnd + std::string("</section>\n");
}

void LogPage::addScalar(std::string& page, const std::string& key) const {
  std::vector<double> values;
  std::string text;
  for (const auto& [day, log] : days_) {
    const auto found = log.scalars.find(key);
    if (found == log.scalars.end()) continue;
    text = found->second.text;
    const auto number = found->second.number;
    if (number && std::isfinite(*number)) values.push_back(*number);
  }
  std::string change;
  if (values.size() > 1) {
    const double difference = values.back() - values[values.size() - 2];
    change = (difference > 0 ? "+" : "") + FigureText(difference);
  }
  const std::string unit = UnitText(key);
  page += "<tr><th scope=\"row\">" + Html(key) + "</th>" + NumberCell(text) +
          Cell(unit.empty() ? "" : unit.substr(1)) + NumberCell(change) + "<td>" +
          TrendPicture(values) + "</td></tr>\n";
}

void LogPage::addDistributions(std::string& page) const {
  const Day* log = last();
  if (log == nullptr || log->distributions.empty()) return;
  page += "<section id=\"distributions\"><h2>Distributions</h2>\n" +
          Table("Values of the last day",
                {"Key", "Count", "Minimum", "Mean", "Spread", "Maximum", "Range"});
  for (const auto& [key, row] : log->distributions) {
    page += "<tr><th scope=\"row\">" + Html(key) + "</th>" +
            NumberCell(FigureText(static_cast<double>(row.count))) +
            NumberCell(FigureText(row.minimum)) + NumberCell(FigureText(row.mean)) +
            NumberCell(FigureText(row.spread)) + NumberCell(FigureText(row.maximum)) + "<td>" +
            RangePicture(row.minimum, row.maximum, row.mean, row.spread) + "</td></tr>\n";
  }
  page += kTableEnd + std::string("</section>\n");
}

void LogPage::addHistograms(std::string& page) const {
  const Day* log = last();
  if (log == nullptr || log->histograms.empty()) return;
  page += "<section id=\"histograms\"><h2>Histograms</h2>\n";
  for (const auto& [key, buckets] : log->histograms) {
    std::uint64_t most = 1;
    for (const Bucket& bucket : buckets) most = std::max(most, bucket.count);
    page += Table(key, {"Values", "Count", "Share"});
    for (const Bucket& bucket : buckets) {
      const double share = static_cast<double>(bucket.count) / static_cast<double>(most);
      page += "<tr><th scope=\"row\">" + Html(bucket.label) + "</th>" +
              NumberCell(FigureText(static_cast<double>(bucket.count))) + "<td>" +
              Picture(200, 14, FigureText(static_cast<double>(bucket.count)),
                      "<rect x=\"0\" y=\"1\" width=\"" + Coordinate(200 * share) +
                          "\" height=\"12\"/>") +
              "</td></tr>\n";
    }
    page += kTableEnd;
  }
  page += "</section>\n";
}

void LogPage::addUnreported(std::string& page) const {
  if (unreported_.empty()) return;
  page += "<section id=\"unreported\"><h2>Not reported</h2>\n" +
          Table("What was counted, but is in no log", {"Key", "Why"});
  for (const auto& [key, why] : unreported_) {
    page += "<tr><th scope=\"row\">" + Html(key) + "</th>" + Cell(why) + "</tr>\n";
  }
  page += kTableEnd + std::string("</section>\n");
}

}  // namespace quorlet
