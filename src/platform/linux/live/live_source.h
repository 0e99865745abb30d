// Reporting channels of the running machine: one driver registry entry for each kind of kernel
// data.
#ifndef QUORLET_PLATFORM_LINUX_LIVE_LIVE_SOURCE_H_
#define QUORLET_PLATFORM_LINUX_LIVE_LIVE_SOURCE_H_

#include <memory>

#include "platform/linux/base/kernel_text.h"
#include "platform/linux/live/live_publisher.h"
#include "platform/linux/registry/registry_entry.h"

namespace quorlet {

// The entries are of class "QuorletLiveChannels" and have their IDs from 0x4C00000000000001 on. A
// kind of data that the machine does not have has no entry. After a refresh only the kinds whose
// elements are asked for are read. `drives`, if any, adds the drives' health.
std::unique_ptr<EntrySource> MakeLiveChannels(const LoggingRoot& root,
                                              std::unique_ptr<LivePublisher> drives = nullptr);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_LIVE_LIVE_SOURCE_H_
