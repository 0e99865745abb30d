// Questions about the device that the platform answers.
#ifndef QUORLET_PLATFORM_DEVICE_INFO_H_
#define QUORLET_PLATFORM_DEVICE_INFO_H_

#include <optional>
#include <string_view>

#include "drvreport/property_value.h"

namespace quorlet {

class DeviceInfo {
 public:
  virtual ~DeviceInfo() = default;

  // The answer, or nothing when there is none.
  virtual std::optional<PropertyValue> DQCopyAnswer(std::string_view question) = 0;

  // Whether the answer is the boolean true.
  bool DQGetBoolAnswer(std::string_view question);
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_DEVICE_INFO_H_
