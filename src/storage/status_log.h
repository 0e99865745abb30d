// The storage status log: one line of storage health values, handed over for submission at most
// once a week.
#ifndef QUORLET_STORAGE_STATUS_LOG_H_
#define QUORLET_STORAGE_STATUS_LOG_H_

#include <string>
#include <string_view>

#include "drvreport/property_value.h"
#include "platform/platform.h"

namespace quorlet {

// Writes the log "StorageStatus" of the type `typeCode`, unless one was written within the last
// seven days (the preference "SSLastLoggedAt") or `values` is null. `values` holds numbers, and
// arrays with at least one number; anything else in it is skipped. The week starts even when the
// log could not be handed over. No exception gets out: it becomes a line in the system log.
void NLW_WriteLog(Platform& platform, std::string_view typeCode, const Dictionary* values);

// The device's crash-reporting key, or "error".
std::string GetFaultScribeKey(DeviceInfo& deviceInfo);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_STATUS_LOG_H_
