// Any usage records beside any baseline: what is added is bounded, and the same records once more
// add nothing.
#include <algorithm>
#include <set>

#include "collectors/network_usage.h"
#include "fakes/fake_platform.h"
#include "fuzz_support.h"
#include "platform/linux/network/network_usage.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr char kDomain[] = "nuvex.diagwell.quorlet";
constexpr char kBaseline[] = "netUsageBaseline";
constexpr std::size_t kMostKeysOfARecord = 8;

// Whether each record has a row of its own in the baseline.
bool HaveDistinctNames(const Array& records) {
  std::set<std::string> names;
  return std::ranges::all_of(records, [&](const PropertyValue& record) {
    const Dictionary* entries = record.asDictionary();
    if (entries == nullptr) return true;
    const std::string* name = StringEntry(*entries, "bundleName");
    if (name == nullptr) name = StringEntry(*entries, "procName");
    return name == nullptr || names.insert(AsWritten(*name)).second;
  });
}

void Compare(const Array& records, const PropertyValue* baseline) {
  FakePlatform platform;
  if (baseline != nullptr) {
    platform.preferences.DGWPreferencesSetValue(kBaseline, *baseline, kDomain);
  }
  const auto process = [&] { processDataUsageReply(records, platform.services); };
  process();
  const auto scalars = platform.counterStore.scalars;
  Expect(scalars.size() <= records.size() * kMostKeysOfARecord, "too many counters");
  for (const auto& [row, value] : scalars) {
    Expect(row.first.starts_with("datausage."), "another key", row.first);
  }
  const auto stored = platform.preferences.DGWPreferencesGetValue(kBaseline, kDomain);
  Expect(stored && stored->asDictionary() != nullptr, "no baseline is stored");
  Expect(stored->asDictionary()->size() <= records.size(), "too many rows");
  const bool isWhole = platform.log.errors().empty() && HaveDistinctNames(records);
  process();
  Expect(!isWhole || platform.counterStore.scalars == scalars, "the same is counted again");
}

// The service that reads the document; its replies may be due in a month.
void Query(std::string_view document) {
  static FuzzFiles files;
  FakePlatform platform;
  files.set("/var/db/vigil/usage.plist", document);
  std::atomic<int> replies = 0;
  {
    const auto service = MakeLinuxNetworkUsage(files.device().root(), platform.log);
    service->QueryProcessDataUsage({"p"}, UsageNameKind::kProcessName,
                                   [&replies](const Array*) { ++replies; });
  }
  Expect(replies <= 1 && platform.log.lines.size() <= 2, "too many replies or lines");
}

}  // namespace
}  // namespace quorlet

// {Records, Delay} as in the service's file, and Baseline.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  const std::string_view text = AsText(data, size);
  const auto document = ReadPropertyList(text);
  if (const auto* value = std::get_if<PropertyValue>(&document)) {
    const Dictionary* entries = value->asDictionary();
    const Array* records = entries != nullptr ? ArrayEntry(*entries, "Records") : value->asArray();
    if (records != nullptr) {
      Compare(*records, entries != nullptr ? entries->find("Baseline") : nullptr);
    }
  }
  Query(text);
  return 0;
}
