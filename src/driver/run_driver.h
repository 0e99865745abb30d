// The once-a-day gate and the daily pass.
#ifndef QUORLET_DRIVER_RUN_DRIVER_H_
#define QUORLET_DRIVER_RUN_DRIVER_H_

#include <cstdint>
#include <functional>
#include <optional>
#include <vector>

#include "drvreport/property_value.h"
#include "platform/platform.h"
#include "report/report.h"

namespace quorlet {

class PassJournal;

// `appInfo` is an array of app-info records, passed through to the aggregated log unread, or none.
// What runs a pass holds the pass lock meanwhile and reports no result: a step that fails says so
// in the system log, and the next step runs. A pass that was cut short is repeated, not doubled, by
// the next one for its day (driver/pass_journal.h).
class RunDriver {
 public:
  explicit RunDriver(Platform& platform) : platform_(platform) {}

  // Runs the daily pass for yesterday unless it has run for yesterday or a later day, and records
  // the day once the pass has returned. Without the lock, or when it cannot be known which day was
  // last, no pass runs.
  void runDailyTasksIfNewDay(const std::optional<Array>& appInfo);

  // Runs the daily pass for `day`, without the gate.
  void runDailyTasks(std::int32_t day, const std::optional<Array>& appInfo);

  // The day of the last gated pass, 0 when there was none. Nothing when that cannot be read.
  std::optional<std::int64_t> gateDay();

  // The days of the last 30 before yesterday that have counters and are not closed, the oldest
  // first: no pass for the day, nor closeMissingDays, came to its end with submission enabled.
  // Nothing, after an error line, when that cannot be known.
  std::optional<std::vector<std::int32_t>> missingDays();

  // Writes the aggregated log, and nothing else of a pass, for each missing day, holding the pass
  // lock once, and calls `closed` after each. Returns false, after an error line, when a day is
  // still missing.
  [[nodiscard]] bool closeMissingDays(const std::function<void(std::int32_t day)>& closed);

 private:
  void runSequence(std::int32_t day, const std::optional<Array>& appInfo, PassJournal& journal);
  ReportOutcome writeLog(std::int32_t day, const std::optional<Array>& appInfo,
                         PassJournal& journal);
  ReportOutcome reportDay(std::int32_t day, const std::optional<Array>& appInfo,
                          PassJournal& journal);
  void warnOfFutureDay(std::int64_t day);

  Platform& platform_;
};

}  // namespace quorlet

#endif  // QUORLET_DRIVER_RUN_DRIVER_H_
