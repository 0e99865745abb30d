// What drives tell about their health, as live channels.
#ifndef QUORLET_PLATFORM_LINUX_DRIVES_DRIVES_PUBLISHER_H_
#define QUORLET_PLATFORM_LINUX_DRIVES_DRIVES_PUBLISHER_H_

#include <memory>

#include "platform/linux/drives/drive_reader.h"
#include "platform/linux/live/live_publisher.h"

namespace quorlet {

// A group of channels for each drive: its figures, and how long it was awake and asleep.
std::unique_ptr<LivePublisher> MakeDrivesPublisher(std::shared_ptr<DriveReader> reader);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_DRIVES_DRIVES_PUBLISHER_H_
