// The hub of the reporting channels: hands out what drivers report in one block of shared memory.
//
//   method 0  opens
//   method 2  struct input: u32 n, 4 bytes unused, n × {u64 driver ID, u64 channel ID, u64 type
//             word}, little-endian; scalar output: the token, whose low 32 bits are the memory type
//   method 3  scalar input: the token; writes the memory anew
//
// The memory is a sequence of runs of 64-byte records in the order of the list, without the
// channels that nobody reports. Its size is fixed when it is mapped, with room for as many records
// as the type words announce; the runs stand at its end. The room before them is taken by runs that
// belong to no channel, so that whoever goes from run to run sees nothing else. A channel whose run
// claims no records, or more than it has, counts as one that nobody reports.
#ifndef QUORLET_PLATFORM_LINUX_REGISTRY_REPORT_HUB_H_
#define QUORLET_PLATFORM_LINUX_REGISTRY_REPORT_HUB_H_

#include <memory>
#include <string_view>
#include <vector>

#include "platform/linux/registry/registry_entry.h"

namespace quorlet {

inline constexpr std::string_view kReportHubClass = "DrvReportHub";

// The driver of one connection to the hub. `described` (may be nullptr) is the hub as a driver file
// describes it, and is asked first: its answers to opening and closing are used, a method that
// fails there fails, and a scalar that it returns for method 2 becomes the token. The sources must
// outlive the driver.
std::shared_ptr<EntryDriver> MakeReportHub(std::vector<EntrySource*> sources,
                                           std::shared_ptr<EntryDriver> described);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_REGISTRY_REPORT_HUB_H_
