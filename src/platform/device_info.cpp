#include "platform/device_info.h"

namespace quorlet {

bool DeviceInfo::DQGetBoolAnswer(std::string_view question) {
  const auto answer = DQCopyAnswer(question);
  const bool* boolean = answer ? answer->asBoolean() : nullptr;
  return boolean != nullptr && *boolean;
}

}  // namespace quorlet
