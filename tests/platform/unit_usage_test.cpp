// The usage of the machine's services: kinds of network from recorded trees, and a service manager
// that answers well, badly or not at all.
#include "platform/linux/unit_usage.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <functional>
#include <thread>

#include "fakes/temp_root.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/network_links.h"

namespace quorlet {
namespace {

constexpr std::uint64_t kOff = ~std::uint64_t{0};

struct Bytes {
  std::string text;

  Bytes& align(std::size_t size) {
    text.resize((text.size() + size - 1) / size * size);
    return *this;
  }
  Bytes& number(std::uint64_t value, std::size_t size) {
    align(size);
    for (std::size_t i = 0; i < size; ++i) text += static_cast<char>(value >> (8 * i));
    return *this;
  }
  // A string has a length of 4 bytes, a signature one of 1.
  Bytes& string(std::string_view value, std::size_t lengthBytes = 4) {
    number(value.size(), lengthBytes).text.append(value) += '\0';
    return *this;
  }
};

std::string Message(std::uint8_t type, std::uint32_t serial, std::string_view signature,
                    const std::string& body) {
  Bytes fields;
  fields.number(5, 1).string("u", 1).number(serial, 4);
  fields.align(8).number(7, 1).string("s", 1).string("org.freedesktop.systemd1");
  fields.align(8).number(8, 1).string("g", 1).string(signature, 1);
  Bytes message{.text = {'l', static_cast<char>(type), 0, 1}};
  message.number(body.size(), 4).number(77, 4).string(fields.text).text.pop_back();
  return message.align(8).text + body;
}

struct FakeUnit {
  std::string name, state;
  std::uint64_t in, out, start;
};
using Distortion = std::function<std::string(std::string reply)>;

// Serves one connection to a socket below the root.
class FakeManager {
 public:
  FakeManager(const TempRoot& root, std::string_view path, std::vector<FakeUnit> units,
              Distortion distort)
      : units_(std::move(units)), distort_(std::move(distort)) {
    std::filesystem::create_directories(std::filesystem::path(root.path(path)).parent_path());
    unlink(root.path(path).c_str());
    sockaddr_un address = {.sun_family = AF_UNIX, .sun_path = {}};
    std::strcpy(address.sun_path, root.path(path).c_str());
    const auto* any = reinterpret_cast<const sockaddr*>(&address);
    if (bind(socket_, any, sizeof address) != 0 || listen(socket_, 5) != 0) std::abort();
    thread_ = std::thread([this] { serve(accept(socket_, nullptr, nullptr)); });
  }
  ~FakeManager() {
    shutdown(socket_, SHUT_RDWR);
    thread_.join();
    close(socket_);
  }

 private:
  void serve(int peer) {
    std::string received;
    char chunk[65536];
    for (ssize_t count; (count = read(peer, chunk, sizeof chunk)) > 0;) {
      received.append(chunk, static_cast<std::size_t>(count));
      std::string replies;
      if (received.starts_with(std::string_view("\0AUTH EXTERNAL 3", 16))) {
        EXPECT_TRUE(received.ends_with("\r\nBEGIN\r\n"));
        received.clear();
        replies = "OK 0123\r\n";
      }
      int open = 0;
      for (std::size_t length; received.size() >= kBusHeaderBytes; received.erase(0, length)) {
        length = BusMessageLength(received, 1 << 20).value();
        if (received.size() < length) break;
        EXPECT_LE(++open, 64) << "a bus allows 128 open calls";
        replies += distort_(answer(received.substr(0, length)));
      }
      (void)!send(peer, replies.data(), replies.size(), MSG_NOSIGNAL);
    }
    close(peer);
  }

  std::string answer(const std::string& call) const {
    const auto asks = [&](std::string_view what) { return call.find(what) != call.npos; };
    const auto serial = BusReader(std::string_view(call).substr(8)).number<std::uint32_t>();
    const std::string signal = Message(4, 0, "s", Bytes().string("NameAcquired").text);
    if (asks("Hello")) return signal + Message(2, serial, "s", Bytes().string(":1.9").text);
    if (asks("ListUnits")) {
      Bytes list;
      for (std::size_t i = 0; i < units_.size(); ++i) {
        list.align(8).string(units_[i].name).string("text").string("loaded");
        list.string(units_[i].state).string("running").string("");
        list.string("/u/" + std::to_string(i) + "x").number(0, 4).string("").string("/");
      }
      return Message(2, serial, "a(ssssssouso)",
                     Bytes().number(list.text.size(), 4).align(8).text + list.text);
    }
    const FakeUnit& unit = units_.at(std::stoul(call.substr(call.find("/u/") + 3)));
    if (unit.name == "gone.service") return Message(3, serial, "v", "error");
    const auto value = asks("IPIngress") ? unit.in : asks("IPEgress") ? unit.out : unit.start;
    return Message(2, serial, "v", Bytes().string("t", 1).number(value, 8).text);
  }

  const int socket_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const std::vector<FakeUnit> units_;
  const Distortion distort_;
  std::thread thread_;
};

class UnitUsage : public testing::Test {
 protected:
  struct Interface {
    std::string name, type, received;
    std::vector<std::string> marks;  // directories in it
    std::string event;
  };
  void has(const Interface& interface) {
    const std::string directory = "/sys/class/net/" + interface.name + "/";
    std::filesystem::remove_all(root.path(directory));
    root.write(directory + "type", interface.type + "\n");
    root.write(directory + "uevent", interface.event + "\nINTERFACE=" + interface.name + "\n");
    root.write(directory + "statistics/rx_bytes", interface.received + "\n");
    root.write(directory + "statistics/tx_bytes", "0\n");
    for (const std::string& mark : interface.marks) root.write(directory + mark + "/x", "");
  }
  auto usageOf(const std::vector<FakeUnit>& units, int milliseconds = 5000,
               Distortion distort = std::identity(),
               std::string_view socketPath = "/run/systemd/private") {
    const FakeManager manager(root, socketPath, units, std::move(distort));
    return ReadUnitUsage(root.root(), std::chrono::milliseconds(milliseconds));
  }

  TempRoot root;
  const Interface wifi = {"wlan0", "1", "9", {"device", "phy80211"}, ""};
  const Interface modem = {"rmnet0", "519", "9", {}, ""};
  const std::vector<FakeUnit> one = {{"a.service", "active", 1, 2, 3000000}};
};

TEST_F(UnitUsage, TrafficHasAKindWhereEveryUsedInterfaceHasIt) {
  root.write("/sys/class/net/bonding_masters", "\n");
  const auto none = std::nullopt;
  const std::pair<Interface, std::optional<LinkKind>> steps[] = {
      {{"lo", "772", "5", {"device"}, ""}, none},
      {{"docker0", "1", "5", {}, "DEVTYPE=bridge"}, none},
      {{"eth0", "1", "0", {"device"}, ""}, none},
      {{"wwan0", "65534", "7", {"device"}, "DEVTYPE=wwan"}, LinkKind::kCellular},
      {{"rmnet0", "519", "7", {}, ""}, LinkKind::kCellular},
      {{"wlan0", "1", "0", {"device"}, "DEVTYPE=wlan"}, LinkKind::kCellular},
      {{"wlan0", "1", "1", {"device"}, "DEVTYPE=wlan"}, none},
      {{"wwan0", "65534", "0", {"device"}, "DEVTYPE=wwan"}, none},
      {{"rmnet0", "519", "0", {}, ""}, LinkKind::kWifi},
      {{"wlan1", "1", "1", {"device", "wireless"}, ""}, LinkKind::kWifi},
      {{"ppp0", "512", "1", {}, "DEVTYPE=ppp"}, none},
      {{"ppp0", "512", "0", {}, "DEVTYPE=ppp"}, LinkKind::kWifi},
      {{"eth0", "1", "unreadable", {"device"}, ""}, none},
  };
  for (const auto& [interface, kind] : steps) {
    has(interface);
    EXPECT_EQ(SoleLinkKind(root.root()), kind) << interface.name << " " << interface.received;
  }
}

TEST_F(UnitUsage, CountedServicesBecomeRecords) {
  std::vector<FakeUnit> units(200, {"off.service", "active", kOff, kOff, 9000000});
  units.insert(units.end(), {{"web.service", "active", 5000, kOff - 1, 1795382043999999},
                             {"boot.target", "active", 1, 1, 9000000},
                             {"starts.service", "activating", 1, 1, 9000000},
                             {"never.service", "inactive", 1, 1, 0},
                             {"gone.service", "active", 1, 1, 9000000}});
  const auto records = [](const std::string& kind, const std::string& other) {
    return Array{Dictionary{{"procName", "web"},
                            {"since", Date{1795382043}},
                            {kind + "InBytes", Int64(5000)},
                            {kind + "OutBytes", Int64(INT64_MAX)},
                            {other + "InBytes", Int64(0)},
                            {other + "OutBytes", Int64(0)}}};
  };
  EXPECT_EQ(usageOf(units), Array()) << "no kind of network";
  has(wifi);
  EXPECT_EQ(usageOf(units), records("wifi", "wwan"));
  std::filesystem::remove_all(root.path("/sys/class/net/wlan0"));
  has(modem);
  EXPECT_EQ(
      usageOf(
          units, 5000, [](std::string reply) { return reply; }, "/run/dbus/system_bus_socket"),
      records("wwan", "wifi"));
}

TEST_F(UnitUsage, ABadManagerGivesNothingAndNeverHangs) {
  has(wifi);
  EXPECT_EQ(ReadUnitUsage(root.root(), std::chrono::seconds(5)), Array()) << "no manager";
  EXPECT_EQ(usageOf(one, 50, [](std::string) { return ""; }), std::nullopt) << "silent";
  EXPECT_EQ(usageOf(one, 0), std::nullopt) << "no time to begin with";
  const std::pair<std::size_t, char> damages[] = {
      {0, 'B'}, {3, 2}, {7, 1}, {15, -1}, {17, 2}, {18, 'x'}, {20, 99},
  };
  for (const auto& damage : damages) {
    const auto distort = [&](std::string reply) {
      reply[damage.first] = damage.second;
      return reply;
    };
    EXPECT_EQ(usageOf(one, 50, distort), std::nullopt) << damage.first;
  }
  // The list of units cut at every length, in a message that is well-formed.
  std::size_t left = 1;
  for (std::size_t length = 1; left > 0; ++length) {
    const auto records = usageOf(one, 5000, [&](std::string reply) {
      if (reply.find("a(ss") == reply.npos) return reply;
      const auto size = BusReader(std::string_view(reply).substr(4)).number<std::uint32_t>();
      left = size - length;
      return Message(2, 1, "a(ssssssouso)", reply.substr(reply.size() - size, length));
    });
    EXPECT_EQ(records.has_value(), left == 0) << length;
  }
}

}  // namespace
}  // namespace quorlet
