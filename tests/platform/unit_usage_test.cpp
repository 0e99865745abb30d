// The usage of the machine's services: kinds of network from recorded trees, and a service manager
// that answers well, badly or not at all.
#include "platform/linux/unit_usage.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <functional>
#include <thread>

#include "fakes/temp_root.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/descriptor.h"
#include "platform/linux/network_links.h"

namespace quorlet {
namespace {

// A number aligned to its size, little-endian.
void Put(std::string& bytes, std::uint64_t value, std::size_t size) {
  bytes.resize((bytes.size() + size - 1) / size * size);
  for (std::size_t i = 0; i < size; ++i) bytes += static_cast<char>(value >> (8 * i));
}

std::string Message(char type, std::uint32_t serial, const std::string& signature,
                    const std::string& body) {
  std::string bytes = {'l', type, 0, 1};
  for (const std::size_t n : {body.size(), std::size_t{77}, 13 + signature.size()})
    Put(bytes, n, 4);
  Put(bytes.append("\5\1u", 4), serial, 4);
  bytes += "\10\1g" + std::string(1, '\0') + static_cast<char>(signature.size()) + signature;
  bytes.resize((bytes.size() + 8) / 8 * 8);
  return bytes + body;
}

// The reply of a manager with one counted service among many.
std::string Answer(const std::string& call) {
  const auto asks = [&](std::string_view what) { return call.find(what) != call.npos; };
  const auto serial = BusReader(std::string_view(call).substr(8)).number<std::uint32_t>();
  if (asks("/gone")) return Message(3, serial, "v", "error");
  std::string body("\1t\0", 3);
  if (!asks("ListUnits")) {
    Put(body, asks("/off") ? ~0ULL : asks("IPIngress") ? 5000 : asks("IPE") ? ~1ULL : 3999999, 8);
    return Message(2, serial, "v", body);
  }
  std::string list(8, '\0');  // its length comes last
  for (int i = 0; i < 200; ++i) {
    const std::string name = i == 0 ? "web" : i == 1 ? "gone" : "off";
    Put(list, 0, 8), list.resize(list.size() - 8);
    for (const auto& text : {name + ".service", name, name, name, name, name, "/" + name, name}) {
      Put(list, text.size(), 4), list += text + '\0';
      if (text[0] == '/') Put(list, 0, 4);
    }
    Put(list, 0, 4), list += '\0';
  }
  std::string length;
  Put(length, list.size() - 8, 4);
  return Message(2, serial, "a(ssssssouso)", list.replace(0, 4, length));
}

using Distortion = std::function<std::string(std::string reply)>;

class UnitUsage : public testing::Test {
 protected:
  void has(const std::string& name, const std::string& event, const std::string& received) {
    const std::string directory = "/sys/class/net/" + name + "/";
    root.write(directory + "uevent", "DEVTYPE=" + event + "\n");
    root.write(directory + "type", "1\n");
    root.write(directory + "device/x", "");
    root.write(directory + "statistics/rx_bytes", received + "\n");
    root.write(directory + "statistics/tx_bytes", "0\n");
  }
  // What comes of a manager whose replies are distorted.
  std::optional<Array> usage(int milliseconds, const Distortion& distort) {
    root.write("/run/systemd/x", "");
    sockaddr_un address = {.sun_family = AF_UNIX, .sun_path = {}};
    root.path("/run/systemd/private").copy(address.sun_path, sizeof address.sun_path - 1);
    std::filesystem::remove(address.sun_path);
    const Descriptor listener(socket(AF_UNIX, SOCK_STREAM, 0));
    const auto* any = reinterpret_cast<const sockaddr*>(&address);
    if (bind(listener.get(), any, sizeof address) != 0 || listen(listener.get(), 5) != 0) return {};
    std::thread manager([&] {
      const Descriptor peer(accept(listener.get(), nullptr, nullptr));
      std::string received, replies = "OK 0123\r\n";
      char chunk[65536];
      for (ssize_t count; (count = recv(peer.get(), chunk, sizeof chunk, 0)) > 0; replies = "") {
        received.append(chunk, static_cast<std::size_t>(count));
        if (!replies.empty()) received.clear();  // the greeting
        int open = 0;
        for (std::size_t size; received.size() >= kBusHeaderBytes; received.erase(0, size)) {
          if ((size = BusMessageLength(received, 1 << 20).value()) > received.size()) break;
          EXPECT_LE(++open, 64) << "a bus allows 128 open calls";
          replies += distort(Answer(received.substr(0, size)));
        }
        (void)!send(peer.get(), replies.data(), replies.size(), MSG_NOSIGNAL);
      }
    });
    auto records = ReadUnitUsage(root.root(), std::chrono::milliseconds(milliseconds));
    shutdown(listener.get(), SHUT_RDWR);
    manager.join();
    return records;
  }

  TempRoot root;
};
}  // namespace
}  // namespace quorlet
