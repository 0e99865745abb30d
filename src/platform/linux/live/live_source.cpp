#include "platform/linux/live/live_source.h"

#include <time.h>

#include <utility>

#include "platform/linux/live/publishers.h"

namespace quorlet {
namespace {

constexpr std::string_view kClass = "QuorletLiveChannels";
constexpr std::uint64_t kFirstEntryID = 0x4C00'0000'0000'0001;

// Since the machine started, with the time that it slept.
std::uint64_t NanosecondsNow() {
  timespec now = {};
  clock_gettime(CLOCK_BOOTTIME, &now);
  return static_cast<std::uint64_t>(now.tv_sec) * 1'000'000'000 +
         static_cast<std::uint64_t>(now.tv_nsec);
}

class LiveDriver {
 public:
  LiveDriver(std::string name, std::unique_ptr<LivePublisher> publisher)
      : name_(std::move(name)), publisher_(std::move(publisher)) {}

  const std::string& name() const { return name_; }
  const LiveLegend& describe() {
    legend_ = publisher_->describe();
    return legend_;
  }
  void forget() { runs_.reset(); }
  std::span<const std::byte> elements(std::uint64_t id, std::uint64_t channelID) {
    if (!runs_) {
      runs_.emplace(id, legend_, NanosecondsNow());
      publisher_->read(*runs_);
    }
    return runs_->find(channelID);
  }

 private:
  std::string name_;
  std::unique_ptr<LivePublisher> publisher_;
  LiveLegend legend_;
  std::optional<LiveRuns> runs_;
};

class LiveChannels : public EntrySource {
 public:
  LiveChannels(const LoggingRoot& root, std::unique_ptr<LivePublisher> drives) {
    // The place in this list makes the entry ID: new ones go to the end.
    drivers_.emplace_back("cpu-idle", MakeCpuIdlePublisher(root));
    drivers_.emplace_back("cpu-frequency", MakeCpuFrequencyPublisher(root));
    drivers_.emplace_back("block-devices", MakeBlockDevicesPublisher(root));
    drivers_.emplace_back("temperatures", MakeTemperaturesPublisher(root));
    drivers_.emplace_back("energy", MakeEnergyPublisher(root));
    drivers_.emplace_back("pressure", MakePressurePublisher(root));
    drivers_.emplace_back("memory-activity", MakeMemoryActivityPublisher(root));
    drivers_.emplace_back("run-queue", MakeRunQueuePublisher(root));
    if (drives != nullptr) drivers_.emplace_back("drives", std::move(drives));
  }

  std::vector<RegistryEntry> entries() override {
    std::vector<RegistryEntry> entries;
    for (std::size_t i = 0; i < drivers_.size(); ++i) {
      const LiveLegend& legend = drivers_[i].describe();
      if (legend.empty()) continue;
      RegistryEntry entry;
      entry.id = kFirstEntryID + i;
      entry.name = drivers_[i].name();
      entry.className = kClass;
      entry.properties["DrvReportLegendPublic"] = true;
      entry.properties["DrvReportLegend"] = legend.groups();
      entries.push_back(std::move(entry));
    }
    return entries;
  }

  void refreshElements() override {
    isRefreshed_ = true;
    for (LiveDriver& driver : drivers_) driver.forget();
  }

  std::span<const std::byte> elements(std::uint64_t driverID, std::uint64_t channelID) override {
    const std::uint64_t index = driverID - kFirstEntryID;
    if (!isRefreshed_ || index >= drivers_.size()) return {};
    return drivers_[static_cast<std::size_t>(index)].elements(driverID, channelID);
  }

 private:
  std::vector<LiveDriver> drivers_;
  bool isRefreshed_ = false;
};

}  // namespace

std::unique_ptr<EntrySource> MakeLiveChannels(const LoggingRoot& root,
                                              std::unique_ptr<LivePublisher> drives) {
  return std::make_unique<LiveChannels>(root, std::move(drives));
}

}  // namespace quorlet
