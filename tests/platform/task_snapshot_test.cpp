// Task snapshots, recorded and taken, and the texts of a log's header.
#include <gtest/gtest.h>

#include <regex>

#include "fakes/fake_platform.h"
#include "fakes/temp_root.h"
#include "platform/linux/device/services.h"
#include "platform/linux/logs/services.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

// The items, one a line: type, flags and payload, with '.' for zero and digits for small bytes.
std::string Items(const Data& snapshot) {
  std::string text;
  ByteReader reader(snapshot);
  while (reader.remaining() != 0) {
    const auto type = reader.little<std::uint32_t>();
    const auto size = reader.little<std::uint32_t>();
    text += FormatText("%u %llu ", type, reader.little<std::uint64_t>());
    for (const std::byte byte : reader.take(size)) {
      const char c = static_cast<char>(byte);
      text += c == 0 ? '.' : c < 10 ? static_cast<char>('0' + c) : c;
    }
    if (!reader.ok()) return text + "cut";
    text += '\n';
  }
  return text;
}

TEST(TaskSnapshot, IsTakenFromProcessesUnlessOneIsRecorded) {
  const TempRoot root;
  FakeSystemLog log;
  const auto snapshot = MakeLinuxTaskSnapshot(root.root(), log);
  const std::string thread = "/proc/12/task/";
  root.write(thread + "12/comm", "first\n");
  root.write(thread + "12/io",
             "rchar: 9\nwchar: 8\nsyscr: 7\nsyscw: 6\nread_bytes: 5\nwrite_bytes: 4\n"
             "cancelled_write_bytes: 3\n");
  root.write(thread + "13/comm", "with a break\n");
  root.write(thread + "13/io", "syscr: 7\nsyscw: -6\nread_bytes: 5\nwrite_bytes: 4\n");
  root.write(thread + "13x/comm", "no thread\n");
  root.write(thread + "14/comm", std::string(70, 'n'));
  root.write(thread + "15/status", "");
  root.write("/proc/9/stat", "gone");
  const auto taken = snapshot->CaptureTaskSnapshot(kTaskSnapshotTaggedItems);
  ASSERT_TRUE(taken);
  // 2^32 is 4294967296.
  EXPECT_EQ(Items(*taken),
            "19 12 1...\n19 4294967308 2...\n2313 0 first.\n"
            "2305 0 7.......5.......6.......4.......\n20 4294967308 \n"
            "19 4294967309 2...\n2313 0 with a break.\n20 4294967309 \n"
            "19 4294967310 2...\n2313 0 " +
                std::string(64, 'n') +
                "\n20 4294967310 \n"
                "19 4294967311 2...\n20 4294967311 \n20 12 \n19 9 1...\n20 9 \n4052834541 0 \n");
  EXPECT_EQ(snapshot->CaptureTaskSnapshot(0), std::nullopt);

  root.write("/var/db/kernel/task-snapshot", "recorded");
  EXPECT_EQ(snapshot->CaptureTaskSnapshot(kTaskSnapshotTaggedItems)->size(), 8u);
  std::filesystem::resize_file(root.path("/var/db/kernel/task-snapshot"), (64UL << 20) + 1);
  EXPECT_EQ(snapshot->CaptureTaskSnapshot(kTaskSnapshotTaggedItems), std::nullopt);
  EXPECT_EQ(log.errors().size(), 1u);
}

TEST(CrashSupport, TellsDeviceAndIncident) {
  const TempRoot root;
  FakeSystemLog log;
  FakeClock clock;
  FakeOSVersion osVersion;
  const auto support = MakeLinuxCrashSupport(root.root(), Access::kReadOnly, clock, osVersion, log);
  root.write("/etc/machine-id", "0123abc\nforged: line\n");
  EXPECT_EQ(support->GetSysIDWithDescription(), "0123abc");
  root.write("/sys/devices/virtual/dmi/id/product_name", "Model T\n");
  EXPECT_EQ(support->GetHardwareModel(), "Model T");
  EXPECT_EQ(support->GetSystemVersion(), OSVersionText(osVersion));
  const std::string incident = support->GetIncidentID();
  EXPECT_TRUE(std::regex_match(
      incident, std::regex("[0-9A-F]{8}-[0-9A-F]{4}-4[0-9A-F]{3}-[89AB][0-9A-F]{3}-[0-9A-F]{12}")))
      << incident;
  EXPECT_NE(support->GetIncidentID(), incident);
}

}  // namespace
}  // namespace quorlet
