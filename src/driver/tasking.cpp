#include "driver/tasking.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <limits>
#include <optional>
#include <set>
#include <string>
#include <utility>

namespace quorlet {
namespace {

constexpr std::string_view kOwnDomain = "nuvex.aggregated.quorlet";
constexpr std::string_view kLastOSUpdate = "LastOSUpdate";
constexpr std::string_view kTaskingID = "TaskingID";
constexpr std::string_view kTaskingOS = "TaskingOS";
constexpr std::string_view kTaskingDigest = "TaskingDigest";
constexpr std::string_view kTaskingPayload = "TaskingPayload";

std::optional<std::string> Text(const PropertyValue* value) {
  const std::string* text = value != nullptr ? value->asString() : nullptr;
  return text != nullptr ? std::optional(*text) : std::nullopt;
}

std::optional<PropertyValue> Optional(const PropertyValue* value) {
  return value != nullptr ? std::optional(*value) : std::nullopt;
}

std::optional<PropertyValue> Optional(const std::optional<std::string>& text) {
  return text ? std::optional<PropertyValue>(*text) : std::nullopt;
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
    const auto scheduled =
        platform_.preferences.DGWPreferencesGetValue("ScheduledTasking", "nuvex.Ferryman");
    const Dictionary* tasking = scheduled ? scheduled->asDictionary() : nullptr;
    if (tasking == nullptr) return;
    const auto newID = Text(tasking->find(kTaskingID));
    if (!newID) return;
    if (!isApplied(*newID)) {
      apply(*tasking, *newID);
      synchronize();
      platform_.notifications.PostNotification("nuvex.da.tasking_changed");
    }
    submitAggressively();
  }

 private:
  std::optional<PropertyValue> own(std::string_view key) {
    return platform_.preferences.DGWPreferencesGetValue(key, kOwnDomain);
  }
  std::optional<std::string> ownText(std::string_view key) {
    const auto value = own(key);
    return Text(value ? &*value : nullptr);
  }
  void set(std::string_view key, std::optional<PropertyValue> value, std::string_view domain) {
    platform_.preferences.DGWPreferencesSetValue(key, std::move(value), domain);
    touched_.emplace(domain);
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
    platform_.preferences.DGWPreferencesSetValue(kLastOSUpdate, PropertyValue(lastOS_), kOwnDomain);
  }

  // Whether the tasking `newID` is in force under this OS build; otherwise what was applied before
  // is removed.
  bool isApplied(const std::string& newID) {
    const auto currentID = ownText(kTaskingID);
    if (!currentID) return false;
    const auto currentOS = ownText(kTaskingOS);
    if (currentID == newID && currentOS && currentOS == build_) return true;
    platform_.log.log("Tasking update (%{public}@ -> %{public}@, %{public}@ -> %{public}@)",
                      *currentID, newID, currentOS, build_);
    removeApplied();
    return false;
  }

  void removeApplied() {
    const auto stored = own(kTaskingPayload);
    const Array* payload = stored ? stored->asArray() : nullptr;
    if (payload == nullptr) return;
    forEachEntry(*payload, [this](const std::string& domain, const std::string& key,
                                  const PropertyValue*) { set(key, std::nullopt, domain); });
    for (const auto key : {kTaskingID, kTaskingDigest, kTaskingPayload}) {
      set(key, std::nullopt, kOwnDomain);
    }
  }

  void apply(const Dictionary& tasking, const std::string& newID) {
    const Array* payload = ArrayEntry(tasking, kTaskingPayload);
    if (payload == nullptr) return;
    forEachEntry(*payload,
                 [this](const std::string& domain, const std::string& key,
                        const PropertyValue* value) { set(key, Optional(value), domain); });
    set(kTaskingID, PropertyValue(newID), kOwnDomain);
    set(kTaskingOS, Optional(build_), kOwnDomain);
    set(kTaskingDigest, Optional(tasking.find(kTaskingDigest)), kOwnDomain);
    set(kTaskingPayload, PropertyValue(*payload), kOwnDomain);
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

  // Our own record goes last: while it still tells of the old tasking, a run that was cut short is
  // made good by the next one with the same schedule.
  void synchronize() {
    const bool ownTouched = touched_.erase(std::string(kOwnDomain)) != 0;
    for (const std::string& domain : touched_) {
      platform_.preferences.DGWPreferencesSynchronize(domain);
    }
    if (ownTouched) platform_.preferences.DGWPreferencesSynchronize(kOwnDomain);
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
  std::set<std::string> touched_;
};

}  // namespace

void updateTasking(Platform& platform) { TaskingUpdate(platform).run(); }

}  // namespace quorlet
