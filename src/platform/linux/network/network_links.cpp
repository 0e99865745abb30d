#include "platform/linux/network/network_links.h"

#include <unistd.h>

#include <string>
#include <string_view>

#include "platform/linux/base/kernel_text.h"

namespace quorlet {
namespace {

// The numbers of <linux/if_arp.h> that "type" holds.
constexpr std::string_view kTypePpp = "512";
constexpr std::string_view kTypeRawIp = "519";
constexpr std::string_view kTypeLoopback = "772";

// One directory of /sys/class/net.
class Interface {
 public:
  explicit Interface(std::string directory) : directory_(std::move(directory)) {}

  // Whether it leads off the machine and has been used. Counters that cannot be read count as use.
  bool isUsed() const {
    const std::string type = attribute("type");
    if (type == kTypeLoopback || (!has("device") && type != kTypePpp && !kind())) return false;
    return attribute("statistics/rx_bytes") != "0" || attribute("statistics/tx_bytes") != "0";
  }

  std::optional<LinkKind> kind() const {
    const std::string event = "\n" + attribute("uevent") + "\n";
    const auto says = [&](std::string_view line) { return event.find(line) != event.npos; };
    if (says("\nDEVTYPE=wlan\n") || has("phy80211") || has("wireless")) return LinkKind::kWifi;
    if (says("\nDEVTYPE=wwan\n") || attribute("type") == kTypeRawIp) return LinkKind::kCellular;
    return std::nullopt;
  }

 private:
  bool has(const char* name) const { return access((directory_ + "/" + name).c_str(), F_OK) == 0; }
  // Empty when it cannot be read.
  std::string attribute(const char* name) const {
    return ReadKernelText(directory_ + "/" + name).value_or("");
  }

  const std::string directory_;
};

}  // namespace

SoleLink SoleLinkKind(const Root& root) {
  const std::string directory = root.kernelPath("/sys/class/net");
  const auto names = ReadDirectory(directory);
  if (const int* error = std::get_if<int>(&names)) return *error;
  std::optional<LinkKind> sole;
  for (const std::string& name : std::get<std::vector<std::string>>(names)) {
    if (name == "bonding_masters") continue;  // a file
    const Interface interface(directory + "/" + name);
    if (!interface.isUsed()) continue;
    const auto kind = interface.kind();
    if (!kind || (sole && *sole != *kind)) return std::optional<LinkKind>();
    sole = kind;
  }
  return sole;
}

}  // namespace quorlet
