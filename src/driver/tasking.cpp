#include "driver/tasking.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <limits>
#include <optional>
#include <set>
#include <string>
#include <utility>

#include "platform/names.h"

namespace quorlet {
namespace {

constexpr std::string_view kLastOSUpdate = "LastOSUpdate";
constexpr std::string_view kTaskingID = "TaskingID";
constexpr std::string_view kTaskingOS = "TaskingOS";
constexpr std::string_view kTaskingDigest = "TaskingDigest";
constexpr std::string_view kTaskingPayload = "TaskingPayload";
// What is being applied, with the keys above; there only while the other domains are being written.
constexpr std::string_view kTaskingInProgress = "TaskingInProgress";
constexpr std::string_view kTaskingChanged = "nuvex.da.tasking_changed";

std::optional<std::string> Text(const PropertyValue* value) {
  const std::string* text = value != nullptr ? value->asString() : nullptr;
  return text != nullptr ? std::optional(*text) : std::nullopt;
}

std::optional<PropertyValue> Optional(const PropertyValue* value) {
  return value != nullptr ? std::optional(*value) : std::nullopt;
}

// The low 32 bits, as the field is read.
std::int32_t Low32(std::int64_t value) { return static_cast<std::int32_t>(value); }

// One run over the tasking preferences.
class TaskingUpdate {
 public:
  explicit TaskingUpdate(Platform& platform) : platform_(platform) {}

  void run() {
    today_ = platform_.counterStore.TLDaysSince1970();
    if (const auto version = platform_.osVersion.CopySystemVersionDictionary()) {
      build_ = Text(version->find("ProductBuildVersion"));
    }
    noteOSChange();
    finishInterrupted();
    const auto scheduled =
        platform_.preferences.DGWPreferencesGetValue("ScheduledTasking", "nuvex.Ferryman");
    const Dictionary* tasking = scheduled ? scheduled->asDictionary() : nullptr;
    if (tasking == nullptr) return;
    const auto newID = Text(tasking->find(kTaskingID));
    if (!newID) return;
    if (!isApplied(*newID)) replaceApplied(recordOf(*tasking, *newID));
    submitAggressively();
  }

 private:
  std::optional<PropertyValue> own(std::string_view key) {
    return platform_.preferences.DGWPreferencesGetValue(key, kPassDomain);
  }
  std::optional<std::string> ownText(std::string_view key) {
    const auto value = own(key);
    return Text(value ? &*value : nullptr);
  }
  void set(std::string_view key, std::optional<PropertyValue> value) {
    platform_.preferences.DGWPreferencesSetValue(key, std::move(value), kPassDomain);
  }

  void noteOSChange() {
    if (const auto stored = own(kLastOSUpdate); stored && stored->asDictionary() != nullptr) {
      lastOS_ = stored->asDictionary()->shallowCopy();
    }
    const auto version = Text(lastOS_.find("version"));
    if (!build_ || version == build_) return;
    platform_.log.log("OS change since last run (%{public}@ -> %{public}@)", version, *build_);
    lastOS_ = Dictionary{{"version", *build_}, {"day", Int32(today_)}};
    // Written out with the rest of the domain, by this update or by the gate after the pass.
    set(kLastOSUpdate, PropertyValue(lastOS_));
  }

  // Whether the tasking `newID` is in force under this OS build.
  bool isApplied(const std::string& newID) {
    const auto currentID = ownText(kTaskingID);
    if (!currentID) return false;
    const auto currentOS = ownText(kTaskingOS);
    if (currentID == newID && currentOS && currentOS == build_) return true;
    platform_.log.log("Tasking update (%{public}@ -> %{public}@, %{public}@ -> %{public}@)",
                      *currentID, newID, currentOS, build_);
    return false;
  }

  // What is to be known of a tasking once it is applied; no payload where it has none.
  Dictionary recordOf(const Dictionary& tasking, const std::string& newID) const {
    Dictionary record{{kTaskingID, newID}};
    if (build_) record[kTaskingOS] = *build_;
    if (const PropertyValue* digest = tasking.find(kTaskingDigest)) {
      record[kTaskingDigest] = *digest;
    }
    if (const Array* payload = ArrayEntry(tasking, kTaskingPayload)) {
      record[kTaskingPayload] = *payload;
    }
    return record;
  }

  // A run that was cut short left domains half written, perhaps for a tasking that is no longer
  // scheduled: brings it to its end first.
  void finishInterrupted() {
    const auto stored = own(kTaskingInProgress);
    if (!stored) return;
    const Dictionary* record = stored->asDictionary();
    if (record != nullptr && Text(record->find(kTaskingID))) {
      replaceApplied(*record);
    } else {
      set(kTaskingInProgress, std::nullopt);
    }
  }

  // Removes the applied tasking, writes the one that `record` tells of, and announces it.
  void replaceApplied(const Dictionary& record) {
    // What was applied is known by its identifier: without one, there is nothing to remove.
    const auto stored = ownText(kTaskingID) ? own(kTaskingPayload) : std::nullopt;
    const Array* old = stored ? stored->asArray() : nullptr;
    const Array* payload = ArrayEntry(record, kTaskingPayload);
    // A run may also have been cut short with only its record left to remove.
    if (old != nullptr || payload != nullptr || own(kTaskingInProgress)) {
      set(kTaskingInProgress, PropertyValue(record));
      platform_.preferences.DGWPreferencesSynchronize(kPassDomain);
      const bool isWritten = writeDomains(old, payload);
      // While this is not durable, the next run does the same again.
      const Dictionary& known = payload != nullptr ? record : Dictionary();
      for (const auto key : {kTaskingID, kTaskingDigest, kTaskingPayload}) {
        set(key, Optional(known.find(key)));
      }
      if (payload != nullptr) set(kTaskingOS, Optional(record.find(kTaskingOS)));
      // Cut short before the announcement, the next run makes it.
      platform_.preferences.DGWPreferencesSynchronize(kPassDomain);
      platform_.notifications.PostNotification(kTaskingChanged);
      if (!isWritten) return;
      set(kTaskingInProgress, std::nullopt);
      platform_.preferences.DGWPreferencesSynchronize(kPassDomain);
      return;
    }
    platform_.notifications.PostNotification(kTaskingChanged);
  }

  // Writes the values themselves and makes them durable; false when that failed for some.
  bool writeDomains(const Array* old, const Array* payload) {
    std::set<std::string> touched;
    const auto set = [&](const std::string& domain, const std::string& key,
                         const PropertyValue* value) {
      // Not a tasking's to change: it is what brings this one to its end.
      if (domain == kPassDomain && key == kTaskingInProgress) return;
      platform_.preferences.DGWPreferencesSetValue(key, Optional(value), domain);
      touched.insert(domain);
    };
    if (old != nullptr) {
      forEachEntry(*old, [&](const std::string& domain, const std::string& key,
                             const PropertyValue*) { set(domain, key, nullptr); });
    }
    if (payload != nullptr) forEachEntry(*payload, set);
    bool allWritten = true;
    for (const std::string& domain : touched) {
      // Our own one follows with the record, which must not be durable before the others.
      if (domain == kPassDomain) continue;
      allWritten = platform_.preferences.DGWPreferencesSynchronize(domain) && allWritten;
    }
    return allWritten;
  }

  template <typename Use>
  static void forEachEntry(const Array& payload, Use use) {
    for (const PropertyValue& element : payload) {
      const Dictionary* entry = element.asDictionary();
      if (entry == nullptr) continue;
      const std::string* domain = StringEntry(*entry, "Domain");
      const std::string* key = StringEntry(*entry, "Key");
      if (domain != nullptr && key != nullptr) use(*domain, *key, entry->find("Value"));
    }
  }

  void submitAggressively() {
    const auto setting = platform_.diagnostics.DGWGetDATaskingValue("AggressiveSubmissionDays");
    const Number* number = setting ? setting->asNumber() : nullptr;
    const std::int32_t days = number != nullptr ? Low32(number->toInt64()) : 0;
    const std::int32_t changeDay = Low32(IntegerEntry(lastOS_, "day").value_or(0));
    const std::uint32_t forward =
        static_cast<std::uint32_t>(today_) - static_cast<std::uint32_t>(changeDay);
    // 32-bit arithmetic that wraps. The most negative number's magnitude does not fit, and a
    // distance is never negative.
    constexpr std::int32_t kFarthest = std::numeric_limits<std::int32_t>::max();
    const std::int64_t difference = static_cast<std::int32_t>(forward);
    const auto distance =
        static_cast<std::int32_t>(std::min<std::int64_t>(std::abs(difference), kFarthest));
    if (days <= distance) return;
    platform_.log.log("Aggressive submission day %d of %d; triggering log submission", distance,
                      days);
    platform_.diagnostics.SubmitDiagnosticLogs();
  }

  Platform& platform_;
  std::int32_t today_ = 0;
  std::optional<std::string> build_;
  Dictionary lastOS_;
};

}  // namespace

void updateTasking(Platform& platform) { TaskingUpdate(platform).run(); }

}  // namespace quorlet
