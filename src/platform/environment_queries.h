// Three questions about the device that several parts of the program ask, answered from the
// platform services once and then remembered for the life of the process.
#ifndef QUORLET_PLATFORM_ENVIRONMENT_QUERIES_H_
#define QUORLET_PLATFORM_ENVIRONMENT_QUERIES_H_

#include <mutex>
#include <optional>
#include <string>

#include "platform/device_info.h"
#include "platform/environment.h"
#include "platform/system_log.h"

namespace quorlet {

// Safe to use from any thread: the counter store asks from the one that a reply comes on, too.
class EnvironmentQueries {
 public:
  EnvironmentQueries(DeviceInfo& deviceInfo, Environment& environment, SystemLog& log)
      : deviceInfo_(deviceInfo), environment_(environment), log_(log) {}

  // Whether the device runs an internal build.
  bool TLIsInternalDevice();

  // Whether the system runs in multi-user mode.
  bool isMultiUserMode();

  // The directory under which the counter store keeps its files, or nothing when the container of
  // multi-user mode cannot be found; then the next call looks again.
  std::optional<std::string> dataHomePath();

 private:
  DeviceInfo& deviceInfo_;
  Environment& environment_;
  SystemLog& log_;
  std::once_flag internalOnce_;
  bool internal_ = false;
  std::recursive_mutex mutex_;  // dataHomePath asks isMultiUserMode
  std::optional<bool> multiUser_;
  std::optional<std::string> dataHome_;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_ENVIRONMENT_QUERIES_H_
