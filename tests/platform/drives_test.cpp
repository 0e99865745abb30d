// Drives of recorded machines: what they tell, which one the device's statistics come from, and
// what happens when one does not answer.
#include <gtest/gtest.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstddef>
#include <iterator>
#include <thread>

#include "fakes/fake_platform.h"
#include "fakes/temp_root.h"
#include "platform/linux/drives/bounded_answer.h"
#include "platform/linux/drives/drive_exports.h"
#include "platform/linux/drives/drive_figures.h"
#include "platform/linux/drives/drives_publisher.h"
#include "platform/linux/registry/services.h"
#include "storage/nand_info.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

void Put(Data& page, std::size_t at, std::size_t width, std::uint64_t value) {
  for (std::size_t i = 0; i < width; ++i) {
    page[at + i] = static_cast<std::byte>(i < 8 ? value >> (8 * i) & 0xFF : 0);
  }
}

// A health page, put together again from a report; what the report does not tell is filled with
// 0xEE. `counters` are those of 16 bytes, from data units read on.
Data HealthPage(std::uint64_t start, const std::vector<std::uint64_t>& counters,
                std::uint64_t temperatureTimes) {
  Data page(kNvmePageBytes, std::byte{0xEE});
  Put(page, 0, 6, start);
  for (std::size_t i = 0; i < counters.size(); ++i) Put(page, 32 + 16 * i, 16, counters[i]);
  Put(page, 192, 8, temperatureTimes);
  Put(page, 216, 16, 0);
  return page;
}

// 256 GB in daily use, of a published report ("Data Units Read: 9,351,610 [4.78 TB]").
Data DailyPage() {
  return HealthPage(0x05'0A'64'01'30'00,
                    {9'351'610, 10'338'739, 77'209'705, 94'922'330, 773, 1'163, 1'055, 134, 0, 65},
                    0);
}

Data DatacenterPage() {
  Data page(kNvmePageBytes, std::byte{0});
  Put(page, 0, 16, 7'000'000'000'000);
  Put(page, 16, 16, 8'000'000'000'000);
  Put(page, 32, 8, 0x64'00'00'00'00'00'0B);  // 11 blocks, and the normalized figure behind them
  Put(page, 88, 8, 0x0000'0003'0000'0029);
  Put(page, 120, 1, 97);
  Put(page, 128, 2, 0xFFFF);  // it has no capacitor
  const std::uint8_t identifier[] = {0xC5, 0xAF, 0x10, 0x28, 0xEA, 0xBF, 0xF2, 0xA4,
                                     0x9C, 0x4F, 0x6F, 0x7C, 0xC9, 0x14, 0xD5, 0xAF};
  for (std::size_t i = 0; i < 16; ++i) page[496 + i] = std::byte{identifier[i]};
  return page;
}

std::string Text(const DriveFigures& figures) {
  std::string text;
  for (const DriveFigureInfo& info : kDriveFigures) {
    if (const auto value = figures[info.figure]) {
      text += " " + std::string(info.name) + "=" + std::to_string(*value);
    }
  }
  return text;
}

const std::string kDailyFigures =
    " used=5 spare=100 spare.threshold=10 warnings=0 temperature=31000"
    " bytes.read=4788024320000 bytes.written=5293434368000 reads=77209705 writes=94922330"
    " busy=46380 power.cycles=1163 power.on=3798000 unsafe.shutdowns=134 media.errors=0"
    " error.log.entries=65 warm=0 critical=0 throttled.1=0 throttled.2=0 throttled.1.time=0"
    " throttled.2.time=0";
const std::string kDatacenterFigures =
    " media.bytes.written=7000000000000 media.bytes.read=8000000000000 bad.blocks=11"
    " bad.system.blocks=0 uncorrectable.reads=0 corrected.reads=0 erases.max=41 erases.min=3"
    " incomplete.shutdowns=0 free.blocks=97";

TEST(DriveFigures, PagesAreReadAsTheirLayoutSays) {
  Data worn = DailyPage();
  worn[1] = worn[2] = std::byte{0};
  worn[5] = std::byte{255};
  std::fill_n(worn.begin() + 32, 32, std::byte{0});  // amounts that are not told
  worn[64 + 15] = std::byte{1};                      // beyond 64 bits
  worn[112 + 7] = std::byte{0x80};                   // beyond 63
  Data ones = DatacenterPage();
  std::fill_n(ones.begin(), 496, std::byte{0xFF});
  Data foreign = DatacenterPage();
  foreign[511] = std::byte{0xAE};
  const struct {
    Data health, datacenter;
    std::string figures;
  } cases[] = {
      {DailyPage(), DatacenterPage(), kDailyFigures + kDatacenterFigures},
      {DailyPage(), ones, kDailyFigures},
      {DailyPage(), foreign, kDailyFigures},
      {DailyPage(), Data(511), kDailyFigures},
      {Data(511), Data(), ""},
      {Data(513), Data(), ""},
      // 512 GB, of a published report (25 C, 2,222 hours); its other counters are not in it.
      {HealthPage(0x00'0A'64'01'2A'00, {0, 0, 1, 2, 3, 4, 2'222, 5, 0, 6}, 0x0000'0002'0000'0001),
       Data(),
       " used=0 spare=100 spare.threshold=10 warnings=0 temperature=25000 reads=1 writes=2"
       " busy=180 power.cycles=4 power.on=7999200 unsafe.shutdowns=5 media.errors=0"
       " error.log.entries=6 warm=60 critical=120 throttled.1=0 throttled.2=0 throttled.1.time=0"
       " throttled.2.time=0"},
      // As an emulated drive told it in a virtual machine.
      {HealthPage(0x00'00'00'01'43'00, {2, 0, 86, 0, 0, 1, 0, 0, 0, 0}, 0), Data(),
       " used=0 spare=0 spare.threshold=0 warnings=0 temperature=50000 bytes.read=1024000 reads=86"
       " writes=0 busy=0 power.cycles=1 power.on=0 unsafe.shutdowns=0 media.errors=0"
       " error.log.entries=0 warm=0 critical=0 throttled.1=0 throttled.2=0 throttled.1.time=0"
       " throttled.2.time=0"},
      {worn, Data(),
       " used=255 spare=100 spare.threshold=10 warnings=0 reads=9223372036854775807"
       " writes=94922330 busy=46380 power.cycles=9223372036854775807 power.on=3798000"
       " unsafe.shutdowns=134 media.errors=0 error.log.entries=65 warm=0 critical=0 throttled.1=0"
       " throttled.2=0 throttled.1.time=0 throttled.2.time=0"},
  };
  for (const auto& [health, datacenter, expected] : cases) {
    DriveFigures figures;
    AddNvmeHealth(health, figures);
    AddNvmeDatacenter(datacenter, figures);
    EXPECT_EQ(Text(figures), expected);
  }
}

// A machine whose trees a test lays out, and whose NVMe drives answer what it says.
struct DrivesTest : testing::Test {
  // Files below the directory of a device, and the links that lead to it.
  void add(const std::string& device, const std::string& link,
           const std::vector<std::pair<std::string, std::string>>& files) {
    for (const auto& [name, text] : files) root.write("/sys/devices/" + device + "/" + name, text);
    if (link.empty()) return;
    const std::filesystem::path path = root.path("/sys/" + link);
    std::filesystem::create_directories(path.parent_path());
    std::string up;
    for (const char c : link) up += c == '/' ? "../" : "";
    std::filesystem::create_directory_symlink(up + "devices/" + device, path);
  }
  void addNvme(const std::string& name, const std::string& address) {
    root.write("/dev/" + name, "");
    const std::string device = "pci0000:00/" + address;
    add(device + "/nvme/" + name, "class/nvme/" + name,
        {{"model", "Example 1T \n"}, {"serial", "SECRET"}, {"firmware_rev", "2B"}});
    std::filesystem::create_directory_symlink("../..",
                                              root.path("/sys/class/nvme/" + name + "/device"));
    add(device + "/nvme/" + name + "/" + name + "n1", "block/" + name + "n1",
        {{"stat", kStat}, {"dev", "259:" + name.substr(4) + "\n"}});
  }
  void addCard(const std::vector<std::pair<std::string, std::string>>& files) {
    const std::string card = "platform/soc/fe340000.mmc/mmc_host/mmc0/mmc0:59b4";
    add(card, "", files);
    add(card + "/block/mmcblk0", "block/mmcblk0", {{"stat", kStat}, {"mmcblk0p2/dev", "179:2"}});
    std::filesystem::create_directory_symlink("../..", root.path("/sys/block/mmcblk0/device"));
    root.write("/sys/block/mmcblk0boot0/stat", kStat);
  }
  std::string drives() {
    std::string text;
    for (const Drive& drive : reader->read()) {
      const char* answers[] = {"told", "nothing", "asleep", "denied", "silent"};
      text += drive.place + " " + drive.name + " [" + drive.model + "|" + drive.firmware + "] " +
              (drive.holdsRoot ? "root " : "") + answers[static_cast<int>(drive.answer)] +
              Text(drive.figures) + "\n";
    }
    return text;
  }
  void useRoot(const std::string& mounts) { root.write("/proc/self/mountinfo", mounts); }
  // The statistics that the NAND dictionary is made of.
  Dictionary info() {
    std::vector<std::unique_ptr<EntrySource>> sources;
    sources.push_back(MakeDriveExports(reader));
    const auto registry = MakeLinuxDriverRegistry(std::move(sources));
    Platform services = fake.services.with({.driverRegistry = registry.get()});
    return CopyNANDInfo(services);
  }

  static constexpr char kStat[] = " 1 2 3 4 5 6 7 8 9 10 11 12 13 16 15 16 17\n";
  TempRoot root;
  FakePlatform fake;
  int asked = 0;
  NvmePages pages{.answer = DriveAnswer::kTold, .health = DailyPage(), .datacenter = {}};
  std::shared_ptr<DriveReader> reader = std::make_shared<DriveReader>(
      LoggingRoot(root.root(), fake.log), [this](const std::string&, auto limit) {
        ++asked;
        EXPECT_EQ(limit, std::chrono::seconds(2));
        return pages;
      });
};

TEST_F(DrivesTest, CardsTellWhatTheKernelPublishes) {
  const struct {
    std::vector<std::pair<std::string, std::string>> files;
    std::string expected;
  } cases[] = {
      // Of 16 GB on a small computer, nearly new; and one of 8 GB that is not.
      {{{"type", "MMC"},
        {"name", "BJTD4R"},
        {"life_time", "0x01 0x01\n"},
        {"pre_eol_info", "0x01\n"},
        {"enhanced_area_size", "4294967274\n"},
        {"fwrev", "0x6\n"}},
       "[BJTD4R|0x6] told used=10 used.a=10 used.b=10 reserve=1"},
      {{{"type", "MMC"},
        {"name", "8GTF4R"},
        {"life_time", "0x02 0x0b\n"},
        {"pre_eol_info", "03\n"},
        {"enhanced_area_size", "8192\n"}},
       "[8GTF4R|] told used=110 used.a=20 used.b=110 reserve=3 enhanced.bytes=8388608"},
      {{{"type", "MMC"}, {"name", "old"}, {"life_time", "0x00 0x00"}, {"pre_eol_info", "0x00"}},
       "[old|] nothing"},
      {{{"type", "MMC"}, {"life_time", "0x0c 0x01"}}, "[|] told used=10 used.b=10"},
      {{{"type", "MMC"}, {"life_time", "0x01 0x02 0x03"}}, "[|] told used=10 used.a=10"},
      {{{"type", "MMC"}, {"life_time", "0x100000001 -1"}, {"pre_eol_info", "0x1g"}}, "[|] nothing"},
      {{{"type", "MMC"}, {"name", "\x1b[31m\xff"}, {"life_time", std::string(70'000, '1')}},
       "[?[31m?|] nothing"},
      {{{"type", "SD"}, {"name", "SC32G"}, {"fwrev", "0x0"}, {"life_time", "0x01 0x01"}},
       "[SC32G|0x0] nothing"},
      {{{"type", "SDIO"}}, ""},
  };
  for (const auto& [files, expected] : cases) {
    std::filesystem::remove_all(root.path("/sys"));
    addCard(files);
    EXPECT_EQ(drives(), expected.empty() ? "" : "soc/fe340000.mmc mmcblk0 " + expected + "\n");
  }
}

TEST_F(DrivesTest, AUfsDeviceIsAskedOnlyWhileItIsAwake) {
  const std::string host = "platform/soc/1d84000.ufs";
  add(host, "bus/platform/drivers/ufshcd-example/1d84000.ufs",
      {{"health_descriptor/life_time_estimation_a", "0x02\n"},
       {"health_descriptor/life_time_estimation_b", "0x01\n"},
       {"health_descriptor/eol_info", "0x01\n"},
       {"string_descriptors/product_name", "KLU\n"},
       {"host0/target0:0:0/0:0:0:49488/power/runtime_status", "active\n"},
       {"power/runtime_status", "active\n"}});
  add(host + "/host0/target0:0:0/0:0:0:0/block/sda", "block/sda", {{"dev", "8:0"}});
  useRoot("22 1 8:0 / / rw - ext4 /dev/sda rw\n");
  const std::string start = "soc/1d84000.ufs 1d84000.ufs ";
  EXPECT_EQ(drives(), start + "[KLU|] root told used=20 used.a=20 used.b=10 reserve=1\n");
  for (const char* unit : {"", "host0/target0:0:0/0:0:0:49488/"}) {
    const std::string status = "/sys/devices/" + host + "/" + unit + "power/runtime_status";
    root.write(status, "suspended\n");
    EXPECT_EQ(drives(), start + "[|] root asleep\n") << unit;
    root.write(status, "active\n");
  }
}

TEST_F(DrivesTest, TheRootsDriveGivesTheStatistics) {
  addNvme("nvme0", "0000:00:1d.0/0000:03:00.0");
  addNvme("nvme1", "0000:00:01.0/0000:01:00.0");
  addCard({{"type", "MMC"}, {"life_time", "0x01 0x01"}});
  add("virtual/block/dm-0", "block/dm-0", {{"dev", "253:0"}, {"slaves/mmcblk0p2/x", ""}});
  add("virtual/block/dm-1", "block/dm-1", {{"dev", "253:1"}, {"slaves/dm-1/x", ""}});
  const struct {
    std::string mounts, expected;
  } cases[] = {
      {"", "nvme1"},  // the first by its place
      {"1 1 259:0 / / rw - ext4 /dev/x rw\n", "nvme0"},
      {"1 1 259:1 / / rw - ext4 a rw\n2 1 259:0 / / rw shared:1 - ext4 b rw\n", "nvme0"},
      {"1 1 179:2 / / rw - f2fs /dev/root rw\n", "mmcblk0"},
      {"1 1 253:0 / / rw - ext4 /dev/mapper/a rw\n", "mmcblk0"},
      {"1 1 253:1 / / rw - ext4 /dev/mapper/b rw\n", "nvme1"},  // a ring
      {"1 1 0:30 /@ / rw - btrfs /dev/nvme0n1 rw\n", "nvme0"},
      {"1 1 0:31 / / rw - overlay o rw,lowerdir=/l,upperdir=/a\\040b/up,workdir=/w\n"
       "2 1 179:2 / /a\\040b rw - ext4 /dev/x rw\n",
       "mmcblk0"},
      {"1 1 0:31 / / rw - overlay o rw,upperdir=/data/up\n2 1 179:2 / /data rw - ext4 x rw\n",
       "mmcblk0"},
      {"1 1 0:31 / / rw - overlay o rw,upperdir=/data/up\n", "nvme1"},
      {"1 1 0:2 / / rw - nfs ../../etc rw\n", "nvme1"},
      {"1 1 259:0 / / rw - ext4\n\n - - - - - - - -\n", "nvme1"},
  };
  for (const auto& [mounts, expected] : cases) {
    useRoot(mounts);
    const auto entries = MakeDriveExports(reader)->entries();
    ASSERT_EQ(entries.size(), 1u) << mounts;
    EXPECT_EQ(entries[0].name, expected) << mounts;
    EXPECT_EQ(entries[0].className,
              expected == "mmcblk0" ? "FSPStorage" : "NuvexEmbeddedNVMeController");
  }
}

TEST_F(DrivesTest, WhatTheDriveDoesNotTellIsLeftOut) {
  addNvme("nvme0", "0000:03:00.0");
  const Dictionary told{{kNANDInfoExportVersionKey, Int32(0x20002)},
                        {kNANDInfoDriverVersionKey, Int32(-1)},
                        {kNANDInfoDemoModeKey, Int32(0)},
                        {kNANDInfoNumLogicalReadsKey, Int64(1'168'951'250)},
                        {kNANDInfoNumLogicalWritesKey, Int64(1'292'342'375)},
                        {"nuvex.NANDInfo.UncleanBoots", Int64(134)},
                        {"nuvex.NANDInfo.NumFlushes", Int64(16)}};
  Dictionary expected = told.shallowCopy();
  EXPECT_EQ(PropertyValue(info()).description(), PropertyValue(expected).description());
  // One namespace lacks the figure, so there is no total.
  for (const char* line : {"", "1 2 3 4 5 6 7 8 9 10 11", "1 2 3 4 5 6 7 8 9 10 11 12 13 14 15 x 1",
                           "1 2 3 4 5 6 7 8 9 10 11 12 13 14 15 16 99999999999999999999"}) {
    root.write("/sys/block/nvme0n2/stat", line);
    expected.remove("nuvex.NANDInfo.NumFlushes");
    EXPECT_EQ(PropertyValue(info()).description(), PropertyValue(expected).description()) << line;
  }
  std::filesystem::remove_all(root.path("/sys/block/nvme0n2"));
  pages.datacenter = DatacenterPage();
  reader = std::make_shared<DriveReader>(LoggingRoot(root.root(), fake.log),
                                         [this](auto&&...) { return pages; });
  expected = told.shallowCopy();
  expected[kNANDInfoNumPhysicalWritesKey] = Int64(1'708'984'375);
  expected[kNANDInfoNumPhysicalReadsKey] = Int64(1'953'125'000);
  EXPECT_EQ(PropertyValue(info()).description(), PropertyValue(expected).description());
}

TEST_F(DrivesTest, ADriveThatSleepsOrHangsIsLeftAlone) {
  addNvme("nvme0", "0000:03:00.0");
  const std::string power = "/sys/devices/pci0000:00/0000:03:00.0/power/runtime_status";
  const std::string start = "0000:03:00.0 nvme0 [Example 1T|2B] ";
  root.write(power, "suspended\n");
  EXPECT_EQ(drives(), start + "asleep\n");
  EXPECT_TRUE(info().contains(kNANDInfoErrorKey));
  EXPECT_EQ(asked, 0);
  root.write(power, "active\n");
  pages = {.isLate = true, .health = {}, .datacenter = {}};
  std::this_thread::sleep_for(std::chrono::milliseconds(1100));
  const auto channels = MakeDrivesPublisher(reader);
  for (int i = 0; i < 2; ++i) {
    EXPECT_EQ(drives(), start + "silent\n");
    EXPECT_TRUE(info().contains(kNANDInfoErrorKey));
    static_cast<void>(channels->describe());
    std::this_thread::sleep_for(std::chrono::milliseconds(1100));
  }
  EXPECT_EQ(asked, 1) << "one that did not answer in time costs its time once";
  // The file that stands for the device knows no such command; and no file at all.
  EXPECT_EQ(ReadNvmePages(root.path("/dev/nvme0"), std::chrono::seconds(2)).error, ENOTTY);
  EXPECT_EQ(ReadNvmePages(root.path("/dev/nvme9"), std::chrono::seconds(2)).error, ENOENT);
}

TEST(BoundedAnswer, WhoDoesNotAnswerIsLeftBehind) {
  const auto start = std::chrono::steady_clock::now();
  const auto answer = AskWithin(std::chrono::milliseconds(200), 64, [](auto) {
    sleep(20);
    return ssize_t{1};
  });
  EXPECT_TRUE(answer.isLate && answer.bytes.empty());
  EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(10));
  EXPECT_FALSE(AskWithin(std::chrono::seconds(5), 64, [](auto) { return ssize_t{-1}; }).isLate);
}

// Old kernels lack the call, and sandboxes refuse it.
TEST(BoundedAnswer, IsReadWithoutCloseRange) {
  const TempRoot device;
  device.write("/nuse", "7");
  for (const int error : {ENOSYS, EPERM}) {
    const pid_t child = fork();
    if (child == 0) {
      sock_filter rules[] = {
          BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
          BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_close_range, 0, 1),
          BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | static_cast<unsigned>(error)),
          BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW)};
      const sock_fprog program{std::size(rules), rules};
      const bool filtered = prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
                            prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0;
      if (!filtered || close_range(1000, 1000, 0) == 0) _exit(2);
      _exit(ReadAttributeWithin(device.path("/nuse"), std::chrono::seconds(2)) == "7" ? 0 : 1);
    }
    int status = -1;
    waitpid(child, &status, 0);
    EXPECT_EQ(status, 0) << error;
  }
}

}  // namespace
}  // namespace quorlet
