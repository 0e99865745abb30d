// The usage of the machine's services: kinds of network from recorded trees, and a service manager
// that answers well, badly or not at all.
#include "platform/linux/network/unit_usage.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <future>

#include "fakes/temp_root.h"
#include "platform/linux/base/descriptor.h"
#include "platform/linux/network/network_links.h"

namespace quorlet {
namespace {

using namespace std::string_literals;

// A unit of 94 bytes in the manager's list; `name` has three letters.
std::string Unit(const std::string& name) {
  return "\13\0\0\0"s + name + ".service\0\0\0\0\0\0\0\0\0\6\0\0\0loaded\0\0\6\0\0\0active\0\0"s +
         std::string(16, '\0') + "\4\0\0\0/"s + name + std::string(16, '\0') + "\1\0\0\0/\0"s;
}

// The reply to call 1, the unit list.
std::string List(const std::string& body) {
  return "l\2\0\1"s + static_cast<char>(body.size()) + "\0\0\0M\0\0\0C\0\0\0\5\1u\0\1\0\0\0"s +
         "\7\1s\0\30\0\0\0org.freedesktop.systemd1\0\0\0\0\0\0\0\0"s +
         "\10\1g\0\15a(ssssssouso)\0\0\0\0\0\0"s + body;
}

// The reply to a later call, a variant with eight bytes of a number.
std::string Number(char serial, const std::string& bytes) {
  return "l\2\0\1\20\0\0\0M\0\0\0\17\0\0\0\5\1u\0"s + serial +
         "\0\0\0\10\1g\0\1v\0\0\1t\0\0\0\0\0\0"s + bytes;
}

// An error as the reply to call 1.
std::string Failure(const std::string& name) {
  const std::string field = "\4\1s\0"s + static_cast<char>(name.size()) + "\0\0\0"s + name + "\0"s;
  const std::string fields = "\5\1u\0\1\0\0\0"s + field;
  const std::string padding((8 - fields.size() % 8) % 8, '\0');
  return "l\3\0\1\0\0\0\0M\0\0\0"s + static_cast<char>(fields.size()) + "\0\0\0"s + fields +
         padding;
}

class UnitUsage : public testing::Test {
 protected:
  void has(const std::string& name, const std::string& type, const std::string& received,
           const std::string& event) {
    const std::string directory = "/sys/class/net/" + name + "/";
    root.write(directory + "type", type + "\n");
    root.write(directory + "uevent", event + "\nINTERFACE=" + name + "\n");
    root.write(directory + "statistics/rx_bytes", received + "\n");
    root.write(directory + "statistics/tx_bytes", "0\n");
  }
  // What comes of a manager that says `replies`.
  std::optional<Array> usage(const std::string& replies) {
    std::filesystem::create_directories(root.path("/run/systemd"));
    std::filesystem::remove(root.path("/run/systemd/private"));
    sockaddr_un address = {.sun_family = AF_UNIX, .sun_path = {}};
    root.path("/run/systemd/private").copy(address.sun_path, sizeof address.sun_path - 1);
    const Descriptor listener(socket(AF_UNIX, SOCK_STREAM, 0));
    const auto* any = reinterpret_cast<const sockaddr*>(&address);
    EXPECT_TRUE(bind(listener.get(), any, sizeof address) == 0 && listen(listener.get(), 1) == 0);
    Descriptor peer;
    const auto manager = std::async(std::launch::async, [&] {
      peer = Descriptor(accept(listener.get(), nullptr, nullptr));
      (void)!send(peer.get(), replies.data(), replies.size(), MSG_NOSIGNAL);
    });
    return ReadUnitUsage(root.root(), std::chrono::seconds(2));
  }

  TempRoot root;
};

TEST_F(UnitUsage, TrafficHasAKindWhereEveryUsedInterfaceHasIt) {
  const std::tuple<const char*, const char*, const char*, std::string, std::optional<LinkKind>>
      steps[] = {
          {"docker0", "1", "5", "DEVTYPE=bridge", std::nullopt},
          {"rmnet0", "519", "7", "", LinkKind::kCellular},
          {"wlan0", "1", "1", "DEVTYPE=wlan", std::nullopt},
          {"rmnet0", "519", "0", "", LinkKind::kWifi},
          {"ppp0", "512", "unreadable", "DEVTYPE=ppp", std::nullopt},
          {"ppp0", "512", "0", "DEVTYPE=ppp", LinkKind::kWifi},
      };
  for (const auto& [name, type, received, event, kind] : steps) {
    has(name, type, received, event);
    EXPECT_EQ(SoleLinkKind(root.root()), SoleLink(kind)) << name << " " << received;
  }
}

TEST_F(UnitUsage, CountedServicesBecomeRecordsAndABadManagerGivesNone) {
  has("wlan0", "1", "9", "DEVTYPE=wlan");
  const std::string body = "\276\0\0\0\0\0\0\0"s + Unit("web") + "\0\0"s + Unit("off");
  const std::string rest = Number(2, "\210\23\0\0\0\0\0\0"s) + Number(3, std::string(8, '\377')) +
                           Number(4, "\376" + std::string(7, '\377')) +
                           Number(5, "\377\10\75\0\0\0\0\0"s);  // 3.99... seconds
  EXPECT_EQ(usage("OK 1\r\n" + List(body) + rest),
            (Array{Dictionary{{"procName", "web"},
                              {"since", Date{3}},
                              {"wifiInBytes", Int64(5000)},
                              {"wifiOutBytes", Int64(INT64_MAX)},
                              {"wwanInBytes", Int64(0)},
                              {"wwanOutBytes", Int64(0)}}}));
  EXPECT_EQ(usage("OK 1\r\n" + Failure("org.freedesktop.DBus.Error.ServiceUnknown")), Array());
  EXPECT_EQ(usage("OK 1\r\n" + Failure("org.freedesktop.DBus.Error.NoReply")), std::nullopt);
  for (std::size_t length = 1; length < body.size(); ++length) {
    EXPECT_EQ(usage("OK 1\r\n" + List(body.substr(0, length)) + rest), std::nullopt);
  }
  for (const auto& [position, byte] : std::map<std::size_t, char>{
           {0, 'B'}, {3, 2}, {7, 1}, {15, -1}, {17, 2}, {18, 'x'}, {20, 99}}) {
    const std::string damaged = List(body).replace(position, 1, 1, byte);
    EXPECT_EQ(usage("OK 1\r\n" + damaged + rest), std::nullopt) << position;
  }
}

}  // namespace
}  // namespace quorlet
