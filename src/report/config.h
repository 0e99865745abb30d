// TLConfig: which counter-store keys reach the aggregated log, and with which options.
//
// The whitelist is a property list. Its root maps group names to dictionaries that may hold
// "ScalarKeys", "DistributionKeys", "ScalarKeyPrefixes" and "DistributionKeyPrefixes", each from a
// key or key prefix to its KeyOptions.
#ifndef QUORLET_REPORT_CONFIG_H_
#define QUORLET_REPORT_CONFIG_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "drvreport/property_value.h"
#include "platform/platform.h"
#include "report/key_options.h"

namespace quorlet {

inline constexpr std::string_view kWhitelistPath =
    "/Library/Application Support/TallyLedger/Whitelist_Zed.plist";

// An entry of a whitelist that was skipped because its type is wrong. `key` is empty when the
// whole group is meant.
struct WhitelistFault {
  std::string group;
  std::string key;
  std::string reason;
};

// The four tables that a whitelist's groups are merged into.
struct KeyTables {
  Dictionary scalarKeys;
  Dictionary scalarPrefixes;
  Dictionary distributionKeys;
  Dictionary distributionPrefixes;
};

// Merges the groups of a whitelist's root for which `enabled` answers true into `tables`, in byte
// order of their names, a later group replacing an earlier one's options. Returns what was skipped.
std::vector<WhitelistFault> MergeWhitelist(const Dictionary& root,
                                           const std::function<bool(const std::string&)>& enabled,
                                           const KeyTables& tables);

// Whether a whitelist group counts on this device. A group that tasking has switched off is
// logged; internal devices have all groups.
bool IsGroupEnabled(const std::string& group, bool isInternalDevice, Preferences& preferences,
                    SystemLog& log);

// The entry of the whitelist that applies to a key.
struct KeyMatch {
  enum class Kind { kExact, kPrefix, kInternalDevice } kind;
  std::string entry;  // the key or prefix; empty for what only an internal device reports
  KeyOptions options;
  bool isExpired = false;  // an exact entry that hides the prefixes, but answers nothing any more
};

class TLConfig {
 public:
  // Loads the whitelist file. Nothing, after one message, when it cannot be read or parsed;
  // `isUnreadable` tells whether it is there, but could not be read.
  static std::optional<TLConfig> init(Platform& platform, bool* isUnreadable = nullptr);

  // The day that is reported, for entries that expire; until it is told, none has expired.
  void setReportedDay(std::int32_t day) { _reportedDay = day; }

  // The options with which a key is reported, or nothing when it is left out. An exact entry comes
  // before a prefix, a longer prefix before a shorter one; a prefix that has expired is passed
  // over.
  std::optional<KeyOptions> configOptionsForScalarKey(std::string_view key) const;
  std::optional<KeyOptions> configOptionsForDistributionKey(std::string_view key) const;

  // The entry that gives the options above, or that has expired; nothing when no entry applies.
  std::optional<KeyMatch> matchForKey(std::string_view key, KeyKind kind) const;

  // The MD5 digest of the whitelist file, 32 lower-case hexadecimal characters.
  const std::string& configFileDigest() const { return _configFileDigest; }

 private:
  explicit TLConfig(SystemLog& log) : _log(&log) {}
  std::optional<KeyOptions> optionsForKey(std::string_view key, KeyKind kind) const;
  bool hasExpired(const KeyOptions& options) const;

  Dictionary _scalarKeys;
  Dictionary _scalarPrefixes;
  Dictionary _distributionKeys;
  Dictionary _distributionPrefixes;
  bool _isInternalDevice = false;
  std::optional<std::int32_t> _reportedDay;
  std::string _configFileDigest;

  // The lengths that occur among the prefixes, longest first: a key is looked up once for each.
  std::vector<std::size_t> _scalarPrefixLengths;
  std::vector<std::size_t> _distributionPrefixLengths;
  SystemLog* _log;
};

}  // namespace quorlet

#endif  // QUORLET_REPORT_CONFIG_H_
