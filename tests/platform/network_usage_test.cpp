// The network-usage service over files below a root, and the semaphores that its callers wait on.
#include "platform/linux/network/network_usage.h"

#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <thread>

#include "fakes/fake_system_log.h"
#include "fakes/temp_root.h"
#include "platform/linux/base/semaphores.h"

namespace quorlet {
namespace {

using namespace std::chrono_literals;

class NetworkUsageTest : public testing::Test {
 protected:
  void holds(const std::string& delay, const std::string& records) {
    root.write("/var/db/vigil/usage.plist", "<plist version=\"1.0\"><dict><key>Delay</key>" +
                                                delay + "<key>Records</key>" + records +
                                                "</dict></plist>");
  }
  // The records of one reply.
  std::optional<Array> recordsOf(const std::vector<std::string>& names = {}) {
    std::promise<std::optional<Array>> reply;
    const auto usage = MakeLinuxNetworkUsage(root.root(), log);
    usage->QueryProcessDataUsage(names, UsageNameKind::kProcessName, [&](const Array* given) {
      reply.set_value(given ? std::optional(*given) : std::nullopt);
    });
    return reply.get_future().get();
  }

  TempRoot root;
  FakeSystemLog log;
  const std::unique_ptr<Semaphores> semaphores = MakeLinuxSemaphores();
};

TEST_F(NetworkUsageTest, RecordsComeAsTheFileHasThem) {
  const std::string list =
      "<array><dict><key>procName</key><string>a</string></dict><string>odd</string></array>";
  const Array all = {Dictionary{{"procName", "a"}}, "odd"};
  const std::tuple<std::string, std::string, std::optional<Array>> cases[] = {
      {"<integer>0</integer>", "<array>", std::nullopt},
      {"<integer>0</integer>", "<true/>", std::nullopt},
      {"<integer>0</integer>", "<array/>", Array()},
      {"<real>nan</real>", list, all},
      {"<integer>-9223372036854775808</integer>", list, all},
      {"<string>5</string>", list, all},
  };
  for (const auto& [delay, given, records] : cases) {
    holds(delay, given);
    EXPECT_EQ(recordsOf(), records) << delay << given;
  }
  EXPECT_EQ(recordsOf({"b", "a"}), (Array{Dictionary{{"procName", "a"}}}));
}

TEST_F(NetworkUsageTest, TheEndWaitsForWhatIsProcessedAndDropsWhatHasNotCome) {
  const auto begun = semaphores->create();
  std::atomic<bool> finished = false;
  auto usage = MakeLinuxNetworkUsage(root.root(), log);
  const auto query = [&](const std::string& delay, NetworkUsage::Reply reply) {
    holds(delay, "<array/>");
    usage->QueryProcessDataUsage({}, UsageNameKind::kProcessName, std::move(reply));
    std::this_thread::sleep_for(50ms);
  };
  query("<integer>9223372036854775807</integer>", [](const Array*) { ADD_FAILURE() << "came"; });
  query("<real>0</real>", [](const Array*) { throw std::runtime_error("no more room"); });
  query("<real>0</real>", [&](const Array*) {
    begun->signal();
    std::this_thread::sleep_for(200ms);
    finished = true;
  });
  EXPECT_TRUE(begun->wait(5s));
  usage.reset();
  EXPECT_TRUE(finished);
  EXPECT_EQ(log.errors().size(), 1u);
}

TEST_F(NetworkUsageTest, SemaphoresCountAcrossThreads) {
  const auto semaphore = semaphores->create();
  std::atomic<int> taken = 0;
  const auto take = [&] {
    for (int n = 0; n < 500; ++n) taken += semaphore->wait(24h) ? 1 : 0;
  };
  std::thread first(take), second(take);
  for (int n = 0; n < 1000; ++n) semaphore->signal();
  first.join(), second.join();
  EXPECT_EQ(taken, 1000);
  EXPECT_FALSE(semaphore->wait(0ms));
}

}  // namespace
}  // namespace quorlet
