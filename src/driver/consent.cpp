#include "driver/consent.h"

#include <optional>
#include <utility>

#include "collectors/network_usage.h"
#include "platform/names.h"

namespace quorlet {
namespace {

// {"drop", "baseline"}: which drop is due, and the network usage that is to be counted from. There
// from the consent until the drop is made.
constexpr char kDropDue[] = "CounterDropDue";
// The store's note of the drop that was made last: made again, it would take what was recorded
// since.
constexpr char kNote[] = "consent";

bool Synchronize(Preferences& preferences) {
  return preferences.DGWPreferencesSynchronize(kConsentDomain);
}

bool DropCounters(CounterStore& store, const std::string& drop) {
  std::optional<Dictionary> made;
  if (!store.readNote(kNote, made)) return false;
  const std::string* last = made ? StringEntry(*made, "drop") : nullptr;
  if (last != nullptr && *last == drop) return true;
  StoreChanges changes;
  changes.dropCounters = true;
  changes.notes = {forgottenBaseline(), {kNote, Dictionary{{"drop", drop}}}};
  return store.write(changes);
}

}  // namespace

Consent consentOf(Preferences& preferences) {
  const auto value = preferences.DGWPreferencesGetValue(kSubmissionEnabled, kConsentDomain);
  if (!value) return Consent::kOff;
  if (*value == PropertyValue(true)) return Consent::kOn;
  return *value == PropertyValue(false) ? Consent::kOff : Consent::kInvalid;
}

bool finishDueDrop(Platform& platform) {
  Preferences& preferences = platform.preferences;
  const auto stored = preferences.DGWPreferencesGetValue(kDropDue, kConsentDomain);
  const Dictionary* due = stored ? stored->asDictionary() : nullptr;
  if (due == nullptr) return true;
  const std::string* drop = StringEntry(*due, "drop");
  const Dictionary* baseline = DictionaryEntry(*due, "baseline");
  if (!DropCounters(platform.counterStore, drop != nullptr ? *drop : "") ||
      (baseline != nullptr && !storeBaseline(*baseline, preferences))) {
    platform.log.error(
        "What was counted without consent cannot be dropped yet; it is not reported");
    return false;
  }
  preferences.DGWPreferencesSetValue(kDropDue, std::nullopt, kConsentDomain);
  return Synchronize(preferences);
}

bool giveConsent(Platform& platform, bool keepCounters) {
  Preferences& preferences = platform.preferences;
  if (consentOf(preferences) == Consent::kOn) return finishDueDrop(platform);
  const auto before = preferences.DGWPreferencesGetValue(kSubmissionEnabled, kConsentDomain);
  std::optional<PropertyValue> due;
  if (!keepCounters) {
    const std::optional<Dictionary> baseline = askForBaseline(platform);
    if (!baseline) {
      platform.log.error("The network usage service did not answer; nothing was changed");
      return false;
    }
    due = Dictionary{{"drop", platform.crashSupport.GetIncidentID()}, {"baseline", *baseline}};
  }
  preferences.DGWPreferencesSetValue(kSubmissionEnabled, PropertyValue(true), kConsentDomain);
  preferences.DGWPreferencesSetValue(kDropDue, due, kConsentDomain);
  if (!Synchronize(preferences)) {
    // Not to be written later, when nobody expects it any more.
    preferences.DGWPreferencesSetValue(kSubmissionEnabled, before, kConsentDomain);
    preferences.DGWPreferencesSetValue(kDropDue, std::nullopt, kConsentDomain);
    return false;
  }
  return finishDueDrop(platform);
}

bool withdrawConsent(Platform& platform) {
  Preferences& preferences = platform.preferences;
  preferences.DGWPreferencesSetValue(kSubmissionEnabled, std::nullopt, kConsentDomain);
  preferences.DGWPreferencesSetValue(kDropDue, std::nullopt, kConsentDomain);
  return Synchronize(preferences) && platform.diagnostics.removeAllLogs();
}

}  // namespace quorlet
