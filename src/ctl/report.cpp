// quorletctl report: the aggregated log that a pass would write, and the logs of days without one.
#include "report/report.h"

#include <CLI/CLI.hpp>
#include <memory>

#include "ctl/json_value.h"
#include "ctl/options.h"
#include "ctl/session.h"
#include "driver/run_driver.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr std::int32_t kDaysKept = 30;

struct PreviewArguments {
  std::optional<std::int32_t> day;
  bool json = false;
};

// The diagnostics library, except that a log is kept in memory instead of being written.
class CapturingDiagnostics final : public Diagnostics {
 public:
  explicit CapturingDiagnostics(Diagnostics& diagnostics) : diagnostics_(diagnostics) {}

  bool DiagnosticLogSubmissionEnabled() override {
    return diagnostics_.DiagnosticLogSubmissionEnabled();
  }
  std::string DGWOSVersion() override { return diagnostics_.DGWOSVersion(); }
  std::optional<PropertyValue> DGWGetDATaskingValue(std::string_view name) override {
    return diagnostics_.DGWGetDATaskingValue(name);
  }
  bool writeLog(const LogRequest&, const LogWriter& writer) override {
    Capture capture;
    if (!writer(capture)) return false;
    body_ = std::move(capture.bytes);
    return true;
  }
  bool hasLog(const std::string&) override { return false; }
  bool removeLogs(std::span<const std::string>) override { return false; }
  bool removeAllLogs() override { return false; }
  void SubmitDiagnosticLogs() override {}

  // The captured log's body, or nothing when none was written.
  const std::optional<std::string>& body() const { return body_; }

 private:
  struct Capture final : LogOutput {
    bool write(std::string_view more) override {
      bytes += more;
      return true;
    }
    std::string bytes;
  };

  Diagnostics& diagnostics_;
  std::optional<std::string> body_;
};

// Says why there is no document as well as it can be known: the first complaint of the layers
// below is the likely cause.
std::string NothingToReport(std::int32_t day, const Messages& messages) {
  std::string text = "nothing to report for day " + std::to_string(day);
  if (!messages.errors().empty()) text += " (" + messages.errors().front() + ")";
  return text;
}

void Preview(Session& session, const PreviewArguments& arguments) {
  const auto platform = session.open(Access::kReadOnly);
  CapturingDiagnostics diagnostics(platform->services().diagnostics);
  Platform services = platform->services().with({.diagnostics = &diagnostics});
  const std::int32_t day =
      arguments.day ? *arguments.day : services.counterStore.TLDaysSince1970() - 1;

  TLReport report(services);
  report.writeLogForYesterdayWithAppInfo(day, std::nullopt);
  if (!diagnostics.body()) throw Failure(NothingToReport(day, session.messages));

  if (arguments.json) {
    const auto document = ReadPropertyList(*diagnostics.body(), kLogLimits);
    if (const auto* error = std::get_if<PropertyListError>(&document)) {
      throw Failure("the document cannot be read back: " + error->description);
    }
    session.out.line(JsonText(std::get<PropertyValue>(document), JsonForm::kPlain));
  } else {
    session.out.write(*diagnostics.body());
  }
  if (day < services.counterStore.TLDaysSince1970() - kDaysKept) {
    session.messages.add(LogLevel::kDefault, "note: day " + std::to_string(day) +
                                                 " is more than 30 days old, a pass would drop it "
                                                 "before it writes a log");
  }
  if (!services.diagnostics.DiagnosticLogSubmissionEnabled()) {
    session.messages.add(LogLevel::kDefault,
                         "note: submission is disabled, a pass would not write this log");
  }
}

void CloseMissing(Session& session) {
  const auto platform = session.open(Access::kReadWrite);
  Platform& services = platform->services();
  RequireConsent(services);
  const auto print = [&](std::int32_t day) { session.out.line(DayText(day)); };
  if (!RunDriver(services).closeMissingDays(print)) {
    throw Failure(session.messages.lastErrorOr("not every missing day could be closed"));
  }
}

}  // namespace

void AddReportCommands(CLI::App& app, Session& session) {
  CLI::App* report = AddFamily(app, "report", "The aggregated log", "quorletctl report preview");
  const auto arguments = std::make_shared<PreviewArguments>();
  CLI::App* preview =
      AddCommand(*report, "preview", "Print the log that a pass for a day would write",
                 "Nothing changes.", "quorletctl report preview --day 20516");
  AddDayOption(*preview, arguments->day, "The day (without it: yesterday)");
  AddJsonFlag(*preview, arguments->json);
  preview->callback([&session, arguments] {
    session.command = [&session, arguments] { Preview(session, *arguments); };
  });
  CLI::App* close = AddCommand(
      *report, "close-missing", "Write the logs of past days that have none",
      "For each day of the last 30 before yesterday that has counters, but that no pass\n"
      "came to its end for: its log is written, the oldest first, and the day printed.\n"
      "Refused without the owner's consent.",
      "quorletctl report close-missing");
  close->callback([&session] { session.command = [&session] { CloseMissing(session); }; });
}

}  // namespace quorlet
