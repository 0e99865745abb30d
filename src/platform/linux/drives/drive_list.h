// Which drives there are, by what the kernel publishes; no drive is asked.
#ifndef QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_LIST_H_
#define QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_LIST_H_

#include <set>
#include <string>
#include <vector>

#include "platform/drives.h"
#include "platform/linux/base/kernel_text.h"

namespace quorlet {

struct FoundDrive {
  DriveKind kind = DriveKind::kNvme;
  std::string name;
  std::string place;
  std::string
      directory;  // of sysfs: the controller, the card's block device, the UFS host, the disk
  std::vector<std::string> disks;  // its block devices in /sys/block
  bool holdsRoot = false;
};

// NVMe controllers that have their device in /dev, cards and eMMC, UFS hosts, and SATA disks that
// do not spin; by place. /sys must be the root's own: a root that has none is another machine's.
std::vector<FoundDrive> FindDrives(const LoggingRoot& root);

// Whether the drive's device sleeps, as far as the kernel says.
bool IsAsleep(const LoggingRoot& root, const FoundDrive& drive);

// The whole disks, by the names in /sys/block, that the root's file system lies on; empty when that
// cannot be told.
std::set<std::string> RootDisks(const LoggingRoot& root);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_LIST_H_
