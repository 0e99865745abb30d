#include "report/config.h"

#include <set>
#include <utility>
#include <variant>

#include "values/digest.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr std::string_view kInternalTesting = "InternalTesting";
constexpr std::string_view kTaskingDomain = "nuvex.da";

// A group entry's table, or nothing for a name that means nothing.
std::optional<Dictionary> TableNamed(std::string_view name, const KeyTables& tables) {
  if (name == "ScalarKeys") return tables.scalarKeys;
  if (name == "DistributionKeys") return tables.distributionKeys;
  if (name == "ScalarKeyPrefixes") return tables.scalarPrefixes;
  if (name == "DistributionKeyPrefixes") return tables.distributionPrefixes;
  return std::nullopt;
}

// A misspelt option is no reason to leave the key out, but its value may be reported more exactly
// than was meant: one line for each entry says so.
void ReportUnknownOptions(const Dictionary& table, SystemLog& log) {
  for (const auto& [key, options] : table) {
    for (const auto& [name, value] : *options.asDictionary()) {
      if (const auto fault = UnknownOptionFault(name)) {
        log.error("Whitelist entry %@: %@", key, *fault);
        break;
      }
    }
  }
}

std::vector<std::size_t> LengthsLongestFirst(const Dictionary& prefixes) {
  std::set<std::size_t, std::greater<>> lengths;
  for (const auto& [prefix, options] : prefixes) lengths.insert(prefix.size());
  return {lengths.begin(), lengths.end()};
}

}  // namespace

std::vector<WhitelistFault> MergeWhitelist(const Dictionary& root,
                                           const std::function<bool(const std::string&)>& enabled,
                                           const KeyTables& tables) {
  std::vector<WhitelistFault> faults;
  for (const auto& [groupName, groupValue] : root) {
    if (!enabled(groupName)) continue;
    const Dictionary* group = groupValue.asDictionary();
    if (group == nullptr) {
      faults.push_back({groupName, "", "is not a dictionary"});
      continue;
    }
    for (const auto& [name, value] : *group) {
      auto table = TableNamed(name, tables);
      if (!table) continue;
      const Dictionary* entries = value.asDictionary();
      if (entries == nullptr) {
        faults.push_back({groupName, name, "is not a dictionary"});
        continue;
      }
      for (const auto& [key, options] : *entries) {
        if (options.asDictionary() == nullptr) {
          faults.push_back({groupName, key, "has options that are not a dictionary"});
        } else {
          (*table)[key] = options;
        }
      }
    }
  }
  return faults;
}

bool IsGroupEnabled(const std::string& group, bool isInternalDevice, Preferences& preferences,
                    SystemLog& log) {
  if (group == kInternalTesting && !isInternalDevice) return false;
  bool found = false;
  const bool value = preferences.DGWPreferencesGetBoolValue(group, kTaskingDomain, found);
  if (!value && !isInternalDevice && found) {
    log.log("keyGroup %@ is disabled by tasking", group);
    return false;
  }
  return true;
}

std::optional<TLConfig> TLConfig::init(Platform& platform, bool* isUnreadable) {
  TLConfig config(platform.log);
  config._isInternalDevice = platform.queries.TLIsInternalDevice();

  const auto bytes = platform.environment.readFile(kWhitelistPath, kMaxPropertyListBytes);
  if (!bytes) {
    platform.log.error("Couldn't load whitelist");
    if (isUnreadable != nullptr) {
      *isUnreadable = platform.environment.stat(kWhitelistPath).has_value();
    }
    return std::nullopt;
  }
  config._configFileDigest = HexDigest(DigestKind::kMd5, *bytes);

  const auto parsed = ReadPropertyList(*bytes);
  const auto* value = std::get_if<PropertyValue>(&parsed);
  const Dictionary* root = value != nullptr ? value->asDictionary() : nullptr;
  if (root == nullptr) {
    platform.log.error("Couldn't parse the contents of the config file. Error: %@",
                       value != nullptr ? std::string("the root is not a dictionary")
                                        : std::get<PropertyListError>(parsed).description);
    return std::nullopt;
  }

  const auto enabled = [&](const std::string& group) {
    return IsGroupEnabled(group, config._isInternalDevice, platform.preferences, platform.log);
  };
  const auto faults = MergeWhitelist(*root, enabled,
                                     {config._scalarKeys, config._scalarPrefixes,
                                      config._distributionKeys, config._distributionPrefixes});
  for (const WhitelistFault& fault : faults) {
    if (fault.key.empty()) {
      platform.log.error("Skipping keyGroup %@: it %@", fault.group, fault.reason);
      continue;
    }
    platform.log.error("Skipping whitelist entry %@ of keyGroup %@: it %@", fault.key, fault.group,
                       fault.reason);
  }
  for (const Dictionary* table : {&config._scalarKeys, &config._scalarPrefixes,
                                  &config._distributionKeys, &config._distributionPrefixes}) {
    ReportUnknownOptions(*table, platform.log);
  }
  config._scalarPrefixLengths = LengthsLongestFirst(config._scalarPrefixes);
  config._distributionPrefixLengths = LengthsLongestFirst(config._distributionPrefixes);
  return config;
}

std::optional<KeyOptions> TLConfig::configOptionsForScalarKey(std::string_view key) const {
  return optionsForKey(key, KeyKind::kScalar);
}

std::optional<KeyOptions> TLConfig::configOptionsForDistributionKey(std::string_view key) const {
  return optionsForKey(key, KeyKind::kDistribution);
}

std::optional<KeyOptions> TLConfig::optionsForKey(std::string_view key, KeyKind kind) const {
  auto match = matchForKey(key, kind);
  if (!match || match->isExpired) return std::nullopt;
  if (match->kind == KeyMatch::Kind::kPrefix) {
    _log->debug("prefix match %@ for %@", match->entry, key);
  } else if (match->kind == KeyMatch::Kind::kInternalDevice) {
    _log->debug("passing @{} for %@ as device is Nuvex Internal", key);
  }
  return std::move(match->options);
}

std::optional<KeyMatch> TLConfig::matchForKey(std::string_view key, KeyKind kind) const {
  const bool isScalar = kind == KeyKind::kScalar;
  const Dictionary& keys = isScalar ? _scalarKeys : _distributionKeys;
  if (const PropertyValue* options = keys.find(key)) {
    const Dictionary& exact = *options->asDictionary();
    return KeyMatch{KeyMatch::Kind::kExact, std::string(key), exact, hasExpired(exact)};
  }
  const Dictionary& prefixes = isScalar ? _scalarPrefixes : _distributionPrefixes;
  for (const std::size_t length : isScalar ? _scalarPrefixLengths : _distributionPrefixLengths) {
    if (length > key.size()) continue;
    const std::string_view prefix = key.substr(0, length);
    const PropertyValue* options = prefixes.find(prefix);
    if (options == nullptr || hasExpired(*options->asDictionary())) continue;
    return KeyMatch{KeyMatch::Kind::kPrefix, std::string(prefix), *options->asDictionary()};
  }
  if (!_isInternalDevice) return std::nullopt;
  return KeyMatch{KeyMatch::Kind::kInternalDevice, "", KeyOptions()};
}

bool TLConfig::hasExpired(const KeyOptions& options) const {
  if (!_reportedDay) return false;
  const auto last = ExpiryOption(options);
  return last && *_reportedDay > *last;
}

}  // namespace quorlet
