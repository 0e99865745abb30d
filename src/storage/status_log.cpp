#include "storage/status_log.h"

#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <exception>
#include <optional>

#include "platform/names.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr char kLastLoggedAt[] = "SSLastLoggedAt";
constexpr double kSecondsBetweenLogs = 604800;
constexpr char kProcessName[] = "quorlet";

// As printf's "%.2f", but with a full stop whatever the locale is.
std::string WithTwoDecimals(double value) {
  char text[320];  // the largest double has 309 digits before the point
  const auto end =
      std::to_chars(std::begin(text), std::end(text), value, std::chars_format::fixed, 2).ptr;
  return {text, end};
}

// "3,5,8", or nothing when no element is a number.
std::optional<std::string> JoinedElements(const Array& array) {
  const bool hasNumber = std::ranges::any_of(
      array, [](const PropertyValue& element) { return element.asNumber() != nullptr; });
  if (!hasNumber) return std::nullopt;
  std::string joined;
  for (const PropertyValue& element : array) {
    if (&element != &array[0]) joined += ',';
    joined += element.description();
  }
  return joined;
}

// What a pair shows of a value, or nothing when the value is left out.
std::optional<std::string> PairText(const PropertyValue& value) {
  if (const Array* array = value.asArray()) return JoinedElements(*array);
  const Number* number = value.asNumber();
  if (number == nullptr) return std::nullopt;
  return number->isReal() ? WithTwoDecimals(number->toDouble()) : value.description();
}

std::string JoinedPairs(const Dictionary& values) {
  std::string pairs;
  for (const auto& [key, value] : values) {
    const auto text = PairText(value);
    if (!text) continue;
    if (!pairs.empty()) pairs += ';';
    pairs.append(key).append(":").append(*text);
  }
  return pairs;
}

std::string LogText(Platform& platform, Date now, const Dictionary& values) {
  const PropertyValue date(now);
  CrashSupport& support = platform.crashSupport;
  const std::string body =
      FormatText("%@ %@[%d]: %@\n", date, kProcessName, getpid(), JoinedPairs(values));
  return FormatText(
      "System ID: %@\nHardware Model: %@\nOS Version: %@\nDate: %@\nIncident ID: %@\n"
      "FaultScribe Key: %@\n\n%@",
      support.GetSysIDWithDescription(), support.GetHardwareModel(), support.GetSystemVersion(),
      date, support.GetIncidentID(), GetFaultScribeKey(platform.deviceInfo), body);
}

void WriteLog(Platform& platform, std::string_view typeCode, const Dictionary* values) {
  const Date now = platform.clock.now();
  const auto stored = platform.preferences.CopyPreferenceValue(kLastLoggedAt, kCollectorsDomain);
  const Date* last = stored ? stored->asDate() : nullptr;
  if (last != nullptr && now.secondsSince1970 - last->secondsSince1970 < kSecondsBetweenLogs) {
    platform.log.log("NANDLogWriter:Last written at %@ current %@ :skipped", PropertyValue(*last),
                     PropertyValue(now));
    return;
  }
  if (values == nullptr) return;
  const std::string text = LogText(platform, now, *values);
  platform.diagnostics.DGWWriteLogForSubmission(
      typeCode, "StorageStatus", std::nullopt,
      [&](LogOutput& output) { return output.write(text); });
  platform.preferences.DGWPreferencesSetValue(kLastLoggedAt, PropertyValue(now), kCollectorsDomain);
  platform.preferences.DGWPreferencesSynchronize(kCollectorsDomain);
}

}  // namespace

void NLW_WriteLog(Platform& platform, std::string_view typeCode, const Dictionary* values) {
  try {
    WriteLog(platform, typeCode, values);
  } catch (const std::exception& exception) {
    platform.log.log("An exception occurred: %@", exception.what());
  }
}

std::string GetFaultScribeKey(DeviceInfo& deviceInfo) {
  const auto answer = deviceInfo.DQCopyAnswer("InverseDeviceID");
  const std::string* key = answer ? answer->asString() : nullptr;
  return key != nullptr ? *key : "error";
}

}  // namespace quorlet
