#include "driver/run_driver.h"

#include <algorithm>
#include <iterator>
#include <string>

#include "collectors/platform_statistics.h"
#include "collectors/run_step.h"
#include "driver/consent.h"
#include "driver/pass_journal.h"
#include "driver/tasking.h"
#include "platform/names.h"
#include "report/report.h"

namespace quorlet {
namespace {

// A gate that is further ahead than this was recorded while the clock was wrong.
constexpr std::int32_t kFarAhead = 30;

// The pass for yesterday is due; before these, a pass drops what was counted.
constexpr std::int32_t kDaysBeforeYesterday = 30;

// What repeats the pass for `day` by hand.
std::string CommandFor(std::int32_t day, std::int32_t today) {
  if (day == today - 1) return "quorlet -f";
  if (day == today) return "quorlet -t";
  return "quorletctl send run-day " + std::to_string(day);
}

}  // namespace

void RunDriver::runDailyTasksIfNewDay(const std::optional<Array>& appInfo) {
  // Taken before the gate is asked: of several processes started at once, one makes the pass.
  const PassHold hold(platform_.passLock);
  if (!hold.isHeld()) {
    platform_.log.error("No daily pass without its lock; the next start tries again");
    return;
  }
  const std::optional<std::int64_t> last = gateDay();
  if (!last) {
    platform_.log.error("No daily pass while the day of the last one cannot be read");
    return;
  }
  const std::int32_t yesterday = platform_.counterStore.TLDaysSince1970() - 1;
  if (*last >= yesterday) {
    platform_.log.log("Day unchanged since last run");
    if (*last > std::int64_t{yesterday} + kFarAhead) warnOfFutureDay(*last);
    return;
  }
  PassJournal journal(platform_, yesterday, /*isGated=*/true, *last);
  runSequence(yesterday, appInfo, journal);
  Preferences& preferences = platform_.preferences;
  preferences.DGWPreferencesSetValue(kGateDay, Int32(yesterday), kPassDomain);
  preferences.DGWPreferencesSynchronize(kPassDomain);
  journal.end();
}

void RunDriver::runDailyTasks(std::int32_t day, const std::optional<Array>& appInfo) {
  const PassHold hold(platform_.passLock);
  const std::int64_t last =
      platform_.preferences.DGWPreferencesGetIntegerValue(kGateDay, kPassDomain);
  PassJournal journal(platform_, day, /*isGated=*/false, last);
  runSequence(day, appInfo, journal);
  journal.end();
}

std::optional<std::int64_t> RunDriver::gateDay() {
  Preferences& preferences = platform_.preferences;
  if (!preferences.isReadable(kPassDomain)) return std::nullopt;
  return preferences.DGWPreferencesGetIntegerValue(kGateDay, kPassDomain);
}

std::optional<std::vector<std::int32_t>> RunDriver::missingDays() {
  CounterStore& store = platform_.counterStore;
  const std::int32_t last = store.TLDaysSince1970() - 2;
  const std::optional<std::int64_t> gate = gateDay();
  const auto closed = gate ? closedDays(store, *gate) : std::nullopt;
  const auto counted =
      closed ? store.daysWithCounters(last - kDaysBeforeYesterday, last) : std::nullopt;
  if (!counted) {
    platform_.log.error("Which days have no log cannot be known");
    return std::nullopt;
  }
  std::vector<std::int32_t> missing;
  std::ranges::set_difference(*counted, *closed, std::back_inserter(missing));
  return missing;
}

bool RunDriver::closeMissingDays(const std::function<void(std::int32_t day)>& closed) {
  const PassHold hold(platform_.passLock);
  // What was counted without consent is no day's.
  if (!hold.isHeld() || !finishDueDrop(platform_)) return false;
  const auto missing = missingDays();
  if (!missing) return false;
  bool areAllClosed = true;
  for (const std::int32_t day : *missing) {
    const std::optional<std::int64_t> gate = gateDay();
    if (!gate) return false;
    PassJournal journal(platform_, day, /*isGated=*/false, *gate);
    const ReportOutcome outcome = reportDay(day, std::nullopt, journal);
    journal.settle(outcome);
    if (outcome == ReportOutcome::kLost) {
      areAllClosed = false;
      continue;
    }
    journal.end();
    closed(day);
  }
  return areAllClosed;
}

void RunDriver::warnOfFutureDay(std::int64_t day) {
  platform_.log.error(
      "The last daily pass is recorded for day %lld, far in the future: no pass runs until then. "
      "If "
      "today's date is right, \"quorletctl prefs remove %s %s\" lets passes run again",
      day, kPassDomain, kGateDay);
}

ReportOutcome RunDriver::writeLog(std::int32_t day, const std::optional<Array>& appInfo,
                                  PassJournal& journal) {
  if (!platform_.diagnostics.DiagnosticLogSubmissionEnabled()) {
    platform_.log.info("No log is written: the device's owner has not consented to submission");
    return ReportOutcome::kNothingToReport;
  }
  if (!finishDueDrop(platform_)) return ReportOutcome::kLost;
  const std::optional<Array> records = journal.takeAppInfo(appInfo);
  Platform platform = platform_.with({.diagnostics = &journal.diagnostics()});
  TLReport report(platform, journal.usedUp());
  return report.writeLogForYesterdayWithAppInfo(day, records);
}

// With an error line, and the command that helps, for a log that was lost.
ReportOutcome RunDriver::reportDay(std::int32_t day, const std::optional<Array>& appInfo,
                                   PassJournal& journal) {
  SystemLog& log = platform_.log;
  auto outcome = ReportOutcome::kLost;
  RunStep(log, "aggregated log", [&] { outcome = writeLog(day, appInfo, journal); });
  if (outcome != ReportOutcome::kLost) return outcome;
  const std::string command = CommandFor(day, platform_.counterStore.TLDaysSince1970());
  if (!journal.keepsLeftLog()) {
    log.error("The log of day %d is not in the spool; \"%s\" repeats it", day, command);
    return outcome;
  }
  log.error("The log of day %d stays that of a pass that was cut short; \"%s\" writes another", day,
            command);
  return ReportOutcome::kWritten;
}

void RunDriver::runSequence(std::int32_t day, const std::optional<Array>& appInfo,
                            PassJournal& journal) {
  SystemLog& log = platform_.log;
  log.log("daily tasks for day %d", day);
  RunStep(log, "checkpoint", [&] { platform_.counterStore.TLClientCheckpoint(); });
  const ReportOutcome outcome = reportDay(day, appInfo, journal);
  RunStep(log, "platform statistics", [&] {
    Platform platform = platform_.with({.diagnostics = &journal.diagnostics()});
    collectPlatformStatistics(platform, journal.progress());
  });
  RunStep(log, "structured logs", [&] { platform_.crashSupport.FSDumpAllOldStructuredDataLogs(); });
  RunStep(log, "tasking", [&] { updateTasking(platform_); });
  RunStep(log, "support logs", [&] { platform_.crashSupport.rollCarewellLogs(); });
  RunStep(log, "record of the pass", [&] { journal.settle(outcome); });
}

}  // namespace quorlet
