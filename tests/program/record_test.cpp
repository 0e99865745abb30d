// quorletctl tally listen, through its socket.
#include <gtest/gtest.h>
#include <signal.h>
#include <sqlite3.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <chrono>
#include <cstring>
#include <filesystem>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "fakes/temp_root.h"
#include "program/run_program.h"

namespace quorlet {
namespace {

using namespace std::chrono_literals;
using Words = std::vector<std::string>;

constexpr char kStore[] = "/var/mobile/Library/TallyLedger/TLDataStore.sqlitedb";

class RecordTest : public testing::Test {
 protected:
  ~RecordTest() override {
    if (listener_ > 0) end(SIGKILL);
  }

  ProgramResult run(Words words) const {
    return RunProgram(QUORLETCTL_PROGRAM, std::move(words),
                      {{{"QUORLET_ROOT", device.directory()}}, {}});
  }
  void start() {
    listener_ = fork();
    if (listener_ == 0) {
      setenv("QUORLET_ROOT", device.directory().c_str(), 1);
      execl(QUORLETCTL_PROGRAM, "quorletctl", "tally", "listen", "--idle", "0", nullptr);
      _exit(127);
    }
    // Until it answers: a stale socket is there as well.
    const auto until = std::chrono::steady_clock::now() + 20s;
    while (!connected() && std::chrono::steady_clock::now() < until) {
      std::this_thread::sleep_for(10ms);
    }
  }
  int end(int signal) {
    kill(listener_, signal);
    int status = 0;
    waitpid(listener_, &status, 0);
    listener_ = -1;
    return status;
  }
  bool connected() {
    if (sender_ >= 0) close(sender_);
    sender_ = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    const timeval patience = {3, 0};
    setsockopt(sender_, SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, device.path("/run/quorlet/statsd").c_str(),
                 sizeof address.sun_path - 1);
    return connect(sender_, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0;
  }
  bool send(const std::string& text) const {
    return ::send(sender_, text.data(), text.size(), 0) == static_cast<ssize_t>(text.size());
  }
  std::string dump() const { return run({"tally", "dump"}).out; }
  bool comesToHold(const std::string& text) const {
    for (int i = 0; i < 100; ++i) {
      if (dump().find(text) != std::string::npos) return true;
      std::this_thread::sleep_for(100ms);
    }
    return false;
  }

  const TempRoot device;
  int sender_ = -1;
  pid_t listener_ = -1;
};

TEST_F(RecordTest, ASecondListenerLeavesTheFirstAloneAndAStaleSocketIsReplaced) {
  start();
  const ProgramResult second = run({"tally", "listen"});
  EXPECT_EQ(second.status, 1);
  EXPECT_EQ(std::ranges::count(second.err, '\n'), 1) << second.err;
  EXPECT_TRUE(send("a:1|c"));
  ASSERT_TRUE(comesToHold("\ta\t1\n"));
  end(SIGKILL);
  // What was committed has stayed; what is sent now goes to the next listener.
  start();
  EXPECT_TRUE(send("a:2|c"));
  EXPECT_EQ(end(SIGTERM), 0);
  EXPECT_NE(dump().find("\ta\t3\n"), std::string::npos);
  EXPECT_FALSE(std::filesystem::exists(device.path("/run/quorlet/statsd")));
}

TEST_F(RecordTest, TakesDatagramsInWhileACommitWaits) {
  ASSERT_EQ(run({"tally", "set", "a", "0"}).status, 0);
  start();
  sqlite3* other = nullptr;
  ASSERT_EQ(sqlite3_open(device.path(kStore).c_str(), &other), SQLITE_OK);
  sqlite3_busy_timeout(other, 10'000);  // the listener, too, locks the store while it starts
  ASSERT_EQ(sqlite3_exec(other, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr), SQLITE_OK);
  // Many times what the kernel's queue holds; a sender that waits would give up after 3 s.
  const auto started = std::chrono::steady_clock::now();
  for (int i = 0; i < 5000; ++i) ASSERT_TRUE(send("a:1|c")) << i;
  EXPECT_LT(std::chrono::steady_clock::now() - started, 3s);
  sqlite3_close(other);
  EXPECT_EQ(end(SIGTERM), 0);
  EXPECT_NE(dump().find("\ta\t5000\n"), std::string::npos) << dump();
}

TEST_F(RecordTest, AFailedCommitIsTriedAgain) {
  std::filesystem::create_directories(device.path(kStore));  // no database can be opened there
  start();
  EXPECT_TRUE(send("a:1|c\nt:1:2|ms"));
  std::this_thread::sleep_for(1500ms);
  EXPECT_TRUE(send("a:1|c"));
  std::filesystem::remove(device.path(kStore));
  EXPECT_TRUE(comesToHold("\ta\t2\n")) << dump();
  EXPECT_EQ(end(SIGTERM), 0);
  EXPECT_NE(dump().find("\t2\n"), std::string::npos);
}

TEST_F(RecordTest, AFloodOfKeysIsBoundedAndToldOnce) {
  start();
  for (int i = 0; i < 10'100; i += 20) {
    std::string lines;
    for (int k = i; k < i + 20; ++k) lines += "key." + std::to_string(k) + ":1|c\n";
    ASSERT_TRUE(send(lines));
  }
  EXPECT_TRUE(send("key.0:1|c\n" + std::string(40'000, '\n') + "key.1:1|c\ngarbage"));
  EXPECT_EQ(end(SIGTERM), 0);
  const std::string stored = dump();
  EXPECT_EQ(std::ranges::count(stored, '\n'), 10'000);
  EXPECT_NE(stored.find("\tkey.1\t2\n"), std::string::npos);
  const std::string log = device.read("/var/log/quorlet.log");
  EXPECT_NE(log.find("refused 101 lines: not readable 1, too many keys today 100; most of them, 101"
                     ", from uid " +
                     std::to_string(getuid()) + "\n"),
            std::string::npos)
      << log;
  EXPECT_EQ(std::ranges::count(log, '\n'), 1) << log;
}

}  // namespace
}  // namespace quorlet
