// Logs as one page for a browser: no script is needed to read it, and nothing is fetched.
#ifndef QUORLET_CTL_LOG_PAGE_H_
#define QUORLET_CTL_LOG_PAGE_H_

#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "ctl/export_log.h"

namespace quorlet {

// Texts of logs are hostile: on the page they are text, whatever they hold.
class LogPage {
 public:
  // Keeps what it shows of the log. Of two logs of one type and day, the one created last counts.
  void add(const ExportedLog& log);
  // A key that was counted, but that no log holds, and why.
  void addUnreported(std::string_view key, std::string_view why);

  bool empty() const { return days_.empty(); }
  // The page, in UTF-8.
  std::string html() const;

 private:
  struct Scalar {
    std::string text;
    std::optional<double> number;
  };
  struct Distribution {
    double minimum, maximum, mean, spread;
    std::uint64_t count;
  };
  struct Bucket {
    std::string label;
    std::uint64_t count;
  };
  struct Day {
    std::string title, date, created, osVersion, whitelist, tasking, device;
    bool isStatusLog = false;
    std::map<std::string, Scalar> scalars;
    std::map<std::string, Distribution> distributions;
    std::map<std::string, std::vector<Bucket>> histograms;
  };

  void addLogs(std::string& page) const;
  void addScalars(std::string& page, bool ofStorage) const;
  void addScalar(std::string& page, const std::string& key) const;
  void addDistributions(std::string& page) const;
  void addHistograms(std::string& page) const;
  void addUnreported(std::string& page) const;
  const Day* last() const;

  // By day, and within it the status log behind the aggregated one.
  std::map<std::pair<std::int64_t, bool>, Day> days_;
  std::vector<std::pair<std::string, std::string>> unreported_;
};

}  // namespace quorlet

#endif  // QUORLET_CTL_LOG_PAGE_H_
