// What a publisher of kernel data describes and reports: the legend of its channels, and runs of
// raw element records.
#ifndef QUORLET_PLATFORM_LINUX_LIVE_LIVE_PUBLISHER_H_
#define QUORLET_PLATFORM_LINUX_LIVE_LIVE_PUBLISHER_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <map>
#include <span>
#include <string>
#include <tuple>
#include <vector>

#include "drvreport/property_value.h"
#include "platform/report_records.h"
#include "values/byte_writer.h"

namespace quorlet {

// Which channels of a legend belong together; their names must be clean.
struct LiveGroup {
  std::string group;
  std::string subgroup;  // may be empty
  std::uint64_t unit = 0;
  Data bucketConfig = {};  // of a histogram
};

struct LiveChannel {
  std::uint64_t id = 0;
  std::string name;
  ReportFormat format = ReportFormat::kSimple;
  std::size_t elements = 1;
  bool isDaily = false;  // belongs into the daily record
};

// A driver's channels as they are described to readers.
class LiveLegend {
 public:
  // Leaves out a channel whose ID is taken, and one of no or more than 65,535 elements.
  void add(const LiveGroup& group, const LiveChannel& channel);
  bool empty() const { return types_.empty(); }
  // The groups in the order of their first channels.
  const Array& groups() const { return groups_; }
  // The channel's type word, or 0.
  std::uint64_t typeOf(std::uint64_t id) const;

 private:
  Array groups_;
  std::map<std::tuple<std::string, std::string, std::uint64_t>, Array> channels_;
  std::map<std::uint64_t, std::uint64_t> types_;
};

// One record's values: the integer of a simple channel; a state's ID, transitions and residency; a
// bucket's hits, minimum, maximum and sum.
using LiveValues = std::array<std::int64_t, kRawElementValues>;

// What a driver's channels report at one moment.
class LiveRuns {
 public:
  // `now` becomes the time stamp of simple channels and histograms; those of states stay 0, because
  // which one is current is not known.
  LiveRuns(std::uint64_t driverID, const LiveLegend& legend, std::uint64_t now)
      : driverID_(driverID), legend_(&legend), now_(now) {}

  // Leaves out a channel that the legend does not have with so many elements.
  void add(std::uint64_t id, std::span<const LiveValues> records);
  void addSimple(std::uint64_t id, std::int64_t value);
  // Valid while nothing is added; empty for a channel that reports nothing.
  std::span<const std::byte> find(std::uint64_t id) const;

 private:
  struct Place {
    std::size_t offset = 0;
    std::size_t length = 0;
  };
  std::uint64_t driverID_;
  const LiveLegend* legend_;
  std::uint64_t now_;
  ByteWriter bytes_;
  std::map<std::uint64_t, Place> places_;
};

// Turns one kind of kernel data into channels. What cannot be read is left out, value by value.
class LivePublisher {
 public:
  virtual ~LivePublisher() = default;
  // Looks for what there is now.
  virtual LiveLegend describe() = 0;
  // Reads what was there at the last describe(); what has been replaced since is left out.
  virtual void read(LiveRuns& runs) = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_LIVE_LIVE_PUBLISHER_H_
