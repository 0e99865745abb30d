// The once-a-day gate and the daily pass.
#ifndef QUORLET_DRIVER_RUN_DRIVER_H_
#define QUORLET_DRIVER_RUN_DRIVER_H_

#include <cstdint>
#include <optional>

#include "platform/platform.h"
#include "report/report.h"
#include "values/property_value.h"

namespace quorlet {

class PassJournal;

// `appInfo` is an array of app-info records, passed through to the aggregated log unread, or none.
// Both operations hold the pass lock while they work, and neither reports a result: a step that
// fails says so in the system log, and the next step runs. A pass that was cut short is repeated,
// not doubled, by the next one for its day (driver/pass_journal.h).
class RunDriver {
 public:
  explicit RunDriver(Platform& platform) : platform_(platform) {}

  // Runs the daily pass for yesterday unless it has run for yesterday or a later day, and records
  // the day once the pass has returned. Without the lock, or when it cannot be known which day was
  // last, no pass runs.
  void runDailyTasksIfNewDay(const std::optional<Array>& appInfo);

  // Runs the daily pass for `day`, without the gate.
  void runDailyTasks(std::int32_t day, const std::optional<Array>& appInfo);

 private:
  void runSequence(std::int32_t day, const std::optional<Array>& appInfo, PassJournal& journal);
  ReportOutcome writeLog(std::int32_t day, const std::optional<Array>& appInfo,
                         PassJournal& journal);
  void warnOfFutureDay(std::int64_t day);

  Platform& platform_;
};

}  // namespace quorlet

#endif  // QUORLET_DRIVER_RUN_DRIVER_H_
