// Any texts of /proc and /sys: channels that can be described, each with an ID of its own, and runs
// of whole records that say whose they are.
#include <filesystem>
#include <set>

#include "drvreport/drvreport.h"
#include "fakes/fake_driver_registry.h"
#include "fakes/fake_system_log.h"
#include "fuzz_support.h"
#include "platform/linux/base/kernel_text.h"
#include "platform/linux/live/live_source.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

#define CPU "/sys/devices/system/cpu/cpu0/"
#define DISK "/sys/devices/pci0000:00/0000:00:17.0/ata2/host1/target1:0:0/1:0:0:0/block/sda"

constexpr const char* kPaths[] = {
    "/proc/stat",
    CPU "cpuidle/state0/name",
    CPU "cpuidle/state0/usage",
    CPU "cpuidle/state0/time",
    CPU "cpufreq/stats/time_in_state",
    CPU "cpufreq/stats/trans_table",
    "/proc/vmstat",
    "/proc/pressure/io",
    "/proc/schedstat",
    "/sys/class/powercap/intel-rapl:0/name",
    "/sys/class/powercap/intel-rapl:0/max_energy_range_uj",
    "/sys/class/thermal/thermal_zone0/type",
    "/sys/class/thermal/thermal_zone0/temp",
    "/sys/class/hwmon/hwmon3/name",
    "/sys/class/hwmon/hwmon3/temp1_input",
    "/sys/class/hwmon/hwmon3/temp1_label",
    DISK "/size",
    DISK "/diskseq",
};
// Read twice, with other texts.
constexpr const char* kChangingPaths[] = {
    DISK "/stat",
    "/sys/class/powercap/intel-rapl:0/energy_uj",
    CPU "cpuidle/state0/time",
};
constexpr std::size_t kParts = std::size(kPaths) + 2 * std::size(kChangingPaths);
constexpr std::size_t kRecordBytes = 64;

void CheckRun(std::span<const std::byte> run, std::uint64_t driver, std::uint64_t channel,
              std::uint64_t type) {
  Expect(run.size() % kRecordBytes == 0, "half a record");
  for (ByteReader reader(run); reader.remaining() != 0; reader.skip(kRecordBytes - 24)) {
    Expect(reader.little<std::uint64_t>() == driver, "a record of another driver");
    Expect(reader.little<std::uint64_t>() == channel, "a record of another channel");
    Expect(reader.little<std::uint64_t>() == type, "a record of another type");
  }
}

std::size_t CheckGroup(EntrySource& source, const RegistryEntry& entry, const Dictionary& group,
                       std::set<std::uint64_t>& seen) {
  std::size_t count = 0;
  for (const PropertyValue& channel : *ArrayEntry(group, "DrvReportChannels")) {
    const Array& legend = *channel.asArray();
    const auto id = static_cast<std::uint64_t>(legend[0].asNumber()->toInt64());
    const auto type = static_cast<std::uint64_t>(legend[1].asNumber()->toInt64());
    Expect(seen.insert(id).second, "an ID twice");
    CheckRun(source.elements(entry.id, id), entry.id, id, type);
    ++count;
  }
  return count;
}

std::size_t Read(EntrySource& source) {
  FakeDriverRegistry registry;
  std::size_t count = 0;
  const auto entries = source.entries();
  source.refreshElements();
  for (const RegistryEntry& entry : entries) {
    std::set<std::uint64_t> seen;
    for (const PropertyValue& group : *ArrayEntry(entry.properties, "DrvReportLegend")) {
      count += CheckGroup(source, entry, *group.asDictionary(), seen);
    }
    FakeEntry& published = registry.entries.emplace_back();
    published.id = entry.id;
    published.name = entry.name;
    published.properties = entry.properties;
  }
  const auto channels = DrvReportCopyAllChannels(registry, 0);
  Expect(channels && DrvReportGetChannelCount(*channels) == static_cast<std::int64_t>(count),
         "channels that cannot be copied");
  return count;
}

void CheckTexts(std::string_view text) {
  const std::string name = CleanName(text);
  Expect(name.size() <= 64 && CleanName(name) == name, "a name is not clean", name);
  Expect(DevicePlace(text).size() <= text.size(), "a place is longer than its path");
  const auto number = ParseCounter(text);
  Expect(!number || ParseCounter(std::to_string(*number)) == number, "a counter has changed");
}

}  // namespace
}  // namespace quorlet

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  static FuzzFiles files;
  static const bool isLinked = [] {
    std::filesystem::create_directories(files.device().path("/sys/block"));
    std::filesystem::create_directory_symlink(std::string("..").append(&DISK[4]),
                                              files.device().path("/sys/block/sda"));
    return true;
  }();
  Expect(isLinked, "no link");
  const auto parts = Parts(AsText(data, size), kParts);
  std::size_t next = 0;
  for (const char* path : kPaths) {
    CheckTexts(parts[next]);
    files.set(path, parts[next++]);
  }
  for (const char* path : kChangingPaths) files.set(path, parts[next++]);
  FakeSystemLog log;
  const auto source = MakeLiveChannels(LoggingRoot(files.device().root(), log));
  const std::size_t count = Read(*source);
  Expect(Read(*source) == count, "other channels at once");
  for (const char* path : kChangingPaths) files.set(path, parts[next++]);
  Read(*source);
  return 0;
}
