// An entry of the note:
//   pass           identifies the pass, as long as the day is not closed and opened again
//   gated          whether the gate tells that it is finished
//   finished       it came to its end; submission: and logs were to be written
//   logs           log name -> file names that may be in the spool
//   published      the aggregated log has been in the spool
//   storageLogged  the storage log's entries are in the structured log, or staged for it
//   osVersionBefore, corruptions, appInfo    what the aggregated log tells once only
//   corruptionsTold    file name of an aggregated log -> the corruptions that it tells
#include "driver/pass_journal.h"

#include <algorithm>
#include <utility>

#include "platform/names.h"
#include "values/digits.h"

namespace quorlet {
namespace {

constexpr char kNote[] = "passes";
constexpr std::int32_t kDaysKept = 31;  // as long as their counters, and yesterday's pass
constexpr std::string_view kPreviousOSVersion = "previous_os_version";
constexpr char kCountDomain[] = "nuvex.aggregated";
constexpr char kCorruptionCount[] = "DatabaseCorruptionCount";
// {"pass", "count"}: what an unfinished pass took off the count above, written together with it.
constexpr char kCorruptionsReported[] = "DatabaseCorruptionsReported";

bool IsSet(const Dictionary& entry, std::string_view flag) {
  const PropertyValue* value = entry.find(flag);
  return value != nullptr && *value == PropertyValue(true);
}

// What is left to know of an entry once its pass is finished.
Dictionary Finished(const Dictionary& entry) {
  Dictionary finished{{"finished", true}};
  for (const std::string_view flag : {"submission", "published"}) {
    if (IsSet(entry, flag)) finished[flag] = true;
  }
  if (IsSet(entry, "published")) return finished;
  // The log was lost: whoever repeats the day tells this.
  for (const std::string_view key : {"osVersionBefore", "appInfo"}) {
    if (const PropertyValue* value = entry.find(key)) finished[key] = *value;
  }
  return finished;
}

std::vector<std::string> LogsNamed(const Dictionary& entry, std::string_view name) {
  std::vector<std::string> fileNames;
  const Dictionary* logs = DictionaryEntry(entry, "logs");
  const Array* listed = logs != nullptr ? ArrayEntry(*logs, name) : nullptr;
  if (listed == nullptr) return fileNames;
  for (const PropertyValue& fileName : *listed) {
    if (const std::string* text = fileName.asString()) fileNames.push_back(*text);
  }
  return fileNames;
}

void SetLogs(Dictionary& entry, std::string_view name, const std::vector<std::string>& fileNames) {
  const Dictionary* stored = DictionaryEntry(entry, "logs");
  Dictionary logs = stored != nullptr ? stored->shallowCopy() : Dictionary();
  Array list;
  for (const std::string& fileName : fileNames) list.push_back(fileName);
  logs[name] = list;
  entry["logs"] = logs;
}

}  // namespace

std::optional<std::set<std::int32_t>> closedDays(CounterStore& store, std::int64_t gateDay) {
  std::optional<Dictionary> stored;
  if (!store.readNote(kNote, stored)) return std::nullopt;
  std::set<std::int32_t> closed;
  if (!stored) return closed;
  for (const auto& [name, value] : *stored) {
    const std::optional<std::int32_t> day = ParseNumber<std::int32_t>(name);
    const Dictionary* entry = value.asDictionary();
    if (!day || entry == nullptr || !IsSet(*entry, "submission")) continue;
    if (IsSet(*entry, "finished") || (IsSet(*entry, "gated") && gateDay >= *day)) {
      closed.insert(*day);
    }
  }
  return closed;
}

PassJournal::PassJournal(Platform& platform, std::int32_t day, bool isGated, std::int64_t gateDay)
    : platform_(platform),
      day_(day),
      isGated_(isGated),
      entryName_(std::to_string(day)),
      diagnostics_(*this, platform.diagnostics) {
  readEntries(gateDay);
  takeOver();
  takeOverOSVersion();
  takeOverCorruptions();
}

void PassJournal::readEntries(std::int64_t gateDay) {
  CounterStore& store = platform_.counterStore;
  std::optional<Dictionary> stored;
  // Looked at twice: a passing error would leave what an unfinished pass wrote beside what this one
  // writes.
  const bool isRead = store.readNote(kNote, stored) || store.readNote(kNote, stored);
  if (!isRead || !stored) return;
  const std::int32_t first = store.TLDaysSince1970() - kDaysKept;
  for (const auto& [name, value] : *stored) {
    const std::optional<std::int32_t> day = ParseNumber<std::int32_t>(name);
    const Dictionary* entry = value.asDictionary();
    if (!day || *day < first || entry == nullptr) continue;
    Dictionary kept = entry->shallowCopy();
    if (IsSet(kept, "gated") && gateDay >= *day) kept["finished"] = true;
    // Its pass is gone: the gate, which may go past the day now, says nothing of it any more.
    kept.remove("gated");
    entries_[name] = IsSet(kept, "finished") ? Finished(kept) : kept;
  }
}

// Begins the day's entry with what an unfinished pass of the day, or one whose log was lost, left.
void PassJournal::takeOver() {
  const Dictionary* left = DictionaryEntry(entries_, entryName_);
  const bool isFinished = left != nullptr && IsSet(*left, "finished");
  isRepeated_ = left != nullptr && !isFinished;
  Dictionary entry;
  if (left != nullptr && !IsSet(*left, "published")) entry = left->shallowCopy();
  if (isRepeated_) entry = left->shallowCopy();
  entry.remove("finished");
  if (!isRepeated_) {
    const double now = platform_.clock.now().secondsSince1970;
    entry["pass"] = std::to_string(static_cast<std::int64_t>(now * 1000));
  }
  if (isGated_) entry["gated"] = true;
  entry["submission"] = platform_.diagnostics.DiagnosticLogSubmissionEnabled();
  entries_[entryName_] = entry;
  if (const std::string* version = StringEntry(entry, "osVersionBefore")) {
    osVersionBefore_ = *version;
  }
  usedUp_.corruptions = IntegerEntry(entry, "corruptions").value_or(0);
}

// The preference is there while a pass is unfinished, or its log lost.
void PassJournal::takeOverOSVersion() {
  const auto stored = platform_.preferences.DGWPreferencesGetValue(kOSVersionBefore, kPassDomain);
  const Dictionary* before = stored ? stored->asDictionary() : nullptr;
  const std::string* version = before != nullptr ? StringEntry(*before, "version") : nullptr;
  if (version == nullptr) return;
  const std::string day = std::to_string(IntegerEntry(*before, "day").value_or(day_));
  const Dictionary* other = DictionaryEntry(entries_, day);
  if (day == entryName_ || other == nullptr || !hasSpooledLog(*other)) {
    osVersionBefore_ = *version;
    return;
  }
  // The other day's log has told it, and is to tell it again should that day be repeated.
  Dictionary told = other->shallowCopy();
  told["osVersionBefore"] = *version;
  entries_[day] = told;
}

// The preference is there while a pass is unfinished, and stays when it is killed at its very end.
void PassJournal::takeOverCorruptions() {
  const auto stored =
      platform_.preferences.DGWPreferencesGetValue(kCorruptionsReported, kCountDomain);
  const Dictionary* reported = stored ? stored->asDictionary() : nullptr;
  const std::string* pass = reported != nullptr ? StringEntry(*reported, "pass") : nullptr;
  if (pass == nullptr) return;
  const std::int64_t count = IntegerEntry(*reported, "count").value_or(0);
  for (const auto& [day, value] : entries_) {
    const Dictionary& entry = *value.asDictionary();
    const std::string* its = StringEntry(entry, "pass");
    if (its == nullptr || *its != *pass) continue;
    Dictionary told = entry.shallowCopy();
    told["corruptions"] = Int64(count);
    if (day == entryName_) usedUp_.corruptions = count;
    entries_[day] = told;
    return;
  }
}

// Whether an unfinished pass's log of the day stands in for the one that this pass could not write:
// then that one's corruptions are those that were told.
bool PassJournal::keepsLeftLog() {
  if (!isRepeated_ || !hasSpooledLog(entry())) return false;
  const Dictionary* told = DictionaryEntry(entry(), "corruptionsTold");
  std::int64_t corruptions = 0;
  for (const std::string& name : LogsNamed(entry(), kAggregatedLogName)) {
    if (told == nullptr || !platform_.diagnostics.hasLog(name)) continue;
    corruptions = IntegerEntry(*told, name).value_or(0);
  }
  const std::int64_t untold = usedUp_.corruptions - corruptions;
  if (untold != 0) {
    platform_.preferences.addToInteger(kCorruptionCount, untold, kCountDomain);
    usedUp_.corruptionsTaken -= untold;
    usedUp_.corruptions = corruptions;
  }
  entry()["published"] = true;
  return true;
}

bool PassJournal::hasSpooledLog(const Dictionary& entry) {
  return IsSet(entry, "published") ||
         std::ranges::any_of(LogsNamed(entry, kAggregatedLogName), [this](const std::string& name) {
           return platform_.diagnostics.hasLog(name);
         });
}

Dictionary& PassJournal::entry() { return *entries_[entryName_].asDictionary(); }

std::optional<Array> PassJournal::takeAppInfo(const std::optional<Array>& given) {
  if (!given) {
    const Array* left = ArrayEntry(entry(), "appInfo");
    return left != nullptr ? std::optional(*left) : std::nullopt;
  }
  entry()["appInfo"] = *given;
  write();
  return given;
}

// Of a day's log only the one day's; of any other log what any unfinished pass wrote.
std::vector<std::string> PassJournal::logsToReplace(std::string_view name) {
  std::vector<std::string> fileNames;
  for (const auto& [day, value] : entries_) {
    const bool isMeant = day == entryName_ ? isRepeated_ : name != kAggregatedLogName;
    if (!isMeant) continue;
    const auto logs = LogsNamed(*value.asDictionary(), name);
    fileNames.insert(fileNames.end(), logs.begin(), logs.end());
  }
  return fileNames;
}

void PassJournal::noteLog(std::string_view name, const std::string& fileName) {
  std::vector<std::string> logs = LogsNamed(entry(), name);
  logs.push_back(fileName);
  SetLogs(entry(), name, logs);
  if (name == kAggregatedLogName) {
    if (osVersionBefore_) entry()["osVersionBefore"] = *osVersionBefore_;
    const Dictionary* stored = DictionaryEntry(entry(), "corruptionsTold");
    Dictionary told = stored != nullptr ? stored->shallowCopy() : Dictionary();
    told[fileName] = Int64(usedUp_.corruptions);
    entry()["corruptionsTold"] = told;
  }
  write();
}

bool PassJournal::NotingDiagnostics::writeLog(const LogRequest& request, const LogWriter& writer) {
  const bool isAggregated = request.name == kAggregatedLogName;
  LogRequest noted = request;
  if (isAggregated && journal_.osVersionBefore_) {
    noted.metadata = request.metadata ? request.metadata->shallowCopy() : Dictionary();
    (*noted.metadata)[kPreviousOSVersion] = *journal_.osVersionBefore_;
  } else if (isAggregated && request.metadata) {
    if (const std::string* version = StringEntry(*request.metadata, kPreviousOSVersion)) {
      journal_.osVersionBefore_ = *version;
    }
  }
  std::vector<std::string> replaced = journal_.logsToReplace(request.name);
  std::string own;
  noted.beforePublication = [&](const std::string& fileName) {
    own = fileName;
    journal_.noteLog(request.name, fileName);
  };
  if (!diagnostics_.writeLog(noted, writer)) {
    if (!own.empty()) SetLogs(journal_.entry(), request.name, replaced);
    return false;
  }
  if (isAggregated) journal_.entry()["published"] = true;
  // A pass that was killed before its log appeared noted a name that was free, and so is given
  // again.
  std::erase(replaced, own);
  if (replaced.empty()) return true;
  if (diagnostics_.removeLogs(replaced)) {
    SetLogs(journal_.entry(), request.name, {own});
  } else {
    journal_.unremoved_.insert(journal_.unremoved_.end(), replaced.begin(), replaced.end());
  }
  return true;
}

PassProgress PassJournal::progress() {
  return {.storageLogged = isRepeated_ && IsSet(entry(), "storageLogged"),
          .storageLoggedNote = [this] {
            entry()["storageLogged"] = true;
            return note();
          }};
}

void PassJournal::settle(ReportOutcome outcome) {
  Preferences& preferences = platform_.preferences;
  // What was in the way a moment ago may be gone.
  if (!unremoved_.empty()) platform_.diagnostics.removeLogs(unremoved_);
  if (outcome != ReportOutcome::kWritten) {
    // Nobody was told of them: they are counted on.
    if (usedUp_.corruptionsTaken != 0) {
      preferences.addToInteger(kCorruptionCount, usedUp_.corruptionsTaken, kCountDomain);
    }
    return;
  }
  if (usedUp_.corruptionsTaken != 0) {
    const std::string* pass = StringEntry(entry(), "pass");
    preferences.DGWPreferencesSetValue(
        kCorruptionsReported,
        Dictionary{{"pass", pass != nullptr ? *pass : ""}, {"count", Int64(usedUp_.corruptions)}},
        kCountDomain);
    preferences.DGWPreferencesSynchronize(kCountDomain);
  }
  if (!preferences.DGWPreferencesGetValue(kOSVersionBefore, kPassDomain)) return;
  preferences.DGWPreferencesSetValue(kOSVersionBefore, std::nullopt, kPassDomain);
  // The gate is written to the same domain.
  if (!isGated_) preferences.DGWPreferencesSynchronize(kPassDomain);
}

void PassJournal::end() {
  if (usedUp_.corruptionsTaken != 0) {
    platform_.preferences.DGWPreferencesSetValue(kCorruptionsReported, std::nullopt, kCountDomain);
  }
  if (isGated_) return;
  Dictionary ended = entry().shallowCopy();
  ended["finished"] = true;
  entries_[entryName_] = Finished(ended);
  write();
}

StoreNote PassJournal::note() const { return {kNote, entries_}; }

void PassJournal::write() {
  StoreChanges changes;
  changes.notes.push_back(note());
  // The pass goes on all the same; there is an error line.
  static_cast<void>(platform_.counterStore.write(changes));
}

}  // namespace quorlet
