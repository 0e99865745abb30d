// NVMe controllers as storage drivers, where no driver file serves one.
#ifndef QUORLET_PLATFORM_LINUX_NVME_SOURCE_H_
#define QUORLET_PLATFORM_LINUX_NVME_SOURCE_H_

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/linux/files.h"
#include "platform/linux/registry_entry.h"

namespace quorlet {

// Reads the health page of the controller behind a character device, or gives nothing.
using HealthPageReader =
    std::function<std::optional<Data>(const std::string& device, std::chrono::milliseconds limit)>;

// Publishes each controller of /sys/class/nvme that has its device in /dev as an entry of class
// "NuvexEmbeddedNVMeController". A drive is asked once, when its statistics export is wanted, for
// at most 2 seconds in all, and not at all while it sleeps; the other exports are empty.
std::unique_ptr<EntrySource> MakeNvmeSource(const Root& root, HealthPageReader reader);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_NVME_SOURCE_H_
