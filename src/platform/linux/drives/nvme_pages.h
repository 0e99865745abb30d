// What an NVMe drive has to be asked for: its health page, and the datacenter page where it has it.
#ifndef QUORLET_PLATFORM_LINUX_DRIVES_NVME_PAGES_H_
#define QUORLET_PLATFORM_LINUX_DRIVES_NVME_PAGES_H_

#include <chrono>
#include <cstddef>
#include <functional>
#include <string>

#include "drvreport/property_value.h"
#include "platform/drives.h"

namespace quorlet {

inline constexpr std::size_t kNvmePageBytes = 512;

struct NvmePages {
  // kTold, kDenied or kSilent.
  DriveAnswer answer = DriveAnswer::kSilent;
  int error = 0;        // of the system, when that is why there is none
  bool isLate = false;  // it may hang: asking again may cost as long
  Data health;          // kNvmePageBytes, when it has told it
  Data datacenter;      // the same; empty for a drive that does not list such a page
};

// Reads the pages of the controller behind a character device.
using NvmePagesReader =
    std::function<NvmePages(const std::string& device, std::chrono::milliseconds limit)>;

// Opens the device for reading only. Beyond the health page, which every drive has, the drive is
// asked for pages that it says it has and for no others: it may count a refusal as an error of its.
NvmePages ReadNvmePages(const std::string& device, std::chrono::milliseconds limit);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_DRIVES_NVME_PAGES_H_
