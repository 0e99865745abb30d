// The publishers of kernel data; docs/live-channels.md lists their channels. Each reads below the
// root, and nothing before it is asked.
#ifndef QUORLET_PLATFORM_LINUX_LIVE_PUBLISHERS_H_
#define QUORLET_PLATFORM_LINUX_LIVE_PUBLISHERS_H_

#include <memory>

#include "platform/linux/base/kernel_text.h"
#include "platform/linux/live/live_publisher.h"

namespace quorlet {

std::unique_ptr<LivePublisher> MakeCpuIdlePublisher(const LoggingRoot& root);
std::unique_ptr<LivePublisher> MakeCpuFrequencyPublisher(const LoggingRoot& root);
std::unique_ptr<LivePublisher> MakeBlockDevicesPublisher(const LoggingRoot& root);
std::unique_ptr<LivePublisher> MakeTemperaturesPublisher(const LoggingRoot& root);
std::unique_ptr<LivePublisher> MakeEnergyPublisher(const LoggingRoot& root);
std::unique_ptr<LivePublisher> MakePressurePublisher(const LoggingRoot& root);
std::unique_ptr<LivePublisher> MakeMemoryActivityPublisher(const LoggingRoot& root);
std::unique_ptr<LivePublisher> MakeRunQueuePublisher(const LoggingRoot& root);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_LIVE_PUBLISHERS_H_
