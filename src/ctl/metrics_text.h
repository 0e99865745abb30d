// Samples of reporting channels in the text formats of Prometheus and OpenMetrics.
#ifndef QUORLET_CTL_METRICS_TEXT_H_
#define QUORLET_CTL_METRICS_TEXT_H_

#include <map>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "drvreport/drvreport.h"

namespace quorlet {

enum class MetricsFormat { kPrometheus, kOpenMetrics };

// Collects samples and writes them by family. Values are scaled to the base unit of their quantity;
// those of units that have none (a processor's ticks) stay, and the label "unit" names theirs.
//   quorlet_channel[_UNIT]                     a simple channel: unknown whether it counts
//   quorlet_channel_array[_UNIT]               a value of an array, by "index"
//   quorlet_channel_state[_UNIT]_total         time in a state, by "state"
//   quorlet_channel_state_transitions_total    how often it was entered
//   quorlet_channel_distribution[_UNIT]        a histogram whose buckets have bounds
// A channel is told by the labels "driver", "channel", "group", "subgroup" and the IDs of both. No
// series is written twice.
class MetricsText {
 public:
  explicit MetricsText(MetricsFormat format) : format_(format) {}

  void add(Dictionary& sample);
  std::string text() const;

 private:
  struct Family {
    std::string_view type;  // of OpenMetrics
    std::string_view unit;
    std::string_view help;
    std::vector<std::string> lines;
  };
  struct Channel;

  Family& family(const std::string& name, std::string_view type, std::string_view unit,
                 std::string_view help);
  void addLine(Family& family, const std::string& series, const std::string& value);
  void addStates(const Channel& channel, const Array& states);
  void addHistogram(const Channel& channel, const Array& buckets);

  const MetricsFormat format_;
  std::map<std::string, Family> families_;
  std::set<std::string> series_;
};

}  // namespace quorlet

#endif  // QUORLET_CTL_METRICS_TEXT_H_
