// Preferences: values under a key in a domain, which outlive the process.
#ifndef QUORLET_PLATFORM_PREFERENCES_H_
#define QUORLET_PLATFORM_PREFERENCES_H_

#include <cstdint>
#include <optional>
#include <string_view>

#include "drvreport/property_value.h"

namespace quorlet {

// A domain name that the platform refuses (see the implementation) reads as empty, and writing to
// it does nothing; the first time, one error line in the system log says so.
class Preferences {
 public:
  virtual ~Preferences() = default;

  // The stored value, or nothing. Containers may be shared with the store: copy before changing.
  virtual std::optional<PropertyValue> DGWPreferencesGetValue(std::string_view key,
                                                              std::string_view domain) = 0;

  // Stores `value`, or removes the key when there is none. Its containers are shared with the store
  // from then on: do not change them. Every later read in this process sees it at once; it becomes
  // durable when the domain is synchronized, at the latest when the process ends normally.
  virtual void DGWPreferencesSetValue(std::string_view key, std::optional<PropertyValue> value,
                                      std::string_view domain) = 0;

  // Makes every pending change of the domain durable. False when that failed but may go well
  // another time (a full disk, say): one error line says so, and the changes stay pending. What is
  // refused for good, such as a value that no file can hold, does not count as a failure.
  virtual bool DGWPreferencesSynchronize(std::string_view domain) = 0;

  // Adds to an integer: when the domain is synchronized, to the value that is durable by then, so
  // that no other process's change is lost. Saturates, and never goes below 0. Several additions
  // add up; setting the key takes them back.
  virtual void addToInteger(std::string_view key, std::int64_t delta, std::string_view domain) = 0;

  // Whether what is durable can be read. A domain that cannot reads as empty, after one error line,
  // and is never replaced: synchronizing it fails.
  virtual bool isReadable(std::string_view domain) = 0;

  // The value when it is a boolean, otherwise false; `found` says whether it is one.
  bool DGWPreferencesGetBoolValue(std::string_view key, std::string_view domain, bool& found);

  // A copy of the value for the caller to change, or nothing.
  std::optional<PropertyValue> CopyPreferenceValue(std::string_view key, std::string_view domain);

  // Whether the value is true, or a number other than 0; `exists` says whether it is a boolean or a
  // number.
  bool GetPreferenceBool(std::string_view key, std::string_view domain, bool& exists);

  // The value when it is a number (truncated, saturated), otherwise 0.
  std::int64_t DGWPreferencesGetIntegerValue(std::string_view key, std::string_view domain);
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_PREFERENCES_H_
