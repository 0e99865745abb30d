#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <thread>

#include "fakes/fake_system_log.h"
#include "fakes/temp_root.h"
#include "platform/linux/base/paths.h"
#include "platform/linux/service/frame_buffer.h"
#include "platform/linux/service/listening_socket.h"
#include "platform/linux/service/services.h"
#include "platform/linux/service/unix_socket.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr char kName[] = "nuvex.test";

std::string FrameOf(const std::string& text) {
  return MakeFrame("<plist version=\"1.0\"><string>" + text + "</string></plist>");
}

// A service that writes down what it hears, and peers of it.
class NamedServiceTest : public testing::Test {
 protected:
  bool listen(NamedService& listening) {
    return listening.ListenNamedService(kName, [this, &listening](const ListenerEvent& event) {
      ++peers;
      listening.AcceptPeerConnection(*event.peer, [this](const PropertyValue& message) {
        heard += message.description() + " ";
      });
    });
  }
  Descriptor connect() const {
    Descriptor peer = MakeUnixSocket();
    EXPECT_EQ(UnixSocketAddress(device.path(kServiceDirectory), kName).connect(peer.get()), 0);
    return peer;
  }
  static void send(const Descriptor& peer, std::string_view bytes) {
    EXPECT_EQ(WriteFully(peer.get(), bytes), 0);
  }
  // Serves until a slice passes without an event; returns what was heard since the last call.
  std::string serve(double seconds = 0.02) {
    while (service->RunMainLoop(seconds, true) == MainLoopResult::kHandledEvent) {
    }
    return std::exchange(heard, "");
  }

  TempRoot device;
  FakeSystemLog log;
  std::unique_ptr<NamedService> service = MakeLinuxNamedService(device.root(), log);
  std::string heard;
  int peers = 0;
};

TEST_F(NamedServiceTest, MessagesAreHandledOneAtATimeInOrder) {
  ASSERT_TRUE(listen(*service));
  struct stat status {};
  ASSERT_EQ(stat(device.path("/run/quorlet/nuvex.test").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777u, 0600u);
  const Descriptor one = connect();
  const Descriptor two = connect();
  EXPECT_EQ(serve(), "");
  EXPECT_EQ(peers, 2);
  send(one, FrameOf("a") + FrameOf("b") + FrameOf("c").substr(0, 9));
  EXPECT_EQ(service->RunMainLoop(1, true), MainLoopResult::kHandledEvent);
  EXPECT_EQ(heard, "a ");
  send(two, FrameOf("d"));
  EXPECT_EQ(serve(), "a b d ") << "half a message of one peer keeps no other waiting";
  send(one, FrameOf("c").substr(9));
  {
    const Descriptor hangingUp = connect();
    send(hangingUp, FrameOf("e") + FrameOf("f").substr(0, 5));
  }
  EXPECT_EQ(serve(), "c e ");
  EXPECT_EQ(log.lines.size(), 0u) << "a peer that hangs up costs nothing";
}

TEST_F(NamedServiceTest, BadFramesCloseTheirConnectionWithOneLine) {
  ASSERT_TRUE(listen(*service));
  const Descriptor good = connect();
  for (const std::string& bad :
       {MakeFrame("garbage"), MakeFrame(""), std::string("\xff\xff\xff\xff"),
        std::string("\x01\0\0\1", 4), MakeFrame("<plist><dict><key>a</key></dict></plist>")}) {
    log.lines.clear();
    const Descriptor peer = connect();
    send(peer, FrameOf("before") + bad + FrameOf("after"));
    EXPECT_EQ(serve(), "before ");
    EXPECT_EQ(log.errors().size(), 1u) << bad;
    char byte = 0;
    EXPECT_EQ(recv(peer.get(), &byte, 1, 0), 0) << "closed";
    send(good, FrameOf("still served"));
    EXPECT_EQ(serve(), "still served ");
  }
}

TEST_F(NamedServiceTest, SlicesEndOnTimeWhateverPeersDo) {
  using Clock = std::chrono::steady_clock;
  ASSERT_TRUE(listen(*service));
  std::vector<Descriptor> silent;
  for (int i = 0; i < 60; ++i) silent.push_back(connect());
  serve();
  rusage before{}, after{};
  getrusage(RUSAGE_SELF, &before);
  const auto start = Clock::now();
  EXPECT_EQ(service->RunMainLoop(0.3, true), MainLoopResult::kTimedOut);
  EXPECT_GE(Clock::now() - start, std::chrono::milliseconds(300));
  getrusage(RUSAGE_SELF, &after);
  const auto used = (after.ru_utime.tv_sec - before.ru_utime.tv_sec) * 1'000'000 +
                    after.ru_utime.tv_usec - before.ru_utime.tv_usec;
  EXPECT_LT(used, 100'000) << "waiting is not spinning";

  const Descriptor trickling = connect();
  serve();
  std::atomic<bool> stop = false;
  std::thread peer([&] {
    const std::string frame = FrameOf(std::string(100000, 'x'));
    for (std::size_t i = 0; i < frame.size() && !stop; ++i) {
      send(trickling, frame.substr(i, 1));
      std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
  });
  const auto trickleStart = Clock::now();
  EXPECT_EQ(service->RunMainLoop(0.3, true), MainLoopResult::kTimedOut);
  EXPECT_LT(Clock::now() - trickleStart, std::chrono::seconds(5));
  stop = true;
  peer.join();
}

TEST_F(NamedServiceTest, TheOrderOfArrivalHoldsAcrossConnections) {
  ASSERT_TRUE(listen(*service));
  const Descriptor one = connect();
  const Descriptor two = connect();
  serve();
  send(two, FrameOf("a"));
  send(one, FrameOf("b"));
  EXPECT_EQ(serve(), "a b ") << "not the order in which the peers connected";
  send(one, FrameOf("c"));
  EXPECT_EQ(service->RunMainLoop(1, true), MainLoopResult::kHandledEvent);
  const Descriptor newcomer = connect();
  send(newcomer, FrameOf("d"));
  send(two, FrameOf("e"));
  send(one, FrameOf("f"));
  EXPECT_EQ(serve(), "c d e f ") << "what comes while another message is handled";
}

TEST_F(NamedServiceTest, APeerThatHasSpokenKeepsItsPlace) {
  ASSERT_TRUE(listen(*service));
  const Descriptor announced = connect();
  send(announced, FrameOf("status"));
  EXPECT_EQ(serve(), "status ");
  std::vector<Descriptor> silent;
  for (std::size_t i = 0; i <= kMaxConnections; ++i) {
    silent.push_back(connect());
    serve(0.001);
  }
  send(announced, FrameOf("apps"));
  EXPECT_EQ(serve(), "apps ");
}

TEST_F(NamedServiceTest, AStaleSocketIsReplacedAndNothingElse) {
  ASSERT_TRUE(listen(*service));
  auto second = MakeLinuxNamedService(device.root(), log);
  EXPECT_FALSE(listen(*second)) << "a live socket";
  EXPECT_TRUE(log.errors().empty()) << "whoever came first serves, which is no fault";
  EXPECT_EQ(log.at(LogLevel::kInfo).size(), 1u);
  second.reset();
  EXPECT_TRUE(device.exists("/run/quorlet/nuvex.test"));
  service.reset();
  EXPECT_FALSE(device.exists("/run/quorlet/nuvex.test"));

  const Descriptor stale = MakeUnixSocket();
  ASSERT_EQ(UnixSocketAddress(device.path(kServiceDirectory), kName).bind(stale.get()), 0);
  service = MakeLinuxNamedService(device.root(), log);
  EXPECT_TRUE(listen(*service));
  const Descriptor peer = connect();
  send(peer, FrameOf("x"));
  EXPECT_EQ(serve(), "x ");

  for (const char* name : {"", ".", "a/b", "../x", "a\nb"}) {
    log.lines.clear();
    second = MakeLinuxNamedService(device.root(), log);
    EXPECT_FALSE(second->ListenNamedService(name, nullptr)) << name;
    EXPECT_EQ(log.errors().size(), 1u) << name;
  }
  TempRoot other;
  other.write("/run/quorlet/nuvex.test/file", "");
  second = MakeLinuxNamedService(other.root(), log);
  EXPECT_FALSE(listen(*second)) << "a directory";
  EXPECT_TRUE(other.exists("/run/quorlet/nuvex.test/file"));
}

TEST_F(NamedServiceTest, APassedSocketIsServed) {
  const Descriptor passed = MakeUnixSocket();
  ASSERT_EQ(MakeDirectories(device.path(kServiceDirectory)), 0);
  ASSERT_EQ(UnixSocketAddress(device.path(kServiceDirectory), kName).bind(passed.get()), 0);
  ASSERT_EQ(::listen(passed.get(), 5), 0);
  const Descriptor peer = connect();
  send(peer, FrameOf("passed"));
  const pid_t child = fork();
  if (child == 0) {
    dup2(passed.get(), 3);
    setenv("LISTEN_PID", std::to_string(getpid()).c_str(), 1);
    setenv("LISTEN_FDS", "1", 1);
    const bool served = listen(*service) && serve() == "passed ";
    const bool usedUp = getenv("LISTEN_FDS") == nullptr;
    service.reset();
    _exit(served && usedUp && device.exists("/run/quorlet/nuvex.test") ? 0 : 1);
  }
  int status = 1;
  waitpid(child, &status, 0);
  EXPECT_EQ(status, 0);
}

TEST_F(NamedServiceTest, NotificationsCountTheirPostings) {
  const auto notifications = MakeLinuxNotifications(device.root(), log);
  const std::string path = "/run/quorlet/notify/n";
  const std::pair<const char*, const char*> cases[] = {
      {"", "1\n"},        {"1\n", "2\n"},  {"9", "10\n"},
      {"damaged", "1\n"}, {"-1\n", "1\n"}, {"18446744073709551615\n", "18446744073709551615\n"}};
  for (const auto& [before, after] : cases) {
    if (*before != '\0') device.write(path, before);
    notifications->PostNotification("n");
    EXPECT_EQ(device.read(path), after) << before;
  }
  EXPECT_EQ(log.lines.size(), 0u);
  notifications->PostNotification("../n");
  EXPECT_EQ(log.errors().size(), 1u);
}

}  // namespace
}  // namespace quorlet
