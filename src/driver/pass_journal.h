// What passes are known by while they are unfinished, so that one that was cut short is repeated
// rather than doubled. Kept in the counter store, in step with the figures, as one note: a
// dictionary with an entry for each day that had a pass.
#ifndef QUORLET_DRIVER_PASS_JOURNAL_H_
#define QUORLET_DRIVER_PASS_JOURNAL_H_

#include <cstdint>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "collectors/platform_statistics.h"
#include "drvreport/property_value.h"
#include "platform/platform.h"
#include "report/report.h"

namespace quorlet {

// The days that are closed: a pass for the day came to its end while logs were submitted, whether
// it had anything to report or not. `gateDay` is the gate's. Nothing, after an error line, when
// that cannot be known.
std::optional<std::set<std::int32_t>> closedDays(CounterStore& store, std::int64_t gateDay);

// The record of one pass. Made with the pass lock held, before the pass does anything; nothing is
// written until the pass writes its first log or figures.
//
// A gated pass is finished when the gate's day says so; another one when end() has noted it.
class PassJournal {
 public:
  // A gated pass is recorded as finished by the gate, which is at `gateDay` when the pass begins.
  PassJournal(Platform& platform, std::int32_t day, bool isGated, std::int64_t gateDay);
  PassJournal(const PassJournal&) = delete;
  PassJournal& operator=(const PassJournal&) = delete;

  // The records for the log: those given, which are then safe from a kill, or else those that an
  // unfinished pass of the day was given.
  std::optional<Array> takeAppInfo(const std::optional<Array>& given);

  // What unfinished passes used up, for the log that the pass writes.
  UsedUp& usedUp() { return usedUp_; }

  // The platform's diagnostics, on which logs of this pass are to be written: a log is noted before
  // it appears, tells what unfinished passes used up, and replaces what they wrote.
  Diagnostics& diagnostics() { return diagnostics_; }

  // When this pass could not write the aggregated log: whether one that an unfinished pass of the
  // day wrote stays, and counts as this pass's.
  bool keepsLeftLog();

  // How far an unfinished pass of the day got with the storage log, and how this one tells.
  PassProgress progress();

  // Before the gate is recorded: what the log used up is gone for good, if it was written.
  void settle(ReportOutcome outcome);
  // The pass has ended; for a gated one the gate has been recorded.
  void end();

 private:
  // Writes logs through the platform's own diagnostics.
  class NotingDiagnostics final : public Diagnostics {
   public:
    NotingDiagnostics(PassJournal& journal, Diagnostics& diagnostics)
        : journal_(journal), diagnostics_(diagnostics) {}
    bool DiagnosticLogSubmissionEnabled() override {
      return diagnostics_.DiagnosticLogSubmissionEnabled();
    }
    std::string DGWOSVersion() override { return diagnostics_.DGWOSVersion(); }
    std::optional<PropertyValue> DGWGetDATaskingValue(std::string_view name) override {
      return diagnostics_.DGWGetDATaskingValue(name);
    }
    bool writeLog(const LogRequest& request, const LogWriter& writer) override;
    bool hasLog(const std::string& fileName) override { return diagnostics_.hasLog(fileName); }
    bool removeLogs(std::span<const std::string> fileNames) override {
      return diagnostics_.removeLogs(fileNames);
    }
    bool removeAllLogs() override { return diagnostics_.removeAllLogs(); }
    void SubmitDiagnosticLogs() override { diagnostics_.SubmitDiagnosticLogs(); }

   private:
    PassJournal& journal_;
    Diagnostics& diagnostics_;
  };

  void readEntries(std::int64_t gateDay);
  void takeOver();
  void takeOverOSVersion();
  void takeOverCorruptions();
  bool hasSpooledLog(const Dictionary& entry);
  Dictionary& entry();
  std::vector<std::string> logsToReplace(std::string_view name);
  void noteLog(std::string_view name, const std::string& fileName);
  StoreNote note() const;
  void write();

  Platform& platform_;
  const std::int32_t day_;
  const bool isGated_;
  const std::string entryName_;  // the day's
  NotingDiagnostics diagnostics_;
  Dictionary entries_;
  bool isRepeated_ = false;  // an unfinished pass of the day is being repeated
  std::optional<std::string> osVersionBefore_;
  std::vector<std::string>
      unremoved_;  // logs that this pass has replaced, but that are still there
  UsedUp usedUp_;
};

}  // namespace quorlet

#endif  // QUORLET_DRIVER_PASS_JOURNAL_H_
