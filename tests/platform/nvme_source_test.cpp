#include "platform/linux/nvme_source.h"

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
#include <map>

#include "fakes/fake_platform.h"
#include "fakes/temp_root.h"
#include "platform/linux/nvme_health_page.h"
#include "platform/linux/nvme_statistics.h"
#include "storage/nand_info.h"
#include "storage/statistics_parser.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

using Statistics = std::map<std::uint32_t, std::uint64_t>;

Statistics Read(std::span<const std::byte> bytes) {
  Statistics statistics;
  ByteReader reader(bytes);
  while (reader.remaining() != 0) {
    const auto key = reader.little<std::uint32_t>();
    EXPECT_EQ(reader.little<std::uint32_t>(), 1u);
    EXPECT_TRUE(statistics.emplace(key, reader.little<std::uint64_t>()).second) << key;
  }
  EXPECT_TRUE(reader.ok());
  return statistics;
}

// The page of a drive of 256 GB in daily use, put together again from a published report of it
// ("Data Units Read: 9,351,610 [4.78 TB]"); what the report does not tell is filled with 0xEE.
Data HealthPage() {
  Data page(kNvmeHealthPageBytes, std::byte{0xEE});
  const auto put = [&](std::size_t at, std::size_t width, std::uint64_t value) {
    for (std::size_t i = 0; i < width; ++i) {
      page[at + i] = static_cast<std::byte>(i < 8 ? value >> (8 * i) & 0xFF : 0);
    }
  };
  put(0, 6, 0x05'0A'64'01'30'00);  // 304 K, all of the spare left, 5 % used
  const std::uint64_t counters[] = {9'351'610, 10'338'739, 77'209'705, 94'922'330, 773,
                                    1'163,     1'055,      134,        0,          65};
  for (std::size_t i = 0; i < std::size(counters); ++i) put(32 + 16 * i, 16, counters[i]);
  return page;
}
// By the keys of the export.
// clang-format off
const Statistics kOfPage = {
    {53, 0x20002}, {36, 0}, {7, 1'168'951'250}, {4, 1'292'342'375}, {3, 77'209'705},
    {2, 94'922'330}, {10, 1'163}, {34, 1'055}, {11, 134}, {172, 0}};
// clang-format on

TEST(NvmeStatistics, TheDictionaryTellsWhatTheDriveReports) {
  NvmeFacts facts;
  Data page = HealthPage();
  facts.healthPage = page;
  FSPParseContext context;
  ASSERT_TRUE(FSPParseBufferToCxt(context, *EncodeNvmeStatistics(facts)));
  FakePlatform device;
  Dictionary info = *BuildNANDInfoDictionary(device.services, context, false);
  Dictionary told;
  for (const auto& [key, value] : info) {
    if (value.asNumber()->toInt64() != 0) told[key] = value;
  }
  EXPECT_EQ(PropertyValue(told).description(),
            PropertyValue(Dictionary{{kNANDInfoExportVersionKey, Int32(0x20002)},
                                     {kNANDInfoDriverVersionKey, Int32(-1)},
                                     {kNANDInfoNumLogicalReadsKey,
                                      Int64(std::int64_t{9'351'610} * 1000 * 512 / 4096)},
                                     {kNANDInfoNumLogicalWritesKey,
                                      Int64(std::int64_t{10'338'739} * 1000 * 512 / 4096)},
                                     {"nuvex.NANDInfo.UncleanBoots", Int64(134)}})
                .description());
  FSPReleaseContext(context);

  page[32 + 15] = std::byte{1};  // beyond 64 bits
  page[48 + 7] = std::byte{2};   // beyond 63 bits once it is in sectors
  page[64 + 7] = std::byte{0x80};
  const Statistics saturated = Read(*EncodeNvmeStatistics(facts));
  for (const std::uint32_t key : {7u, 4u, 3u})
    EXPECT_EQ(saturated.at(key), std::uint64_t{INT64_MAX});
  std::fill_n(page.begin() + 32, 32, std::byte{0});
  const Statistics silent = Read(*EncodeNvmeStatistics(facts));
  EXPECT_FALSE(silent.contains(7) || silent.contains(4)) << "data units are not reported";
}

// A machine with one controller and two namespaces, whose page comes from the test.
struct NvmeSource : testing::Test {
  NvmeSource() {
    root.write("/dev/nvme0", "");
    root.write("/sys/class/nvme/nvme0/model", "Example Drive 1T \n");
    root.write("/sys/class/nvme/nvme0/serial", "SECRET");
    root.write("/sys/block/nvme0n1/stat", kStat);
    root.write("/sys/block/nvme0n2/stat", kStat);
    root.write("/sys/block/nvme01n1/stat", kStat);
    for (const char* other : {"nvme1", "nvme00", "nvme", "nvme-fabrics", "nvme0x"}) {
      root.write(std::string("/sys/class/nvme/") + other + "/model", "x");
    }
    root.write("/dev/nvme00", "");
  }
  // What a driver answers to an export request, as text when it fails.
  std::string ask(EntryDriver& driver, std::uint8_t selector, std::uint8_t flags, Data& answer) {
    Data request(24);
    request[0] = std::byte{selector};
    request[4] = std::byte{flags};
    DriverCall call;
    call.structInput = request;
    call.structOutput = answer;
    const KernelReturn status = driver.call(9, call);
    answer.resize(call.bytesWritten);
    return status == 0 ? "" : std::to_string(status);
  }
  Statistics statistics() {
    const auto entries = source->entries();
    EXPECT_EQ(entries.size(), 1u);
    Data size(4), answer(4096);
    if (!ask(*entries.at(0).driver, 13, 1, size).empty()) return {};
    EXPECT_EQ(ask(*entries[0].driver, 13, 0, answer), "");
    EXPECT_EQ(ByteReader(size).little<std::uint32_t>(), answer.size());
    return Read(answer);
  }

  static constexpr char kStat[] = " 1 2 3 4 5 6 7 8 9 10 11 12 13 16 15 16 17\n";
  TempRoot root;
  int asked = 0;
  std::optional<Data> page = HealthPage();
  std::unique_ptr<EntrySource> source =
      MakeNvmeSource(root.root(), [this](const std::string& device, auto limit) {
        ++asked;
        EXPECT_EQ(device, root.path("/dev/nvme0"));
        EXPECT_EQ(limit, std::chrono::seconds(2));
        return page;
      });
};

TEST_F(NvmeSource, ADriveIsAskedOnceForItsStatistics) {
  Statistics all = kOfPage;
  all.insert({{37, 32}, {38, 24}, {39, 4}, {59, 34'000}, {60, 30'000}});
  EXPECT_EQ(statistics(), all);
  EXPECT_EQ(statistics(), all);
  EXPECT_EQ(asked, 1);
  const auto entries = source->entries();
  EXPECT_EQ(entries[0].className, "NuvexEmbeddedNVMeController");
  EXPECT_EQ(entries[0].properties,
            (Dictionary{{"Controller Characteristics",
                         Dictionary{{"model", "Example Drive 1T"}, {"num-bus", Int32(0)}}}}));
  Data size(4, std::byte{9}), tooSmall(3);
  EXPECT_EQ(ask(*entries[0].driver, 17, 1, size), "");
  EXPECT_EQ(size, Data(4)) << "other exports are empty";
  EXPECT_NE(ask(*entries[0].driver, 13, 1, tooSmall), "");
}

TEST_F(NvmeSource, WhatOneNamespaceLacksHasNoTotal) {
  for (const char* line :
       {"", "1 2 3 4 5 6 7 8 9 10 11", "1 2 3 4 5 6 7 8 9 10 11 12 13 14 15 x 17",
        "1 2 3 4 5 6 7 8 9 10 11 12 13 14 15 16 99999999999999999999"}) {
    root.write("/sys/block/nvme0n2/stat", line);
    source = MakeNvmeSource(root.root(), [this](auto&&...) { return page; });
    EXPECT_EQ(statistics(), kOfPage) << line;
  }
  root.write("/sys/block/nvme0n1/nuse", "1000\n");
  root.write("/sys/block/nvme0n1/queue/logical_block_size", "512\n");
  root.write("/sys/block/nvme0n2/nuse", "9\n");
  root.write("/sys/block/nvme0n2/queue/logical_block_size", "4096\n");
  source = MakeNvmeSource(root.root(), [this](auto&&...) { return page; });
  EXPECT_EQ(statistics().at(8), 134u);
}

TEST_F(NvmeSource, ADriveThatSleepsOrDoesNotAnswerHasNoStatistics) {
  root.write("/sys/class/nvme/nvme0/device/power/runtime_status", "suspended\n");
  EXPECT_EQ(statistics(), Statistics());
  EXPECT_EQ(asked, 0);
  root.write("/sys/class/nvme/nvme0/device/power/runtime_status", "active\n");
  source = MakeNvmeSource(root.root(), [](auto&&...) { return Data(511); });
  EXPECT_EQ(statistics(), Statistics());
  // The file that stands for the device knows no such command.
  source = MakeNvmeSource(root.root(), ReadNvmeHealthPage);
  EXPECT_EQ(statistics(), Statistics());
}

// Old kernels lack the call, and sandboxes refuse it.
TEST(NvmeHealthPage, IsReadWithoutCloseRange) {
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
      _exit(ReadNvmeAttribute(device.path("/nuse"), std::chrono::seconds(2)) == "7" ? 0 : 1);
    }
    int status = -1;
    waitpid(child, &status, 0);
    EXPECT_EQ(status, 0) << error;
  }
}

}  // namespace
}  // namespace quorlet
