// Entries of the structured log: one line each, whatever they hold and whatever goes wrong.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>

#include <thread>

#include "fakes/fake_platform.h"
#include "fakes/temp_root.h"
#include "platform/linux/services.h"

namespace quorlet {
namespace {

const std::string kDirectory = "/var/mobile/Library/Logs/FaultScribe/";
const std::string kLog = kDirectory + "structured.jsonl";

class StructuredLogTest : public testing::Test {
 protected:
  TempRoot root;
  FakeSystemLog log;
  FakeClock clock;  // 2024-10-04T12:00:00Z
  FakeOSVersion osVersion;
  const std::unique_ptr<CrashSupport> support =
      MakeLinuxCrashSupport(root.root(), Access::kReadWrite, clock, osVersion, log);
};

TEST_F(StructuredLogTest, EveryEntryIsALineOrNothing) {
  root.write(kLog, "{\"ty");  // cut short by a crash
  support->FSLogStructuredData(INT32_MIN, {{"e\xff", "a\nb \xc3\x28 \"%s\""}});
  const std::string before = root.read(kLog);
  EXPECT_EQ(before, R"({"ty
{"type":-2147483648,"time":"2024-10-04T12:00:00Z","data":{"e\ufffd":"a\nb \ufffd( \"%s\""}})"
                    "\n");

  // A full disk leaves it as it was.
  rlimit limit = {};
  ASSERT_EQ(getrlimit(RLIMIT_FSIZE, &limit), 0);
  const rlimit full = {before.size() + 20, limit.rlim_max};
  signal(SIGXFSZ, SIG_IGN);
  ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &full), 0);
  support->FSLogStructuredData(1, {});
  ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &limit), 0);
  EXPECT_EQ(root.read(kLog), before);
  EXPECT_EQ(log.errors().size(), 1u);
}

TEST_F(StructuredLogTest, NoLineIsLostWhileOldDaysAreMoved) {
  FakeClock tomorrow;
  tomorrow.seconds += 86400;
  const auto mover =
      MakeLinuxCrashSupport(root.root(), Access::kReadWrite, tomorrow, osVersion, log);
  std::thread moves([&] {
    for (int i = 0; i < 30; ++i) mover->FSDumpAllOldStructuredDataLogs();
  });
  for (int i = 0; i < 100; ++i) support->FSLogStructuredData(i, {});
  moves.join();
  mover->FSDumpAllOldStructuredDataLogs();
  EXPECT_EQ(std::ranges::count(root.read(kDirectory + "structured-20241004.jsonl"), '\n'), 100);
}

}  // namespace
}  // namespace quorlet
