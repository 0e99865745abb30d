// The crash-reporting support library: structured log and support logs.
#ifndef QUORLET_PLATFORM_CRASH_SUPPORT_H_
#define QUORLET_PLATFORM_CRASH_SUPPORT_H_

#include <cstdint>
#include <span>
#include <string>

#include "drvreport/property_value.h"

namespace quorlet {

class CrashSupport {
 public:
  virtual ~CrashSupport() = default;

  // Appends entries of the given type to the structured log: all of them, in one write, or none.
  // They reach the disk at the next sync or publication, or when the system gets to it. False when
  // they are not in the log: after an error line, of which there is one a pass when the log is
  // full. An empty list is no entry and true.
  virtual bool logEntries(std::int32_t type, std::span<const Dictionary> entries) = 0;
  bool FSLogStructuredData(std::int32_t type, const Dictionary& entry) {
    return logEntries(type, {&entry, 1});
  }

  // Makes the log's entries durable. False, after an error line, when they may not be, and while
  // entries are staged.
  virtual bool syncStructuredData() = 0;

  // Staging gives the log all entries of a step, or none, once, however often the step is cut short
  // and repeated:
  //
  //   if (!isNoted) {
  //     stageEntries();
  //     …log the entries…
  //     note durably, elsewhere, that they have been logged
  //   }
  //   publishStagedEntries();
  //
  // Of these steps a process makes one at a time, and no two processes at once (the pass lock sees
  // to it). Killed before the note, the entries are dropped and made anew; killed after it, the
  // next one publishes them. A power cut may lose entries that are not yet durable, or the end of
  // them; what is left of one never runs into the next.

  // From here on this process's entries are staged, in place of what an earlier process staged and
  // did not begin to publish. False, after an error line, when that cannot be had; entries then go
  // to the log at once.
  virtual bool stageEntries() = 0;

  // Puts what is staged, by whichever process, into the log; nothing when it is there already. What
  // the log held before is safe from a power cut meanwhile. Later entries go to the log at once
  // again, whatever comes of it. False, after an error line, when it did not all get there: for
  // want of room in the log, the rest is dropped; otherwise it stays staged for the next call.
  // Moves the entries of days before today out of the log in the same go.
  virtual bool publishStagedEntries() = 0;

  // Moves the structured log's entries of days before today out of the current log, and drops days
  // that are too old or for which there is no room. After an error, which has its line, every entry
  // still is in one place.
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
