// What an NVMe drive itself has to be asked for, with a time limit.
#ifndef QUORLET_PLATFORM_LINUX_NVME_HEALTH_PAGE_H_
#define QUORLET_PLATFORM_LINUX_NVME_HEALTH_PAGE_H_

#include <chrono>
#include <optional>
#include <string>

#include "values/property_value.h"

namespace quorlet {

// The page of the controller behind the character device, opened for reading only; nothing when the
// drive does not answer, or not within `limit`.
std::optional<Data> ReadNvmeHealthPage(const std::string& device, std::chrono::milliseconds limit);

// The start of a file of the kernel for which the drive is asked; empty like the page above.
std::string ReadNvmeAttribute(const std::string& path, std::chrono::milliseconds limit);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_NVME_HEALTH_PAGE_H_
