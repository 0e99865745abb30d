#include "platform/linux/drives/drive_list.h"

#include <sys/stat.h>

#include <algorithm>
#include <map>

#include "platform/linux/base/kernel_text.h"

namespace quorlet {
namespace {

constexpr char kBlockDevices[] = "/sys/block";
constexpr std::size_t kMaxDrives = 256;
constexpr std::uint64_t kMaxControllers = 256;

bool Exists(const std::string& path) {
  struct stat status = {};
  return stat(path.c_str(), &status) == 0;
}

// Without the card's address on its bus, which a card may draw anew each time ("mmc0:59b4").
std::string CardPlace(std::string place) {
  const std::size_t last = place.rfind('/') + 1;
  const std::size_t colon = place.find(':', last);
  if (colon == std::string::npos || !NumberBehind("mmc", place.substr(last, colon - last))) {
    return place;
  }
  place.resize(last == 0 ? 0 : last - 1);
  return place;
}

// The path of sysfs that `directory` stands for, as far as links tell.
std::string Place(const std::string& directory, const std::string& name) {
  const std::string place = CardPlace(DevicePlace(LinkTarget(directory)));
  return place.empty() ? CleanName(name) : place;
}

class Finder {
 public:
  explicit Finder(const LoggingRoot& root)
      : root_(root), blocks_(root.kernelPath(kBlockDevices)), disks_(root.names(blocks_)) {}

  std::vector<FoundDrive> find() {
    addControllers();
    addCards();
    for (const char* bus : {"platform", "pci"}) addUfsHosts(bus);
    addSataDisks();
    const std::set<std::string> rootDisks = RootDisks(root_);
    std::map<std::string, int> places;
    for (FoundDrive& drive : drives_) {
      drive.holdsRoot = std::ranges::any_of(
          drive.disks, [&](const std::string& disk) { return rootDisks.contains(disk); });
      const int number = ++places[drive.place];
      if (number > 1) drive.place += "#" + std::to_string(number);
    }
    std::ranges::sort(drives_, {}, &FoundDrive::place);
    return std::move(drives_);
  }

 private:
  void add(FoundDrive drive) {
    if (drives_.size() < kMaxDrives) drives_.push_back(std::move(drive));
  }

  void addControllers() {
    const std::string directory = root_.kernelPath("/sys/class/nvme");
    for (const auto& [number, name] : NumberedNames(root_, directory, "nvme")) {
      if (number >= kMaxControllers || !Exists(root_.path("/dev/" + name))) continue;
      FoundDrive drive{DriveKind::kNvme, name, "", JoinPath(directory, name), {}};
      drive.place = Place(drive.directory, name);
      for (const std::string& disk : disks_) {
        if (NumberBehind(name + "n", disk)) drive.disks.push_back(disk);
      }
      add(std::move(drive));
    }
  }

  void addCards() {
    for (const auto& [number, name] : NumberedNames(root_, blocks_, "mmcblk")) {
      FoundDrive drive{DriveKind::kEmmc, name, "", JoinPath(blocks_, name), {name}};
      const auto type = ReadKernelText(drive.directory + "/device/type");
      if (type != "MMC" && type != "SD") continue;
      if (type == "SD") drive.kind = DriveKind::kSd;
      drive.place = Place(drive.directory, name);
      add(std::move(drive));
    }
  }

  void addUfsHosts(const std::string& bus) {
    const std::string drivers = root_.kernelPath("/sys/bus/" + bus + "/drivers");
    for (const std::string& driver : root_.names(drivers)) {
      if (!driver.starts_with("ufshcd")) continue;
      for (const std::string& host : root_.names(JoinPath(drivers, driver))) {
        FoundDrive drive{DriveKind::kUfs, host, "", drivers + "/" + driver + "/" + host, {}};
        if (!Exists(drive.directory + "/health_descriptor")) continue;
        // DevicePlace leaves the device itself out.
        const std::string link = LinkTarget(drive.directory);
        const std::string place = link.empty() ? "" : DevicePlace(link + "/host0");
        drive.place = place.empty() ? CleanName(host) : place;
        for (const std::string& disk : disks_) {
          const std::string target = LinkTarget(JoinPath(blocks_, disk));
          if (target.find("/" + host + "/host") != std::string::npos) drive.disks.push_back(disk);
        }
        add(std::move(drive));
      }
    }
  }

  // A disk that does not spin, and that libata serves: it names itself as the maker.
  void addSataDisks() {
    for (const std::string& name : disks_) {
      const std::string directory = JoinPath(blocks_, name);
      if (!name.starts_with("sd") || ReadCounter(directory + "/queue/rotational") != 0u ||
          ReadCounter(directory + "/removable") == 1u ||
          ReadKernelText(directory + "/device/vendor") != "ATA") {
        continue;
      }
      add({DriveKind::kSata, name, Place(directory, name), directory, {name}});
    }
  }

  const LoggingRoot root_;
  const std::string blocks_;
  const std::vector<std::string> disks_;
  std::vector<FoundDrive> drives_;
};

bool IsAwake(const std::string& device) {
  const auto status = ReadKernelText(device + "/power/runtime_status");
  return !status || *status == "active" || *status == "unsupported";
}

}  // namespace

std::vector<FoundDrive> FindDrives(const LoggingRoot& root) {
  const bool isOwn = root.isMachine() || root.kernelPath("/sys") == root.path("/sys");
  return isOwn ? Finder(root).find() : std::vector<FoundDrive>();
}

bool IsAsleep(const LoggingRoot& root, const FoundDrive& drive) {
  if (drive.kind != DriveKind::kUfs) return !IsAwake(drive.directory + "/device");
  if (!IsAwake(drive.directory)) return true;
  // The host may be awake while the device behind it, which is its well-known unit, sleeps.
  for (const std::string& host : root.names(drive.directory)) {
    if (!NumberBehind("host", host)) continue;
    const std::string number = host.substr(4);
    if (!IsAwake(drive.directory + "/" + host + "/target" + number + ":0:0/" + number +
                 ":0:0:49488")) {
      return true;
    }
  }
  return false;
}

}  // namespace quorlet
