// Reporting channels of recorded machines.
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <map>
#include <set>

#include "fakes/fake_system_log.h"
#include "fakes/temp_root.h"
#include "platform/linux/base/kernel_text.h"
#include "platform/linux/live/live_source.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

using Names = std::set<std::string>;

constexpr char kCpu0[] = "/sys/devices/system/cpu/cpu0";
constexpr char kDisks[] = "/sys/devices/pci0000:00/0000:00:17.0/ata2/host1/target1:0:0";

// A machine with one of everything.
class LiveChannelsTest : public testing::Test {
 protected:
  LiveChannelsTest() {
    const std::pair<std::string, std::string> files[] = {
        {"/proc/stat", "cpu  9 9 9 9 9 9 9 9 9 9\ncpu0 1 2 3 1000 50 4 5 6 7 8\nintr 5\n"},
        {"/cpuidle/state0/name", "POLL\n"},
        {"/cpuidle/state0/usage", "7\n"},
        {"/cpuidle/state0/time", "70\n"},
        {"/cpuidle/state10/name", "haltpoll idle\n"},
        {"/cpuidle/state10/usage", "9\n"},
        {"/cpuidle/state10/time", "90000\n"},
        {"/cpuidle/state2/name", "haltpoll deep\n"},
        {"/cpuidle/state2/usage", "8\n"},
        {"/cpuidle/state2/time", "800\n"},
        {"/cpufreq/stats/time_in_state", "2400000 12\n1190400 3\n"},
        {"/cpufreq/stats/trans_table",
         "   From  :    To\n         :   2400000   1190400 \n  2400000:         0         7 \n"
         "  1190400:         8         0 \n"},
        {"/proc/vmstat", "nr_free_pages 1\npgpgin 2\npswpout 3\npgmajfault 4\nunknown x\n"},
        {"/proc/pressure/io",
         "some avg10=1.00 avg60=0.00 avg300=0.00 total=500\n"
         "full avg10=0.00 avg60=0.00 avg300=0.00 total=400\n"},
        {"/proc/schedstat", "version 15\ntimestamp 1\ncpu0 0 0 0 0 0 0 77 5000 10\ndomain0 3 4\n"},
        {"/sys/class/powercap/intel-rapl:0/name", "package-0\n"},
        {"/sys/class/powercap/intel-rapl:0/energy_uj", "900\n"},
        {"/sys/class/powercap/intel-rapl:0/max_energy_range_uj", "1000\n"},
        {"/sys/class/powercap/intel-rapl:0:1/name", "core\n"},
        {"/sys/class/powercap/intel-rapl:0:1/energy_uj", "12\n"},
        {"/sys/class/thermal/thermal_zone0/type", "acpitz\n"},
        {"/sys/class/thermal/thermal_zone0/temp", "-5000\n"},
        {"/sys/class/hwmon/hwmon3/name", "coretemp\n"},
        {"/sys/class/hwmon/hwmon3/temp1_input", "45000\n"},
        {"/sys/class/hwmon/hwmon3/temp1_label", "Package id 0\n"},
        {"/sys/class/hwmon/hwmon3/temp2_input", "46000\n"},
        {"/sys/class/hwmon/hwmon4/name", "drivetemp\n"},
        {"/sys/class/hwmon/hwmon4/temp1_input", "30000\n"},
    };
    for (const auto& [path, bytes] : files) {
      device.write((path.starts_with("/cpu") ? kCpu0 : "") + path, bytes);
    }
    addDisk("sda", "1:0:0:0", "4", "100 0 2000 50 30 0 400 60 2 70 80 5 0 600 7 9 3\n");
    device.write("/sys/block/loop0/stat", "1 1 1 1 1 1 1 1 1 1 1\n");
    device.write("/sys/block/loop0/size", "0\n");
  }

  void addDisk(const std::string& name, const std::string& address, const std::string& sequence,
               const std::string& statistics) {
    const std::string directory = kDisks + ("/" + address) + "/block/" + name;
    device.write(directory + "/stat", statistics);
    device.write(directory + "/size", "1000\n");
    device.write(directory + "/diskseq", sequence + "\n");
    std::filesystem::create_directories(device.path("/sys/block"));
    std::filesystem::create_directory_symlink(".." + directory.substr(4),
                                              device.path("/sys/block/" + name));
  }

  // A channel as "group/subgroup/name unit format daily", with its ID.
  using Channels = std::map<std::string, std::pair<std::uint64_t, std::uint64_t>>;
  Channels describe() {
    Channels channels;
    for (const RegistryEntry& entry : source->entries()) {
      EXPECT_EQ(*entry.properties.find("DrvReportLegendPublic"), PropertyValue(true));
      for (const PropertyValue& item : *ArrayEntry(entry.properties, "DrvReportLegend")) {
        const Dictionary& group = *item.asDictionary();
        const std::string* subgroup = StringEntry(group, "DrvReportSubGroupName");
        const std::string place = *StringEntry(group, "DrvReportGroupName") + "/" +
                                  (subgroup != nullptr ? *subgroup : "") + "/";
        for (const PropertyValue& channel : *ArrayEntry(group, "DrvReportChannels")) {
          const Array& legend = *channel.asArray();
          const std::string name = place + *legend[2].asString();
          EXPECT_TRUE(channels
                          .try_emplace(name, entry.id,
                                       static_cast<std::uint64_t>(legend[0].asNumber()->toInt64()))
                          .second)
              << name;
          types[name] = static_cast<std::uint64_t>(legend[1].asNumber()->toInt64());
        }
      }
    }
    return channels;
  }

  // The values of every channel that reports any: "1", or "POLL 7 70; C1 8 800".
  std::map<std::string, std::string> read(const Channels& channels) {
    source->refreshElements();
    std::map<std::string, std::string> reported;
    for (const auto& [name, ids] : channels) {
      ByteReader reader(source->elements(ids.first, ids.second));
      while (reader.remaining() != 0) {
        EXPECT_EQ(reader.little<std::uint64_t>(), ids.first);
        EXPECT_EQ(reader.little<std::uint64_t>(), ids.second);
        EXPECT_EQ(reader.little<std::uint64_t>(), types[name]);
        reader.skip(8);
        std::string& text = reported[name];
        const std::uint64_t format = types[name] & 0xFF;
        if (!text.empty()) text += "; ";
        for (int i = 0; i < 4; ++i) {
          const auto value = reader.little<std::uint64_t>();
          if (format == 2 && i == 0) {
            for (int shift = 56; shift >= 0; shift -= 8) {
              if (const auto c = static_cast<char>((value >> shift) & 0xFF)) text += c;
            }
          } else if (i == 0 || (format == 2 && i < 3) || format == 3) {
            text += (i == 0 ? "" : " ") + std::to_string(value);
          }
        }
      }
      EXPECT_TRUE(reader.ok());
    }
    return reported;
  }

  TempRoot device;
  FakeSystemLog log;
  std::unique_ptr<EntrySource> source = MakeLiveChannels(LoggingRoot(device.root(), log));
  std::map<std::string, std::uint64_t> types;
};

const std::string kSda = "Block Devices/0000:00:17.0/ata2/0:0:0/sda ";

TEST_F(LiveChannelsTest, AMachineReportsWhatItsFilesSay) {
  const long page = sysconf(_SC_PAGESIZE);
  std::string waits = "0 0 0 0; 0 0 0 0; 0 0 0 0; 0 0 0 0; 10 500 500 5000";
  for (int bucket = 5; bucket < 16; ++bucket) waits += "; 0 0 0 0";
  const std::map<std::string, std::string> expected = {
      {"CPU Idle//CPU0 idle", "ACTIVE 24 210000; POLL 7 70; haltpoll 8 800; haltpo3 9 90000"},
      {"CPU Frequency//CPU0 frequency", "2400MHz 8 120; 1190400k 7 30"},
      {"Memory//memory.paged.in", "2048"},
      {"Memory//memory.swapped.out", std::to_string(3 * page)},
      {"Memory//memory.faults.major", "4"},
      {"Pressure//pressure.io.some", "500"},
      {"Pressure//pressure.io.full", "400"},
      {"Scheduler//run queue wait", waits},
      {"Energy/intel-rapl/package-0", "900"},
      {"Energy/intel-rapl/package-0 core", "12"},
      {"Temperatures/acpitz/acpitz", std::to_string(static_cast<std::uint64_t>(-5000))},
      {"Temperatures/coretemp/coretemp Package id 0", "45000"},
      {"Temperatures/coretemp/coretemp temp2", "46000"},
      {"Block Devices//disk.bytes.read", "1024000"},
      {"Block Devices//disk.bytes.written", "204800"},
      {"Block Devices//disk.reads", "100"},
      {"Block Devices//disk.writes", "30"},
      {kSda + "bytes read", "1024000"},
      {kSda + "bytes written", "204800"},
      {kSda + "bytes discarded", "307200"},
      {kSda + "reads", "100"},
      {kSda + "writes", "30"},
      {kSda + "discards", "5"},
      {kSda + "flushes", "9"},
      {kSda + "busy", "70"},
      {kSda + "in flight", "2"},
  };
  EXPECT_EQ(read(describe()), expected);
  Names daily;
  for (const auto& [name, type] : types) {
    if ((type >> 16 & 0x100) != 0) daily.insert(name.substr(name.rfind('/') + 1));
  }
  EXPECT_EQ(daily, (Names{"disk.bytes.read", "disk.bytes.written", "disk.reads", "disk.writes",
                          "memory.faults.major", "memory.swapped.out", "pressure.io.full",
                          "pressure.io.some"}));
}

TEST_F(LiveChannelsTest, AnOddFileCostsItsOwnChannelOnly) {
  const std::string idle = kCpu0 + std::string("/cpuidle/state2/");
  const std::string monitor = "/sys/class/hwmon/hwmon3/";
  const Names ofSda = {"bytes read", "bytes written", "bytes discarded", "reads",
                       "writes",     "discards",      "flushes",         "busy"};
  Names sdaAndTotals = {"Block Devices//disk.bytes.read", "Block Devices//disk.bytes.written",
                        "Block Devices//disk.reads", "Block Devices//disk.writes"};
  const Names totals = sdaAndTotals;
  for (const std::string& name : ofSda) sdaAndTotals.insert(kSda + name);
  sdaAndTotals.insert(kSda + "in flight");
  const std::tuple<std::string, std::string, Names> cases[] = {
      {idle + "time", "", {"CPU Idle//CPU0 idle"}},
      {idle + "usage", "-1", {"CPU Idle//CPU0 idle"}},
      {idle + "usage", "9223372036854775808", {"CPU Idle//CPU0 idle"}},
      {"/proc/stat", "cpu 1\ncpu0 1 2 3\n", {"CPU Idle//CPU0 idle"}},
      {kCpu0 + std::string("/cpufreq/stats/time_in_state"),
       "2400000 x\n",
       {"CPU Frequency//CPU0 frequency"}},
      {kCpu0 + std::string("/cpufreq/stats/trans_table"),
       "\n : 1 2\n",
       {"CPU Frequency//CPU0 frequency"}},
      {"/proc/vmstat",
       "pgpgin 2\npswpout  3\npgmajfault 4 5\n",
       {"Memory//memory.swapped.out", "Memory//memory.faults.major"}},
      {"/proc/pressure/io",
       "full total=\nsome avg10=1.00 total=500\n",
       {"Pressure//pressure.io.full"}},
      {"/proc/schedstat",
       "version 14\ncpu0 0 0 0 0 0 0 77 5000 10\n",
       {"Scheduler//run queue wait"}},
      {"/sys/class/powercap/intel-rapl:0/energy_uj",
       std::string(70'000, '1'),
       {"Energy/intel-rapl/package-0"}},
      {monitor + "temp1_input", "99999999", {"Temperatures/coretemp/coretemp Package id 0"}},
      {monitor + "device/power/runtime_status",
       "suspended\n",
       {"Temperatures/coretemp/coretemp Package id 0", "Temperatures/coretemp/coretemp temp2"}},
      {kDisks + std::string("/1:0:0:0/block/sda/stat"),
       "100 0 2000 50 30 0 9e9 60 2 70 80 5 0 600 7 9",
       {kSda + "bytes written", "Block Devices//disk.bytes.written"}},
      {kDisks + std::string("/1:0:0:0/block/sda/diskseq"), "5\n", sdaAndTotals},
  };
  for (const auto& [path, bytes, lost] : cases) {
    source = MakeLiveChannels(LoggingRoot(device.root(), log));
    const std::string before = device.read(path);
    const Channels channels = describe();
    auto expected = read(channels);
    device.write(path, bytes);
    auto found = read(channels);
    // A disk that has gone leaves its share in the totals.
    const bool keepsTotals = path.ends_with("diskseq");
    Names missing;
    for (const auto& [name, value] : expected) {
      if (!found.contains(name)) missing.insert(name);
    }
    Names expectedMissing = lost;
    if (keepsTotals) {
      for (const std::string& total : totals) expectedMissing.erase(total);
    }
    EXPECT_EQ(missing, expectedMissing) << path << ": " << bytes.substr(0, 50);
    for (const std::string& name : missing) expected.erase(name);
    EXPECT_EQ(found, expected) << path << ": " << bytes.substr(0, 50);
    device.write(path, before);
  }
  // A directory that cannot be read costs its own channels too, and says so.
  EXPECT_EQ(log.lines.size(), 0u);
  const std::string zones = device.path("/sys/class/thermal");
  std::filesystem::remove_all(zones);
  device.write("/sys/class/thermal", "");
  EXPECT_GT(describe().size(), 0u);
  EXPECT_EQ(log.errors(), std::vector{"Cannot read " + zones + ": Not a directory"});
}

TEST_F(LiveChannelsTest, CountersThatFallHaveWrappedOrStartedAnew) {
  const Channels channels = describe();
  const auto stat = [](const char* reads, const char* busy) {
    return reads + std::string(" 0 2000 50 30 0 400 60 2 ") + busy + " 80 5 0 600 7 9 3\n";
  };
  const std::string zone = "/sys/class/powercap/intel-rapl:0/energy_uj";
  const std::string sda = kDisks + std::string("/1:0:0:0/block/sda/stat");
  read(channels);
  const std::tuple<const char*, const char*, const char*, const char*, const char*, const char*>
      steps[] = {
          // energy, reads, busy as read; then as reported
          {"950", "110", "4294967290", "950", "110", "4294967290"},
          {"30", "3", "4", "1030", "113", "4294967300"},  // wrapped, started anew, wrapped
          {"900", "5", "9", "1900", "115", "4294967305"},
          {"600", "5", "8", "2500", "115", "4294967313"},  // the range would have been half used
      };
  for (const auto& [energy, reads, busy, energyTotal, readsTotal, busyTotal] : steps) {
    device.write(zone, energy);
    device.write(sda, stat(reads, busy));
    auto found = read(channels);
    EXPECT_EQ(found["Energy/intel-rapl/package-0"], energyTotal) << energy;
    EXPECT_EQ(found[kSda + "reads"], readsTotal) << reads;
    EXPECT_EQ(found[kSda + "busy"], busyTotal) << busy;
  }
  // Another disk in the same place has read more than the one before: none of it is that one's.
  std::filesystem::remove_all(device.path("/sys/block/sda"));
  std::filesystem::remove_all(device.path(kDisks + std::string("/1:0:0:0")));
  addDisk("sda", "1:0:0:0", "9", stat("1000", "8"));
  EXPECT_FALSE(read(channels).contains(kSda + "reads"));
  EXPECT_EQ(describe(), channels);
  EXPECT_EQ(read(channels)[kSda + "reads"], "1115");
  EXPECT_EQ(read(channels)["Block Devices//disk.reads"], "1115");
}

TEST_F(LiveChannelsTest, WaitsGoIntoTheBucketOfTheirMean) {
  const Channels channels = describe();
  read(channels);
  device.write("/proc/schedstat", "version 17\ncpu0 0 0 0 0 0 0 77 5064 14\n");
  read(channels);
  device.write("/proc/schedstat",
               "version 17\ncpu0 0 0 0 0 0 0 77 5065 14\ncpu1 0 0 0 0 0 0 0 9000000000000 2\n");
  const std::string waits = read(channels)["Scheduler//run queue wait"];
  EXPECT_TRUE(waits.starts_with("0 0 0 0; 4 16 16 64; 0 0 0 0; 0 0 0 0; 10 500 500 5000; 0 0 0 0"))
      << waits;
  EXPECT_TRUE(waits.ends_with("0 0 0 0; 2 4500000000000 4500000000000 9000000000000")) << waits;
}

TEST_F(LiveChannelsTest, IDsFollowDevicesNotTheirNames) {
  device.write("/sys/class/hwmon/hwmon3/device/power/runtime_status", "unsupported\n");
  const Channels before = describe();
  std::filesystem::rename(device.path("/sys/class/hwmon/hwmon3"),
                          device.path("/sys/class/hwmon/hwmon0"));
  std::filesystem::remove_all(device.path(kDisks));
  std::filesystem::remove(device.path("/sys/block/sda"));
  addDisk("sda", "1:0:0:1", "4", "1 1 1 1 1 1 1 1 1 1 1\n");
  addDisk("sdb", "1:0:0:0", "5", "2 1 1 1 1 1 1 1 1 1 1\n");
  device.write(kDisks + std::string("/1:0:0:1/wwid"),
               "t10.ATA     \x1b[31mDisk\n%n\xc2\x9b  7  \n");
  std::filesystem::create_directory_symlink(
      "../..", device.path(kDisks + std::string("/1:0:0:1/block/sda/device")));
  const Channels after = describe();
  const std::string sensor = "Temperatures/coretemp/coretemp temp2";
  EXPECT_EQ(after.at(sensor), before.at(sensor));
  EXPECT_EQ(after.at("Block Devices/0000:00:17.0/ata2/0:0:0/sdb reads"), before.at(kSda + "reads"));
  EXPECT_EQ(after.count("Block Devices/t10.ATA ?[31mDisk?%n?? 7/sda reads"), 1u);
  // Two that say the same of themselves.
  device.write("/sys/class/hwmon/hwmon7/name", "coretemp\n");
  device.write("/sys/class/hwmon/hwmon7/temp2_input", "1\n");
  device.write("/sys/class/hwmon/hwmon7/temp2_label", "other\n");
  const Channels both = describe();
  EXPECT_EQ(both.at(sensor), before.at(sensor));
  EXPECT_NE(both.at("Temperatures/coretemp/coretemp other"), before.at(sensor));
}

TEST(DevicePlace, SaysWhereADeviceIsPluggedIn) {
  const std::pair<const char*, const char*> cases[] = {
      {"../devices/pci0000:00/0000:00:02.0/virtio1/block/vda", "0000:00:02.0"},
      {"../../devices/pci0000:00/0000:00:1d.0/10000:3d:00.0/nvme/nvme0/nvme0n1", "10000:3d:00.0"},
      {"../devices/pci0000:00/0000:00:14.0/usb2/2-1/2-1.4/2-1.4:1.0/host6/target6:0:0/6:0:0:0/"
       "block/sdb",
       "0000:00:14.0/1/1.4/1.4:1.0/0:0:0"},
      {"../../devices/platform/coretemp.0/hwmon/hwmon2", "coretemp.0"},
      {"../../devices/pci0000:00/0000:00:1f.4/i2c-3/3-0050/hwmon/hwmon4", "0000:00:1f.4/0050"},
      {"../../devices/virtual/thermal/thermal_zone0/hwmon0", ""},
      {"devices/", ""},
      {"elsewhere/sda", ""},
  };
  for (const auto& [link, place] : cases) EXPECT_EQ(DevicePlace(link), place) << link;
}

}  // namespace
}  // namespace quorlet
