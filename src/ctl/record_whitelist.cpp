#include "ctl/record_whitelist.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <set>
#include <string>
#include <variant>

#include "values/property_list.h"

namespace quorlet {

RecordWhitelist RecordWhitelist::Naming(bool every) {
  RecordWhitelist whitelist;
  whitelist.every_ = every;
  return whitelist;
}

RecordWhitelist RecordWhitelist::Load(const Root& root, Platform& platform) {
  struct stat status {};
  const std::string path = root.path(kWhitelistPath);
  if (::stat(path.c_str(), &status) != 0 && errno == ENOENT) return Naming(/*every=*/true);
  const auto bytes = platform.environment.readFile(kWhitelistPath, kMaxPropertyListBytes);
  const auto parsed = ReadPropertyList(bytes.value_or(""));
  const auto* value = std::get_if<PropertyValue>(&parsed);
  const Dictionary* groups = value != nullptr ? value->asDictionary() : nullptr;
  RecordWhitelist whitelist;
  if (groups == nullptr) {
    platform.log.error("The whitelist %@ cannot be used, so no key is recorded", path);
    return whitelist;
  }
  const bool isInternal = platform.queries.TLIsInternalDevice();
  const auto enabled = [&](const std::string& group) {
    return IsGroupEnabled(group, isInternal, platform.preferences, platform.log);
  };
  // What it skips is the report's to tell.
  static_cast<void>(MergeWhitelist(*groups, enabled, whitelist.tables_));
  std::set<std::size_t> lengths;
  for (const Dictionary* table :
       {&whitelist.tables_.scalarPrefixes, &whitelist.tables_.distributionPrefixes}) {
    for (const auto& [prefix, options] : *table) lengths.insert(prefix.size());
  }
  whitelist.prefixLengths_.assign(lengths.begin(), lengths.end());
  return whitelist;
}

RecordWhitelist::Match RecordWhitelist::match(std::string_view key) const {
  if (tables_.scalarKeys.find(key) != nullptr || tables_.distributionKeys.find(key) != nullptr) {
    return Match::kNamedExactly;
  }
  const bool isNamed =
      every_ || std::ranges::any_of(prefixLengths_, [this, key](std::size_t length) {
        if (length > key.size()) return false;
        const std::string_view prefix = key.substr(0, length);
        return tables_.scalarPrefixes.find(prefix) != nullptr ||
               tables_.distributionPrefixes.find(prefix) != nullptr;
      });
  return isNamed ? Match::kNamed : Match::kNone;
}

}  // namespace quorlet
