#include "driver/run_driver.h"

#include <mutex>

#include "collectors/platform_statistics.h"
#include "driver/tasking.h"
#include "platform/run_step.h"
#include "report/report.h"

namespace quorlet {
namespace {

constexpr char kDomain[] = "nuvex.aggregated.quorlet";
constexpr char kLastDay[] = "LastCrashLogSerializationDateInDaysSince1970";

}  // namespace

void RunDriver::runDailyTasksIfNewDay(const std::optional<Array>& appInfo) {
  // Taken before the gate is asked: of several processes started at once, one makes the pass.
  const std::lock_guard hold(platform_.passLock);
  const std::int32_t yesterday = platform_.counterStore.TLDaysSince1970() - 1;
  if (platform_.preferences.DGWPreferencesGetIntegerValue(kLastDay, kDomain) >= yesterday) {
    platform_.log.log("Day unchanged since last run");
    return;
  }
  runSequence(yesterday, appInfo);
  platform_.preferences.DGWPreferencesSetValue(kLastDay, Int32(yesterday), kDomain);
  platform_.preferences.DGWPreferencesSynchronize(kDomain);
}

void RunDriver::runDailyTasks(std::int32_t day, const std::optional<Array>& appInfo) {
  const std::lock_guard hold(platform_.passLock);
  runSequence(day, appInfo);
}

void RunDriver::runSequence(std::int32_t day, const std::optional<Array>& appInfo) {
  SystemLog& log = platform_.log;
  log.log("daily tasks for day %d", day);
  RunStep(log, "checkpoint", [&] { platform_.counterStore.TLClientCheckpoint(); });
  RunStep(log, "aggregated log", [&] {
    if (!platform_.diagnostics.DiagnosticLogSubmissionEnabled()) return;
    TLReport report(platform_);
    report.writeLogForYesterdayWithAppInfo(day, appInfo);
  });
  RunStep(log, "platform statistics", [&] { collectPlatformStatistics(platform_); });
  RunStep(log, "structured logs", [&] { platform_.crashSupport.FSDumpAllOldStructuredDataLogs(); });
  RunStep(log, "tasking", [&] { updateTasking(platform_); });
  RunStep(log, "support logs", [&] { platform_.crashSupport.rollCarewellLogs(); });
}

}  // namespace quorlet
