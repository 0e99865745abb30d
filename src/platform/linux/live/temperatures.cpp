// Temperatures: /sys/class/thermal/thermal_zone*/temp and /sys/class/hwmon/hwmon*/temp*_input, in
// thousandths of a degree Celsius, one simple channel each.
//
// A sensor is asked only where that wakes nothing: not while its device sleeps, and never through
// drivetemp, whose question a disk may have to spin up for.
#include <algorithm>

#include "platform/linux/base/kernel_text.h"
#include "platform/linux/live/publishers.h"

namespace quorlet {
namespace {

constexpr char kZones[] = "/sys/class/thermal";
constexpr char kMonitors[] = "/sys/class/hwmon";
constexpr char kGroup[] = "Temperatures";
constexpr std::string_view kInput = "_input";
constexpr std::size_t kMaxSensors = 4096;
// Colder than nothing, and hotter than what any sensor survives.
constexpr std::int64_t kLowest = -273'150;
constexpr std::int64_t kHighest = 2'000'000;

struct Sensor {
  std::uint64_t id = 0;
  std::string directory;
  std::string file;      // in the directory
  std::string kindFile;  // that says what the directory is, if it is there
  std::optional<std::string> kind;
  std::string device;  // the directory of the class
  std::string link;    // where it points
};

// A device without power management of its own is as awake as the one that it sits in.
bool IsAsleep(const std::string& directory) {
  for (const char* device : {"/device", "/device/device"}) {
    const auto status = ReadKernelText(directory + device + "/power/runtime_status");
    if (status && (*status == "suspended" || *status == "suspending")) return true;
  }
  return false;
}

class TemperaturesPublisher : public LivePublisher {
 public:
  explicit TemperaturesPublisher(const LoggingRoot& root) : root_(root) {}

  LiveLegend describe() override {
    sensors_.clear();
    LiveLegend legend;
    const std::string zones = root_.kernelPath(kZones);
    for (const auto& [number, name] : NumberedNames(root_, zones, "thermal_zone")) {
      const std::string directory = JoinPath(zones, name);
      const auto kind = ReadKernelText(directory + "/type");
      if (!kind) continue;
      // The zone itself is nowhere; the device that it belongs to may be.
      const std::string device = LinkTarget(directory + "/device");
      const std::string place = CleanName(device.substr(device.rfind('/') + 1));
      add(legend, CleanName(*kind) + (place.empty() ? "" : " " + place), CleanName(*kind),
          {0, directory, "temp", "type", kind, directory, LinkTarget(directory)});
    }
    const std::string monitors = root_.kernelPath(kMonitors);
    for (const auto& [number, name] : NumberedNames(root_, monitors, "hwmon")) {
      addMonitor(legend, JoinPath(monitors, name));
    }
    return legend;
  }

  void read(LiveRuns& runs) override {
    for (const Sensor& sensor : sensors_) {
      const bool isSame =
          LinkTarget(sensor.device) == sensor.link &&
          ReadKernelText(JoinPath(sensor.directory, sensor.kindFile)) == sensor.kind;
      if (!isSame || IsAsleep(sensor.device)) continue;
      const auto temperature = ReadInteger(JoinPath(sensor.directory, sensor.file));
      if (temperature && *temperature >= kLowest && *temperature <= kHighest) {
        runs.addSimple(sensor.id, *temperature);
      }
    }
  }

 private:
  void addMonitor(LiveLegend& legend, const std::string& directory) {
    // A driver may have its files with the device, and need not give the chip a name.
    for (const char* place : {"", "/device"}) {
      if (addSensors(legend, directory, directory + place)) return;
    }
  }

  // False where there are none.
  bool addSensors(LiveLegend& legend, const std::string& monitor, const std::string& directory) {
    std::vector<std::string> inputs = root_.names(directory);
    std::erase_if(inputs, [](const std::string& file) {
      return !file.starts_with("temp") || !file.ends_with(kInput) ||
             !NumberBehind("temp", file.substr(0, file.size() - kInput.size()));
    });
    if (inputs.empty()) return false;
    const auto kind = ReadKernelText(directory + "/name");
    if (kind == "drivetemp") return true;
    const std::string link = LinkTarget(monitor);
    const std::string place = DevicePlace(link);
    const std::string chip = kind ? CleanName(*kind) : "hwmon";
    const std::string stable = chip + (place.empty() ? "" : " " + place);
    for (const std::string& file : inputs) {
      const std::string sensor = file.substr(0, file.size() - kInput.size());
      const auto label = ReadKernelText(JoinPath(directory, sensor) + "_label");
      const std::string shown = label && !label->empty() ? *label : sensor;
      add(legend, stable, chip + " " + CleanName(shown),
          {HashedID(sensor), directory, file, "name", kind, monitor, link});
    }
    return true;
  }

  // Two devices may say the same of themselves; their order tells them apart.
  void add(LiveLegend& legend, const std::string& stable, const std::string& name, Sensor sensor) {
    if (sensors_.size() == kMaxSensors) return;
    const std::string place = stable + "\n" + std::to_string(sensor.id);
    std::uint64_t id = HashedID(place);
    for (int number = 2; legend.typeOf(id) != 0; ++number) {
      id = HashedID(place + "\n" + std::to_string(number));
    }
    sensor.id = id;
    legend.add({.group = kGroup, .subgroup = stable, .unit = kMillidegrees},
               {.id = id, .name = name});
    sensors_.push_back(std::move(sensor));
  }

  const LoggingRoot root_;
  std::vector<Sensor> sensors_;
};

}  // namespace

std::unique_ptr<LivePublisher> MakeTemperaturesPublisher(const LoggingRoot& root) {
  return std::make_unique<TemperaturesPublisher>(root);
}

}  // namespace quorlet
