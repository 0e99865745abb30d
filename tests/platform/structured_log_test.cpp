// Entries of the structured log: one line each, whatever they hold and whatever goes wrong.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>

#include <algorithm>
#include <limits>
#include <thread>

#include "fakes/fake_clock.h"
#include "fakes/fake_platform.h"
#include "fakes/temp_root.h"
#include "platform/linux/services.h"

namespace quorlet {
namespace {

constexpr char kDirectory[] = "/var/mobile/Library/Logs/FaultScribe/";

class StructuredLogTest : public testing::Test {
 protected:
  std::string read(const std::string& name) const { return root.read(kDirectory + name); }

  TempRoot root;
  FakeSystemLog log;
  FakeClock clock;  // 2024-10-04T12:00:00Z
  const std::unique_ptr<CrashSupport> support =
      MakeLinuxCrashSupport(root.root(), Access::kReadWrite, clock, log);
};

TEST_F(StructuredLogTest, EveryEntryIsALine) {
  MakeLinuxCrashSupport(root.root(), Access::kReadOnly, clock, log)->FSLogStructuredData(1, {});
  EXPECT_FALSE(root.exists("/var"));
  root.write(kDirectory + std::string("structured.jsonl"), "{\"ty");  // cut short by a crash
  constexpr double kInfinity = std::numeric_limits<double>::infinity();
  support->FSLogStructuredData(-2147483647 - 1, {});
  support->FSLogStructuredData(
      172, {{"a", Data{std::byte{0}, std::byte{0xff}, std::byte{3}, std::byte{4}}},
            {"b", Date{1772600767.9}},
            {"c", Array{Double(std::nan("")), Double(kInfinity), Double(-kInfinity), Double(0.5)}},
            {"d", Array{UInt64(~std::uint64_t{0}), Int64(INT64_MIN), true}},
            {"e\xff", "line\nbreak \xc3\x28 \"%s\""}});
  EXPECT_EQ(read("structured.jsonl"),
            "{\"ty\n"
            "{\"type\":-2147483648,\"time\":\"2024-10-04T12:00:00Z\",\"data\":{}}\n"
            "{\"type\":172,\"time\":\"2024-10-04T12:00:00Z\",\"data\":{\"a\":\"AP8DBA==\","
            "\"b\":\"2026-03-04T05:06:07Z\",\"c\":[\"nan\",\"inf\",\"-inf\",0.5],"
            "\"d\":[18446744073709551615,-9223372036854775808,true],"
            "\"e\\ufffd\":\"line\\nbreak \\ufffd( \\\"%s\\\"\"}}\n");
  EXPECT_TRUE(log.errors().empty());
}

TEST_F(StructuredLogTest, AFullDiskLeavesTheLogAsItWas) {
  support->FSLogStructuredData(1, {});
  const std::string before = read("structured.jsonl");
  rlimit limit = {};
  ASSERT_EQ(getrlimit(RLIMIT_FSIZE, &limit), 0);
  const rlimit full = {before.size() + 20, limit.rlim_max};
  const auto handler = signal(SIGXFSZ, SIG_IGN);
  ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &full), 0);
  support->FSLogStructuredData(1, {});
  ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &limit), 0);
  signal(SIGXFSZ, handler);
  EXPECT_EQ(read("structured.jsonl"), before);
  EXPECT_EQ(log.errors().size(), 1u);
}

TEST_F(StructuredLogTest, NoLineIsLostWhileOldDaysAreMoved) {
  FakeClock tomorrow;
  tomorrow.seconds += 86400;
  FakeSystemLog errors;
  const auto mover = MakeLinuxCrashSupport(root.root(), Access::kReadWrite, tomorrow, errors);
  std::thread moves([&] {
    for (int i = 0; i < 30; ++i) mover->FSDumpAllOldStructuredDataLogs();
  });
  for (int i = 0; i < 100; ++i) support->FSLogStructuredData(i, {});
  moves.join();
  mover->FSDumpAllOldStructuredDataLogs();
  EXPECT_EQ(std::ranges::count(read("structured-20241004.jsonl"), '\n'), 100);
  EXPECT_EQ(read("structured.jsonl"), "");
  EXPECT_TRUE(errors.errors().empty());
}

}  // namespace
}  // namespace quorlet
