#include "platform/environment_queries.h"

namespace quorlet {
namespace {

constexpr char kInternalBuild[] = "InternalBuild";
constexpr char kForceMultiUserMode[] = "/var/db/forceMultiUserMode";
constexpr char kSystemGroup[] = "systemgroup.nuvex.diagwell";
constexpr char kSingleUserHome[] = "/var/mobile";

}  // namespace

bool EnvironmentQueries::TLIsInternalDevice() {
  std::call_once(internalOnce_,
                 [this] { internal_ = deviceInfo_.DQGetBoolAnswer(kInternalBuild); });
  return internal_;
}

bool EnvironmentQueries::isMultiUserMode() {
  const std::lock_guard hold(mutex_);
  if (multiUser_) return *multiUser_;
  if (deviceInfo_.DQGetBoolAnswer(kInternalBuild) && environment_.stat(kForceMultiUserMode)) {
    log_.log("Forcing Multi User Mode behavior due to the presence of /var/db/forceMultiUserMode");
    multiUser_ = true;
    return true;
  }
  std::int32_t mode = 0;
  multiUser_ = environment_.CheckMultiUserMode(mode) && mode != 0;
  return *multiUser_;
}

std::optional<std::string> EnvironmentQueries::dataHomePath() {
  const std::lock_guard hold(mutex_);
  if (dataHome_) return dataHome_;
  if (!isMultiUserMode()) {
    dataHome_ = kSingleUserHome;
    return dataHome_;
  }
  std::uint64_t error = 1;
  dataHome_ = environment_.SystemGroupContainerPath(kSystemGroup, error);
  if (!dataHome_) log_.log("Error getting system group container: %llu", error);
  return dataHome_;
}

}  // namespace quorlet
