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

  // Appends one entry of the given type to the structured log. False, after one error line, when it
  // is not there.
  virtual bool FSLogStructuredData(std::int32_t type, const Dictionary& entry) = 0;

  // From here on entries are staged: kept aside, so that the log gets all or none of them. Drops
  // what an earlier pass staged and did not publish. False, after an error line, when that fails;
  // entries then go to the log at once.
  virtual bool stageEntries() = 0;
  // Puts what is staged, by this process or by an earlier one that was cut short, into the log,
  // once (a power cut may lose them); later entries go to the log at once again. False after an
  // error line.
  virtual bool publishStagedEntries() = 0;

  // Makes the entries logged so far durable. False after an error line.
  virtual bool syncStructuredData() = 0;

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
