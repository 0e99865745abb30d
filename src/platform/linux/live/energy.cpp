// Energy that the machine has used: /sys/class/powercap/*/energy_uj, one simple channel a zone.
// Most kernels let only root read it.
//
// Zones are numbered ("intel-rapl:0:1"); their names ("package-0", below it "core") are stable.
#include "platform/linux/base/kernel_text.h"
#include "platform/linux/live/publishers.h"
#include "platform/linux/live/running_totals.h"

namespace quorlet {
namespace {

constexpr char kZones[] = "/sys/class/powercap";
constexpr std::size_t kMaxZones = 1024;

struct Zone {
  std::uint64_t id = 0;
  std::string directory;
  std::string name;
};

class EnergyPublisher : public LivePublisher {
 public:
  explicit EnergyPublisher(const LoggingRoot& root) : root_(root) {}

  LiveLegend describe() override {
    zones_.clear();
    LiveLegend legend;
    const std::string directory = root_.kernelPath(kZones);
    std::map<std::string, int> names;
    for (const std::string& zoneName : root_.names(directory)) {
      const std::size_t controlEnd = zoneName.find(':');
      if (controlEnd == std::string::npos || zones_.size() == kMaxZones) continue;
      std::string name = fullName(directory, zoneName, controlEnd);
      const std::string control = CleanName(zoneName.substr(0, controlEnd));
      if (name.empty()) continue;
      const int number = ++names[JoinPath(control, name)];
      if (number > 1) name.append(" #").append(std::to_string(number));
      const Zone zone{HashedID(JoinPath(control, name)), JoinPath(directory, zoneName), name};
      legend.add({.group = "Energy", .subgroup = control, .unit = kMicrojoules},
                 {.id = zone.id, .name = name});
      zones_.push_back(zone);
    }
    return legend;
  }

  void read(LiveRuns& runs) override {
    for (const Zone& zone : zones_) {
      const auto energy = ReadCounter(zone.directory + "/energy_uj");
      if (!energy) continue;
      // Without its range a fall looks like a new start.
      const auto range = ReadCounter(zone.directory + "/max_energy_range_uj");
      runs.addSimple(zone.id, totals_.add(zone.id, 0, *energy, range.value_or(0)));
    }
  }

 private:
  // The names of the zones that it is part of, and its own; empty when one cannot be read.
  static std::string fullName(const std::string& directory, const std::string& zoneName,
                              std::size_t controlEnd) {
    std::string name;
    for (std::size_t end = controlEnd; end != std::string::npos;) {
      end = zoneName.find(':', end + 1);
      const auto part = ReadKernelText(JoinPath(directory, zoneName.substr(0, end)) + "/name");
      if (!part || part->empty()) return {};
      name += (name.empty() ? "" : " ") + CleanName(*part);
    }
    return CleanName(name);
  }

  const LoggingRoot root_;
  std::vector<Zone> zones_;
  RunningTotals totals_;
};

}  // namespace

std::unique_ptr<LivePublisher> MakeEnergyPublisher(const LoggingRoot& root) {
  return std::make_unique<EnergyPublisher>(root);
}

}  // namespace quorlet
