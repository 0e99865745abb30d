// The aggregated log: its document, its metadata, and the hand-over to the diagnostics library.
#include <utility>
#include <variant>

#include "platform/names.h"
#include "report/report.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr std::string_view kLastOSVersion = "LastOSVersion";
constexpr std::string_view kAllApps = "nuvex.tilehall.numAllInstalledApps";
constexpr std::string_view kThirdPartyApps = "nuvex.tilehall.numThirdPartyApps";
constexpr char kUnknown[] = "<unknown>";

std::string FirstOrUnknown(const std::vector<std::string>& list) {
  return list.empty() ? kUnknown : list.front();
}

// Remembers the running OS version; when it is new, the metadata that tells the one before.
std::optional<Dictionary> NoteOSVersion(Platform& platform, std::int32_t day) {
  const auto previous = platform.preferences.DGWPreferencesGetValue(kLastOSVersion, kPassDomain);
  const std::string current = platform.diagnostics.DGWOSVersion();
  const std::string* previousText = previous ? previous->asString() : nullptr;
  if (previousText != nullptr && *previousText == current) return std::nullopt;
  const std::string before = previousText != nullptr ? *previousText : kUnknown;
  // Written together: should this log never be spooled, the next one tells it.
  if (!platform.preferences.DGWPreferencesGetValue(kOSVersionBefore, kPassDomain)) {
    platform.preferences.DGWPreferencesSetValue(
        kOSVersionBefore, Dictionary{{"version", before}, {"day", Int32(day)}}, kPassDomain);
  }
  platform.preferences.DGWPreferencesSetValue(kLastOSVersion, PropertyValue(current), kPassDomain);
  platform.preferences.DGWPreferencesSynchronize(kPassDomain);
  return Dictionary{{"previous_os_version", before}};
}

}  // namespace

bool TLReport::serializeWithDateAndAppInfo(std::int32_t yesterday,
                                           const std::optional<Array>& appInfo) {
  addInstalledAppInfo();
  addMetadataKeys();
  reportDatabaseSize();
  reportCPUUptime();
  reportVMStats();

  const std::string digest = _config ? _config->configFileDigest() : std::string();
  _config.reset();

  auto document = WriteXmlPropertyList(assembleDocument(yesterday, digest, appInfo), kLogLimits);
  if (std::holds_alternative<PropertyListError>(document) && appInfo) {
    // What a peer sent must not cost the day's counters.
    _platform.log.error("Leaving the app info out of the aggregated log: %@",
                        std::get<PropertyListError>(document).description);
    document = WriteXmlPropertyList(assembleDocument(yesterday, digest, std::nullopt), kLogLimits);
  }
  if (const auto* error = std::get_if<PropertyListError>(&document)) {
    _platform.log.error("Could not create aggregated plist: %@", error->description);
    return false;
  }
  const auto metadata = NoteOSVersion(_platform, yesterday);
  const auto writer = [&](LogOutput& output) {
    return output.write(std::get<std::string>(document));
  };
  if (_platform.diagnostics.DGWWriteLogForSubmission(kAggregatedLogType, kAggregatedLogName,
                                                     metadata, writer)) {
    return true;
  }
  _platform.log.error("Failed to write aggregated log");
  return false;
}

Dictionary TLReport::assembleDocument(std::int32_t yesterday, const std::string& whitelistDigest,
                                      const std::optional<Array>& appInfo) {
  const auto tasking = [this](std::string_view key) {
    return _platform.preferences.DGWPreferencesGetValue(key, kPassDomain);
  };
  const auto taskID = tasking("TaskingID");
  const auto taskDigest = tasking("TaskingDigest");
  const auto payload = tasking("TaskingPayload");

  Dictionary document;
  document["TLCrashLogVersion"] = Int32(1);
  document["TLStartDate"] = _platform.counterStore.dateForDaysSince1970(yesterday);
  document["TLLogCreationDate"] = _platform.clock.now();
  document["TLMetadata"] = _metadataOutput;
  document["TLScalars"] = _scalarsOutput;
  document["TLDistributions"] = _distributionsOutput;
  document["TLDistributionsHistogram"] = _histogramsOutput;
  document["TLTasking"] =
      payload && payload->asArray() != nullptr ? *payload : PropertyValue(Array());
  document["TLTaskID"] =
      taskID && taskID->asString() != nullptr ? *taskID : PropertyValue("(no tasking id)");
  document["TLTaskDigest"] = taskDigest ? *taskDigest : PropertyValue("(no tasking digest)");
  document["TLWhitelistDigest"] = whitelistDigest;
  if (appInfo) document["TLActivatedAppInfo"] = *appInfo;
  return document;
}

void TLReport::addInstalledAppInfo() {
  const auto allOptions = optionsForScalarKey(kAllApps);
  const auto userOptions = optionsForScalarKey(kThirdPartyApps);
  if (!allOptions && !userOptions) return;
  std::int64_t all = 0;
  std::int64_t user = 0;
  const auto visit = [&](ApplicationBundleType type) {
    ++all;
    if (type == ApplicationBundleType::UserApplicationBundleType) ++user;
  };
  if (!_platform.applications.EnumerateApplicationBundles(visit)) return;
  if (allOptions) addScalarForKeyWithOptions(all, kAllApps, *allOptions);
  if (userOptions) addScalarForKeyWithOptions(user, kThirdPartyApps, *userOptions);
}

void TLReport::addMetadataKeys() {
  LocaleService& locale = _platform.locale;
  const auto preferred = locale.PreferredLanguages();
  const auto shown = locale.PreferredLocalizations(locale.SystemLanguages(), preferred);
  _metadataOutput["TLUserInterfaceLanguage"] = FirstOrUnknown(shown);
  _metadataOutput["TLPreferredUserInterfaceLanguage"] = FirstOrUnknown(preferred);
  if (const auto region = locale.CurrentRegionCode()) {
    _metadataOutput["TLUserSetRegionFormat"] = *region;
  }
}

}  // namespace quorlet
