// Any whitelist: what the check finds nothing wrong with works, a key has the same options each
// time, and every report of it is bounded by what was recorded.
#include "fakes/fake_platform.h"
#include "fuzz_support.h"
#include "report/config.h"
#include "report/report.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

void CheckOptions(const Dictionary& table, KeyKind kind) {
  for (const auto& [key, value] : table) {
    const Dictionary* options = value.asDictionary();
    Expect(options != nullptr, "a key without options", key);
    if (!KeyOptionFaults(*options, kind).empty()) continue;
    if (kind == KeyKind::kScalar) {
      for (const auto name : {kSigFig, kBucketInterval}) {
        Expect(options->contains(name) == RoundingOption(*options, name).has_value(),
               "an option without fault does not work", key);
      }
    } else {
      Expect(options->contains(kIntervals) == IntervalsOption(*options).has_value(),
             "intervals without fault do not work", key);
    }
  }
}

KeyTables Merge(const Dictionary& root) {
  KeyTables tables;
  const auto faults = MergeWhitelist(
      root, [](const std::string&) { return true; }, tables);
  for (const WhitelistFault& fault : faults) {
    Expect(root.contains(fault.group), "a fault of no group", fault.group);
  }
  CheckOptions(tables.scalarKeys, KeyKind::kScalar);
  CheckOptions(tables.scalarPrefixes, KeyKind::kScalar);
  CheckOptions(tables.distributionKeys, KeyKind::kDistribution);
  CheckOptions(tables.distributionPrefixes, KeyKind::kDistribution);
  return tables;
}

void CheckHistogram(const PropertyValue& value, std::size_t samples) {
  double sum = 0;
  for (const auto& [label, count] : *value.asDictionary()) {
    Expect(count.asNumber() != nullptr && count.asNumber()->toDouble() > 0, "an empty bucket",
           label);
    sum += count.asNumber()->toDouble();
  }
  Expect(sum <= static_cast<double>(samples), "a histogram of more values than there are");
}

void Report(FakePlatform& platform, const KeyTables& tables) {
  constexpr std::size_t kMostKeys = 64;
  const std::int32_t day = platform.counterStore.TLDaysSince1970() - 1;
  const std::vector<double> samples = {-1e300, -1, 0, 0.5, 3, 3, 1e18, 1e300};
  std::size_t count = 0;
  for (const auto* table : {&tables.scalarKeys, &tables.scalarPrefixes}) {
    for (const auto& [key, options] : *table) {
      if (++count <= kMostKeys) platform.counterStore.hasScalar(key, day, 0x123456789abcdef);
    }
  }
  for (const auto* table : {&tables.distributionKeys, &tables.distributionPrefixes}) {
    for (const auto& [key, options] : *table) {
      if (++count <= kMostKeys) platform.counterStore.hasDistribution(key, day, samples);
    }
  }
  TLReport report(platform.services);
  report.writeLogForYesterdayWithAppInfo(day, std::nullopt);
  Expect(platform.diagnostics.logs.size() <= 1, "more than one log");
  Expect(report.distributionsOutput().size() <= kMostKeys, "more keys than were recorded");
  for (const auto& [key, histogram] : report.histogramsOutput()) {
    Expect(report.distributionsOutput().contains(key), "a histogram without distribution", key);
    CheckHistogram(histogram, samples.size());
  }
}

}  // namespace
}  // namespace quorlet

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  const std::string_view text = AsText(data, size);
  FakePlatform platform;
  platform.environment.files[std::string(kWhitelistPath)] = text;
  const auto config = TLConfig::init(platform.services);
  const auto document = ReadPropertyList(text);
  const auto* value = std::get_if<PropertyValue>(&document);
  const Dictionary* root = value != nullptr ? value->asDictionary() : nullptr;
  Expect(config.has_value() == (root != nullptr), "a whitelist is read otherwise");
  if (root == nullptr) return 0;
  const KeyTables tables = Merge(*root);
  for (const auto& [key, options] : tables.scalarKeys) {
    // Whether a group is switched on decides; twice the same.
    const auto found = config->configOptionsForScalarKey(key);
    const auto again = config->configOptionsForScalarKey(key);
    Expect(found.has_value() == again.has_value() && (!found || found->size() == again->size()),
           "a key has other options the second time", key);
  }
  Report(platform, tables);
  return 0;
}
