// The network-usage service over files below a root, and the semaphores that its callers wait on.
#include "platform/linux/network_usage.h"

#include <gtest/gtest.h>

#include <atomic>
#include <mutex>
#include <optional>
#include <thread>

#include "fakes/temp_root.h"
#include "platform/linux/semaphores.h"

namespace quorlet {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

class ErrorLog : public SystemLog {
 public:
  void write(LogLevel level, std::string_view text) override {
    const std::lock_guard lock(mutex_);
    if (level == LogLevel::kError) lines_.emplace_back(text);
  }
  std::vector<std::string> take() {
    const std::lock_guard lock(mutex_);
    return std::exchange(lines_, {});
  }

 private:
  std::mutex mutex_;
  std::vector<std::string> lines_;
};

class NetworkUsageTest : public testing::Test {
 protected:
  void holds(const std::string& document) {
    root.write("/var/db/vigil/usage.plist", "<plist version=\"1.0\">" + document + "</plist>");
  }
  // The records of one reply; nullopt when none came in time.
  std::optional<Array> query(const std::vector<std::string>& names = {}) {
    const auto replied = semaphores->create();
    Array records;
    auto usage = MakeLinuxNetworkUsage(root.root(), log);
    usage->QueryProcessDataUsage(names, UsageNameKind::kProcessName, [&](const Array& given) {
      EXPECT_NE(std::this_thread::get_id(), caller);
      records = given;
      replied->signal();
    });
    if (!replied->wait(seconds(2))) return std::nullopt;
    return records;
  }

  TempRoot root;
  ErrorLog log;
  const std::thread::id caller = std::this_thread::get_id();
  const std::unique_ptr<Semaphores> semaphores = MakeLinuxSemaphores();
};

TEST_F(NetworkUsageTest, RecordsComeAsTheFileHasThem) {
  root.write("/sys/class/net/x", "");  // no machine's interfaces
  EXPECT_EQ(query(), Array()) << "no file";
  const std::string list =
      "<array><dict><key>procName</key><string>a</string></dict><string>odd</string>"
      "<dict><key>procName</key><integer>7</integer></dict></array>";
  const Array all = {Dictionary{{"procName", "a"}}, "odd", Dictionary{{"procName", Int64(7)}}};
  const auto delayed = [&](const std::string& delay, const std::string& records) {
    return "<dict><key>Delay</key>" + delay + "<key>Records</key>" + records + "</dict>";
  };
  const struct {
    std::string document;
    Array records;
    std::size_t errors;
  } cases[] = {
      {list, all, 0},
      {"<dict><key>Records</key>" + list + "</dict>", all, 0},
      {delayed("<real>0.01</real>", list), all, 0},
      {delayed("<real>nan</real>", list), all, 0},
      {delayed("<real>-1e300</real>", list), all, 0},
      {delayed("<integer>-9223372036854775808</integer>", list), all, 0},
      {delayed("<string>5</string>", list), all, 1},
      {delayed("<string>5</string>", "<integer>1</integer>"), {}, 1},
      {delayed("<integer>0</integer>", "<dict/>"), {}, 1},
      {"<dict/>", {}, 1},
      {"<array>", {}, 1},
  };
  for (const auto& [document, records, errors] : cases) {
    holds(document);
    EXPECT_EQ(query(), records) << document;
    EXPECT_EQ(log.take().size(), errors) << document;
  }
  holds(list);
  EXPECT_EQ(query({"b", "a"}), (Array{Dictionary{{"procName", "a"}}}));
  EXPECT_EQ(query({"odd"}), Array());
  std::filesystem::remove(root.path("/var/db/vigil/usage.plist"));
  root.write("/var/db/vigil/usage.plist/directory", "");
  EXPECT_EQ(query(), Array());
  EXPECT_EQ(log.take().size(), 1u);
}

TEST_F(NetworkUsageTest, TheEndWaitsForWhatIsProcessedAndDropsWhatHasNotCome) {
  const auto start = std::chrono::steady_clock::now();
  const auto givenUp = semaphores->create();
  const auto begun = semaphores->create();
  std::atomic<bool> finished = false;
  auto usage = MakeLinuxNetworkUsage(root.root(), log);
  const auto query = [&](const std::string& delay, NetworkUsage::Reply reply) {
    holds("<dict><key>Delay</key>" + delay + "<key>Records</key><array/></dict>");
    usage->QueryProcessDataUsage({}, UsageNameKind::kProcessName, std::move(reply));
    std::this_thread::sleep_for(milliseconds(50));
  };
  for (const char* never : {"<real>inf</real>", "<integer>9223372036854775807</integer>"}) {
    query(never, [](const Array&) { ADD_FAILURE() << "came"; });
  }
  const auto signalAtTheEnd = [&](int* number) { delete number, givenUp->signal(); };
  query("<real>0</real>", [held = std::shared_ptr<int>(new int, signalAtTheEnd)](const Array&) {
    throw std::runtime_error("no more room");
  });
  EXPECT_TRUE(givenUp->wait(seconds(5))) << "a reply is given up when it is done";
  query("<real>0</real>", [&](const Array&) {
    begun->signal();
    std::this_thread::sleep_for(milliseconds(200));
    finished = true;
  });
  EXPECT_TRUE(begun->wait(seconds(5)));
  usage.reset();
  EXPECT_TRUE(finished);
  EXPECT_LT(std::chrono::steady_clock::now() - start, seconds(5));
  EXPECT_EQ(log.take(), std::vector<std::string>{"A network usage reply failed: no more room"});
}

TEST_F(NetworkUsageTest, SemaphoresCountAcrossThreads) {
  const auto semaphore = semaphores->create();
  EXPECT_FALSE(semaphore->wait(milliseconds(0)));
  EXPECT_FALSE(semaphore->wait(milliseconds(-5)));
  const auto start = std::chrono::steady_clock::now();
  EXPECT_FALSE(semaphore->wait(milliseconds(30)));
  EXPECT_GE(std::chrono::steady_clock::now() - start, milliseconds(30));
  std::atomic<int> taken = 0;
  std::vector<std::thread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([&] {
      for (int n = 0; n < 250; ++n) taken += semaphore->wait(std::chrono::hours(24)) ? 1 : 0;
    });
  }
  for (int n = 0; n < 1001; ++n) semaphore->signal();
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(taken, 1000);
  EXPECT_TRUE(semaphore->wait(milliseconds(0)));
  EXPECT_FALSE(semaphore->wait(milliseconds(0)));
}

}  // namespace
}  // namespace quorlet
