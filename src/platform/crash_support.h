// The crash-reporting support library: structured log and support logs.
#ifndef QUORLET_PLATFORM_CRASH_SUPPORT_H_
#define QUORLET_PLATFORM_CRASH_SUPPORT_H_

#include <cstdint>
#include <string>

#include "values/property_value.h"

namespace quorlet {

class CrashSupport {
 public:
  virtual ~CrashSupport() = default;

  // Appends one entry of the given type to the structured log. A failure leaves one error line.
  virtual void FSLogStructuredData(std::int32_t type, const Dictionary& entry) = 0;

  // Moves the structured log's entries of days before today out of the current log.
  virtual void FSDumpAllOldStructuredDataLogs() = 0;

  // Rotates the support service's logs.
  virtual void rollCarewellLogs() = 0;

  // Texts that a log's header tells the device and the log by; "unknown" where there is none.
  virtual std::string GetSysIDWithDescription() = 0;
  virtual std::string GetHardwareModel() = 0;
  virtual std::string GetSystemVersion() = 0;
  // A new one for each call: a random UUID, upper case.
  virtual std::string GetIncidentID() = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_CRASH_SUPPORT_H_
