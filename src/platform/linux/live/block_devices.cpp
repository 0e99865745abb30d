// Traffic of block devices: /sys/block/*/stat, simple channels for each device, and the totals of
// the fixed disks for the daily record.
//
// Names like sda change hands between boots: a device's subgroup and channel IDs come from what the
// device says of itself (WWID, card ID, serial number), otherwise from where it is plugged in. The
// kernel gives each disk that appears a new number (diskseq), which tells that a name has changed
// hands meanwhile.
#include <algorithm>
#include <array>
#include <cerrno>
#include <set>
#include <variant>

#include "platform/linux/base/kernel_text.h"
#include "platform/linux/live/publishers.h"
#include "platform/linux/live/running_totals.h"

namespace quorlet {
namespace {

constexpr char kBlockDevices[] = "/sys/block";
constexpr char kGroup[] = "Block Devices";
constexpr std::size_t kMaxDevices = 4096;
constexpr std::uint64_t kSectorBytes = 512;
// What is in milliseconds is kept in 32 bits.
constexpr std::uint64_t kMillisecondsRange = std::uint64_t{1} << 32;

// One number of the line, counted from 0.
struct Column {
  std::size_t field;
  const char* key;
  const char* name;
  std::uint64_t unit;
  std::uint64_t factor = 1;
  std::uint64_t range = 0;
  const char* dailyName = nullptr;  // of the total of all fixed disks
};
// clang-format off
constexpr auto kColumns = std::to_array<Column>({
    {2,  "rbytes",   "bytes read",      kBytes, kSectorBytes, 0, "disk.bytes.read"},
    {6,  "wbytes",   "bytes written",   kBytes, kSectorBytes, 0, "disk.bytes.written"},
    {13, "dbytes",   "bytes discarded", kBytes, kSectorBytes},
    {0,  "reads",    "reads",           kEvents, 1, 0, "disk.reads"},
    {4,  "writes",   "writes",          kEvents, 1, 0, "disk.writes"},
    {11, "discards", "discards",        kEvents},
    {15, "flushes",  "flushes",         kEvents},
    {9,  "busy",     "busy",            kMilliseconds, 1, kMillisecondsRange},
});
// clang-format on
constexpr std::size_t kInFlightField = 8;

struct BlockDevice {
  std::string name;
  std::string directory;
  std::string link;
  std::string sequence;  // of the disk; empty on a kernel that does not number them
  std::string identity;
  bool isFixedDisk = false;

  std::uint64_t channelID(std::string_view key) const {
    return HashedID(identity + "\n" + std::string(key));
  }
};

std::string Sequence(const std::string& directory) {
  return ReadKernelText(directory + "/diskseq").value_or("");
}

// Built from other devices, whose traffic would count twice, or from memory.
bool IsVirtual(const BlockDevice& device) {
  constexpr std::array<std::string_view, 5> kKinds = {"loop", "ram", "zram", "dm-", "md"};
  return device.link.find("/virtual/block/") != std::string::npos ||
         std::ranges::any_of(kKinds, [&](auto kind) { return device.name.starts_with(kind); });
}

std::string Identity(const BlockDevice& device) {
  for (const char* attribute : {"/wwid", "/device/wwid", "/device/cid", "/device/serial"}) {
    const auto text = ReadKernelText(device.directory + attribute);
    if (text && !text->empty()) return CleanName(*text);
  }
  const std::string place = DevicePlace(device.link);
  return place.empty() ? CleanName(device.name) : place;
}

class BlockDevicesPublisher : public LivePublisher {
 public:
  explicit BlockDevicesPublisher(const LoggingRoot& root) : root_(root) {}

  LiveLegend describe() override {
    find();
    LiveLegend legend;
    if (std::ranges::any_of(devices_, &BlockDevice::isFixedDisk)) {
      for (const Column& column : kColumns) {
        if (column.dailyName == nullptr) continue;
        legend.add({.group = kGroup, .subgroup = "", .unit = column.unit},
                   {.id = PackedID(column.key), .name = column.dailyName, .isDaily = true});
      }
    }
    for (const BlockDevice& device : devices_) {
      const std::string name = CleanName(device.name) + " ";
      for (const Column& column : kColumns) {
        legend.add({.group = kGroup, .subgroup = device.identity, .unit = column.unit},
                   {.id = device.channelID(column.key), .name = name + column.name});
      }
      legend.add({.group = kGroup, .subgroup = device.identity, .unit = kEvents},
                 {.id = device.channelID("inflight"), .name = name + "in flight"});
    }
    return legend;
  }

  void read(LiveRuns& runs) override {
    std::set<std::string> unknownTotals;
    for (const BlockDevice& device : devices_) {
      if (!isStillThere(device)) continue;
      const auto line = ReadWholeFile(device.directory + "/stat", kMaxAttributeBytes);
      const int* error = std::get_if<int>(&line);
      if (error != nullptr && (*error == ENOENT || *error == ENODEV)) continue;  // it has gone
      const auto words =
          error == nullptr ? Words(std::get<std::string>(line)) : std::vector<std::string_view>();
      for (const Column& column : kColumns) {
        const auto value = add(device, column, words);
        if (value) runs.addSimple(device.channelID(column.key), *value);
        if (!device.isFixedDisk || column.dailyName == nullptr) continue;
        if (value) {
          ofDisks_[column.key][device.identity] = *value;
        } else {
          unknownTotals.insert(column.key);
        }
      }
      if (words.size() <= kInFlightField) continue;
      if (const auto inFlight = ParseCounter(words[kInFlightField])) {
        runs.addSimple(device.channelID("inflight"), static_cast<std::int64_t>(*inFlight));
      }
    }
    addTotals(unknownTotals, runs);
  }

 private:
  void find() {
    devices_.clear();
    const std::string directory = root_.kernelPath(kBlockDevices);
    std::map<std::string, int> identities;
    for (std::string& name : root_.names(directory)) {
      if (devices_.size() == kMaxDevices) break;
      BlockDevice device;
      device.directory = JoinPath(directory, name);
      device.name = std::move(name);
      // Another way to a disk that is there already, or no medium.
      if (ReadCounter(device.directory + "/hidden") == 1u) continue;
      if (ReadCounter(device.directory + "/size") == 0u) continue;
      device.link = LinkTarget(device.directory);
      device.sequence = Sequence(device.directory);
      device.isFixedDisk = !IsVirtual(device) && ReadCounter(device.directory + "/removable") != 1u;
      device.identity = Identity(device);
      const int number = ++identities[device.identity];
      if (number > 1) device.identity += " #" + std::to_string(number);
      devices_.push_back(std::move(device));
    }
  }

  // Whether the name still is that of the same device.
  static bool isStillThere(const BlockDevice& device) {
    return LinkTarget(device.directory) == device.link &&
           Sequence(device.directory) == device.sequence;
  }

  std::optional<std::int64_t> add(const BlockDevice& device, const Column& column,
                                  const std::vector<std::string_view>& words) {
    if (column.field >= words.size()) return std::nullopt;
    const auto count = ParseCounter(words[column.field]);
    if (!count || *count > INT64_MAX / column.factor) return std::nullopt;
    return totals_.add(device.channelID(column.key), 0, *count * column.factor, column.range,
                       HashedID(device.sequence));
  }

  // What a disk has done counts after it has gone, too.
  void addTotals(const std::set<std::string>& unknown, LiveRuns& runs) const {
    for (const auto& [key, disks] : ofDisks_) {
      std::int64_t total = 0;
      bool fits = !unknown.contains(key);
      for (const auto& [disk, value] : disks) {
        fits = fits && !__builtin_add_overflow(total, value, &total);
      }
      if (fits) runs.addSimple(PackedID(key), total);
    }
  }

  const LoggingRoot root_;
  std::vector<BlockDevice> devices_;
  RunningTotals totals_;
  std::map<std::string, std::map<std::string, std::int64_t>> ofDisks_;  // by column key, by disk
};

}  // namespace

std::unique_ptr<LivePublisher> MakeBlockDevicesPublisher(const LoggingRoot& root) {
  return std::make_unique<BlockDevicesPublisher>(root);
}

}  // namespace quorlet
