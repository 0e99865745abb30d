// quorletctl status: whether everything is in place for a log a day, and what mends what is not.
#include <sys/stat.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cerrno>
#include <functional>
#include <memory>
#include <vector>

#include "ctl/install_checks.h"
#include "ctl/json_value.h"
#include "ctl/options.h"
#include "ctl/session.h"
#include "ctl/storage_health.h"
#include "ctl/whitelist.h"
#include "driver/consent.h"
#include "driver/run_driver.h"
#include "platform/linux/base/paths.h"
#include "platform/linux/logs/structured_log.h"
#include "platform/names.h"
#include "report/config.h"

namespace quorlet {
namespace {

constexpr std::int32_t kFarAhead = 30;
// No clock that is right says an earlier day: 2024-01-01.
constexpr std::int32_t kEarliestToday = 19723;
constexpr char kAnyLog[] = "quorletctl logs submit";
constexpr char kSetClock[] = "timedatectl set-ntp true";

std::string ResetGate() {
  return std::string("quorletctl prefs remove ") + kPassDomain + " " + kGateDay;
}

std::string Size(std::uint64_t bytes) {
  constexpr std::uint64_t kKibi = 1024;
  return bytes < kKibi * kKibi ? std::to_string((bytes + kKibi - 1) / kKibi) + " KiB"
                               : std::to_string((bytes + kKibi * kKibi / 2) >> 20) + " MiB";
}

std::uint64_t SizeOf(const std::string& path) {
  struct stat status {};
  return ::lstat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode)
             ? static_cast<std::uint64_t>(status.st_size)
             : 0;
}

struct Files {
  std::size_t count = 0;
  std::uint64_t bytes = 0;
};

// Those that are nobody's unfinished ones. Throws Failure when the directory cannot be read.
Files FilesIn(const std::string& directory, std::string_view prefix = "") {
  Files files;
  for (const std::string& name : NamesIn(directory)) {
    if (name.starts_with('.') || !name.starts_with(prefix)) continue;
    ++files.count;
    files.bytes += SizeOf(JoinPath(directory, name));
  }
  return files;
}

class Inspection {
 public:
  Inspection()
      : platform_(Root::FromEnvironment(), Access::kReadOnly,
                  messages_.makeLog(Access::kReadOnly)) {}

  Finding whitelist();
  Finding store();
  Finding lastPass();
  Finding spool();
  Finding structuredLog();
  Finding clock();
  Finding consent();
  Finding storage();

  const Root& root() const { return platform_.root(); }

 private:
  std::string path(const std::string& absolutePath) const { return root().path(absolutePath); }
  std::string whyOr(std::string_view otherwise) const { return messages_.lastErrorOr(otherwise); }
  Platform& services() { return platform_.services(); }
  std::int32_t today() { return services().counterStore.TLDaysSince1970(); }
  bool isConsented() { return services().diagnostics.DiagnosticLogSubmissionEnabled(); }

  Messages messages_;
  LinuxPlatform platform_;
};

Finding Inspection::consent() {
  Preferences& preferences = services().preferences;
  const Consent consent = consentOf(preferences);
  if (!messages_.errors().empty()) {
    return Error(whyOr(""), "quorletctl prefs list nuvex.diagwell");
  }
  if (consent == Consent::kOn) return Ok("on");
  if (consent == Consent::kOff) {
    return Warning("off: no log is written or submitted", "quorletctl consent on");
  }
  return Error("SubmissionEnabled is not a boolean, which enables nothing",
               "quorletctl consent on");
}

Finding Inspection::whitelist() {
  const std::string file = path(std::string(kWhitelistPath));
  if (::access(file.c_str(), F_OK) != 0 && errno == ENOENT) {
    return Warning("there is none at " + file + ": nothing is reported",
                   "install -D -m 644 DRAFT.plist '" + file + "'");
  }
  const WhitelistSummary summary = SummariseWhitelist(file);
  const std::string entries = std::to_string(summary.entries) + " keys and prefixes";
  if (summary.faults == 0) return Ok("it allows " + entries);
  return Error(
      "it allows " + entries + ", and " + Counted(summary.faults, "fault") + " will not work",
      "quorletctl whitelist check");
}

Finding Inspection::store() {
  const auto home = services().queries.dataHomePath();
  if (!home) return Error(whyOr("there is no place for the counters"), "quorletctl init");
  const std::string file = path(*home + kCounterStorePath);
  struct stat status {};
  if (::stat(file.c_str(), &status) != 0 && errno == ENOENT) {
    return Ok("none yet: the first counter makes " + file);
  }
  if (!services().counterStore.isSound()) {
    return Error(whyOr("it is damaged"), "quorlet -d");
  }
  const auto days = services().counterStore.daysWithCounters(kFirstDay, kLastDay);
  if (!days) return Error(whyOr("it cannot be read"), "quorlet -d");
  std::string text =
      "sound, " + Size(SizeOf(file) + SizeOf(file + "-wal")) + ", " + Counted(days->size(), "day");
  if (!days->empty()) text += ", the last " + DayText(*days->rbegin());
  return Ok(text);
}

Finding Inspection::lastPass() {
  RunDriver driver(services());
  const auto gate = driver.gateDay();
  const auto missing = driver.missingDays();
  if (!gate || !missing) {
    return Error(whyOr("the day of the last pass cannot be read"), "quorlet -d");
  }
  if (*gate > std::int64_t{today()} - 1 + kFarAhead) {
    return Error(
        "recorded for day " + std::to_string(*gate) + ", far ahead: no pass runs until then",
        ResetGate());
  }
  std::string text =
      *gate == 0 ? "there was none yet" : "for " + DayText(static_cast<std::int32_t>(*gate));
  for (std::size_t i = 0; i < missing->size(); ++i) {
    text += (i == 0 ? "; days without a log: " : ", ") + DayText((*missing)[i]);
  }
  if (!missing->empty()) {
    return Warning(text,
                   isConsented() ? "quorletctl report close-missing" : "quorletctl consent on");
  }
  // The day before yesterday's is what there is until today's pass has run.
  return *gate < today() - 2 ? Warning(text, "quorlet -d") : Ok(text);
}

Finding Inspection::spool() {
  const Files pending = FilesIn(path(kPendingDirectory));
  const Files outbox = FilesIn(path(kOutboxDirectory));
  const std::uint64_t bytes = pending.bytes + outbox.bytes;
  const std::string text = Counted(pending.count, "log") + " pending, " +
                           std::to_string(outbox.count) + " in outbox, " + Size(bytes) + " of " +
                           Size(kSpoolQuotaBytes);
  if (bytes <= kSpoolQuotaBytes / 4 * 3) return Ok(text);
  return Warning(text + "; when that is full, the oldest go",
                 pending.count > 0 && isConsented()
                     ? kAnyLog
                     : "rsync -a --remove-source-files '" + path(kOutboxDirectory) + "/' SERVER:");
}

Finding Inspection::structuredLog() {
  constexpr auto kMost = static_cast<std::uint64_t>(StructuredLog::kMostBytes);
  const std::string directory = path(kStructuredLogDirectory);
  const Files files = FilesIn(directory, "structured");
  const std::string text =
      Counted(files.count, "file") + ", " + Size(files.bytes) + " of " + Size(kMost);
  if (files.bytes <= kMost / 16 * 15) return Ok(text);
  return Warning(text + "; when that is full, the oldest days go",
                 "rm '" + directory + "'/structured-*");
}

Finding Inspection::clock() {
  const std::string now = "today is " + DayText(today());
  if (today() < kEarliestToday) return Error(now + ", which cannot be", kSetClock);
  const auto ahead = services().counterStore.daysWithCounters(today(), kLastDay);
  if (ahead && !ahead->empty()) {
    return Warning(now + ", but there are counters of " + DayText(*ahead->rbegin()), kSetClock);
  }
  return Ok(now);
}

Finding Inspection::storage() {
  const std::vector<Drive> drives = services().drives.read();
  if (drives.empty()) return Ok("no drive is found");
  std::string text = Counted(drives.size(), "drive") + ":";
  std::string trouble;
  for (const Drive& drive : drives) {
    const auto used = drive.figures[DriveFigure::kUsed];
    text += (&drive == drives.data() ? " " : ", ") + drive.name;
    if (used) text += " (" + std::to_string(*used) + " % used)";
    if (drive.answer != DriveAnswer::kAsleep && trouble.empty()) trouble = DriveTrouble(drive);
  }
  if (trouble.empty()) return Ok(text);
  return Warning(text + "; " + trouble,
                 std::string(::geteuid() == 0 ? "" : "sudo ") + "quorletctl storage health");
}

struct Check {
  const char* name;
  std::function<Finding(Inspection&)> inspect;
};

// In the order of the output.
const std::vector<Check>& Checks() {
  static const std::vector<Check> checks = {
      {"root", [](Inspection& i) { return CheckRootDirectory(i.root()); }},
      {"permissions", [](Inspection& i) { return CheckPermissions(i.root()); }},
      {"consent", &Inspection::consent},
      {"whitelist", &Inspection::whitelist},
      {"store", &Inspection::store},
      {"last-pass", &Inspection::lastPass},
      {"spool", &Inspection::spool},
      {"structured-log", &Inspection::structuredLog},
      {"clock", &Inspection::clock},
      {"service", [](Inspection& i) { return CheckService(i.root()); }},
      {"storage", &Inspection::storage},
      {"units", [](Inspection& i) { return CheckUnits(i.root()); }},
  };
  return checks;
}

// What one check meets must not keep the others from being made: each has its own platform.
Finding Inspect(const Check& check) {
  try {
    Inspection inspection;
    return check.inspect(inspection);
  } catch (const std::exception& failure) {
    return Error(failure.what(), std::string("quorletctl status --json"));
  }
}

void PrintStatus(Session& session, bool json) {
  bool hasErrors = false;
  Array checks;
  for (const Check& check : Checks()) {
    const Finding finding = Inspect(check);
    hasErrors |= finding.state == State::kError;
    const std::string state(StateName(finding.state));
    if (json) {
      checks.push_back(Dictionary{{"name", check.name},
                                  {"state", state},
                                  {"text", finding.text},
                                  {"remedy", finding.remedy}});
      continue;
    }
    session.out.line(state + " " + check.name + "  " + Escape(finding.text) +
                     (finding.remedy.empty() ? "" : "  -> " + Escape(finding.remedy)));
  }
  if (json) session.out.line(JsonText(Dictionary{{"checks", checks}}, JsonForm::kPlain));
  if (hasErrors) throw AnswerIsNo();
}

}  // namespace

void AddStatusCommand(CLI::App& app, Session& session) {
  const auto json = std::make_shared<bool>(false);
  CLI::App* status = AddCommand(
      app, "status", "Say what is in place for a log a day, and what mends the rest",
      "One line for each check: ok, warning or error, the check, what was found, and\n"
      "behind \"->\" the command that mends it. The exit status is 1 when one is an error.",
      "quorletctl status");
  AddJsonFlag(*status, *json);
  status->callback(
      [&session, json] { session.command = [&session, json] { PrintStatus(session, *json); }; });
}

}  // namespace quorlet
