// The baseline is the preference "netUsageBaseline": a dictionary with a row for each name, an
// array of the since-time and the four counts in the order of kFields, as they were received.
// The store's note has the same dictionary as "baseline", and as "replaced" the digest of the one
// before it.
#include "collectors/network_usage.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <limits>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "collectors/run_step.h"
#include "platform/names.h"
#include "values/digest.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr char kBaseline[] = "netUsageBaseline";
constexpr char kNote[] = "network-usage-baseline";
constexpr std::chrono::seconds kReplyLimit{10};
constexpr double kSecondsPerDay = 86400;

constexpr std::array<std::string_view, 4> kFields{"wifiInBytes", "wifiOutBytes", "wwanInBytes",
                                                  "wwanOutBytes"};
constexpr std::string_view kFieldSuffix = "Bytes";

// No process has a longer name.
constexpr std::size_t kLongestName = 1024;
// A baseline that is larger than a document may be could not be stored, and the next run would add
// everything again. The rest is left to the domain's other keys.
constexpr std::size_t kBaselineBytes = kMaxPropertyListBytes - std::size_t{1024} * 1024;

struct UsageRecord {
  std::string_view name;
  std::string row;  // the name as it reads back from the stored baseline
  std::string_view prefix;
  Date since;  // as it reads back from the stored baseline
  std::array<Number, kFields.size()> counts;
};

const Number* IntegerNumberEntry(const Dictionary& dictionary, std::string_view key) {
  const PropertyValue* value = dictionary.find(key);
  const Number* number = value != nullptr ? value->asNumber() : nullptr;
  return number != nullptr && !number->isReal() ? number : nullptr;
}

// Nothing for a record that lacks something; the names are the dictionary's.
std::optional<UsageRecord> ReadRecord(const Dictionary& record) {
  const bool isBundle = record.contains("bundleName");
  const std::string* name = StringEntry(record, isBundle ? "bundleName" : "procName");
  const PropertyValue* since = record.find(UsageSinceTimeKey);
  const Number* counts[kFields.size()];
  std::ranges::transform(kFields, counts,
                         [&](std::string_view field) { return IntegerNumberEntry(record, field); });
  const bool isComplete = name != nullptr && since != nullptr && since->asDate() != nullptr &&
                          std::ranges::find(counts, nullptr) == std::end(counts);
  if (!isComplete) return std::nullopt;
  return UsageRecord{*name,
                     name->size() > kLongestName ? "" : AsWritten(*name),
                     isBundle ? "" : "nuvex.",
                     AsWritten(*since->asDate()),
                     {*counts[0], *counts[1], *counts[2], *counts[3]}};
}

std::int64_t DayNumberOfDate(Date date) {
  return static_cast<std::int64_t>(std::floor(date.secondsSince1970 / kSecondsPerDay));
}

std::int64_t SaturatingDifference(std::int64_t value, std::int64_t subtracted) {
  std::int64_t difference = 0;
  if (!__builtin_sub_overflow(value, subtracted, &difference)) return difference;
  return value < 0 ? std::numeric_limits<std::int64_t>::min()
                   : std::numeric_limits<std::int64_t>::max();
}

// The most that a row takes in the stored document.
std::size_t RowBytes(std::string_view name) {
  constexpr std::size_t kRowWithoutName = 320;
  const auto escaped =
      std::ranges::count_if(name, [](char c) { return c == '&' || c == '<' || c == '>'; });
  return kRowWithoutName + name.size() + 4 * static_cast<std::size_t>(escaped);
}

// Compares the records of one reply with the baseline.
class UsageComparison {
 public:
  UsageComparison(Dictionary baseline, std::int32_t yesterday)
      : old_(std::move(baseline)), yesterday_(yesterday) {}

  // Rows and records are gone through together, in the order of the rows' names.
  void add(std::vector<UsageRecord> records) {
    std::ranges::stable_sort(records, std::ranges::less(), &UsageRecord::row);
    auto previous = old_.begin();
    for (const UsageRecord& record : records) {
      if (!reserveRow(record)) {
        ++leftOut_;
        continue;
      }
      while (previous != old_.end() && previous->first < record.row) ++previous;
      const bool isKnown = previous != old_.end() && previous->first == record.row;
      add(record, isKnown ? previous->second.asArray() : nullptr);
    }
  }

  UsageGrowth take() { return {std::move(changes_), new_, std::nullopt}; }
  // How many records were refused for their size.
  std::uint64_t leftOut() const { return leftOut_; }

 private:
  bool reserveRow(const UsageRecord& record) {
    if (record.name.size() > kLongestName) return false;
    const std::size_t size = RowBytes(record.row);
    if (size > room_) return false;
    room_ -= size;
    return true;
  }

  void add(const UsageRecord& record, const Array* previous) {
    const Date* start =
        previous != nullptr && !previous->empty() ? (*previous)[0].asDate() : nullptr;
    if (start != nullptr && AsWritten(*start) == record.since) {
      addGrowth(record, *previous);
    } else {
      addFirstCounts(record);
    }
    const auto& counts = record.counts;
    new_[record.row] = Array{record.since, counts[0], counts[1], counts[2], counts[3]};
  }

  void addGrowth(const UsageRecord& record, const Array& previous) {
    for (std::size_t i = 0; i < kFields.size(); ++i) {
      const Number* stored = i + 1 < previous.size() ? previous[i + 1].asNumber() : nullptr;
      const std::int64_t delta = SaturatingDifference(record.counts[i].toInt64(),
                                                      stored != nullptr ? stored->toInt64() : 0);
      if (delta > 0) addDataUsageScalar(kFields[i], record, delta);
      if (delta < 0) addToKey("baddata.", record, 1);
    }
  }

  void addFirstCounts(const UsageRecord& record) {
    if (DayNumberOfDate(record.since) < yesterday_) {
      addToKey("olddata.", record, 1);
      return;
    }
    for (std::size_t i = 0; i < kFields.size(); ++i) {
      addDataUsageScalar(kFields[i], record, record.counts[i].toInt64());
    }
  }

  // What is less than 1 KB is not recorded.
  void addDataUsageScalar(std::string_view field, const UsageRecord& record, std::int64_t bytes) {
    const std::int64_t kilobytes = bytes / 1024;
    if (kilobytes == 0) return;
    field.remove_suffix(kFieldSuffix.size());
    addToKey(std::string(field) + "KB.", record, kilobytes);
  }

  void addToKey(std::string_view kind, const UsageRecord& record, std::int64_t value) {
    std::string key("datausage.");
    key.append(kind).append(record.prefix).append(record.name);
    changes_.push_back({ScalarChange::Kind::kAdd, std::move(key), value, yesterday_ + 1});
  }

  const Dictionary old_;
  const std::int32_t yesterday_;
  std::vector<ScalarChange> changes_;
  Dictionary new_;
  std::size_t room_ = kBaselineBytes;
  std::uint64_t leftOut_ = 0;
};

// Tells one stored baseline from another, also after it has been in a file.
std::string DigestOf(const Dictionary* baseline) {
  if (baseline == nullptr) return "none";
  const auto text = WriteXmlPropertyList(*baseline);
  const auto* bytes = std::get_if<std::string>(&text);
  return bytes != nullptr ? HexDigest(DigestKind::kSha256, *bytes) : "unknown";
}

UsageComparison Compare(const Array& records, const Dictionary& baseline, Platform& platform) {
  UsageComparison comparison(baseline, platform.counterStore.TLDaysSince1970() - 1);
  std::vector<UsageRecord> complete;
  for (const PropertyValue& value : records) {
    const Dictionary* dictionary = value.asDictionary();
    if (dictionary == nullptr) continue;
    if (auto record = ReadRecord(*dictionary)) complete.push_back(*std::move(record));
  }
  comparison.add(std::move(complete));
  if (comparison.leftOut() != 0) {
    platform.log.error(
        "Left out %llu network usage records whose names are too long or that are too many",
        comparison.leftOut());
  }
  return comparison;
}

// Nothing when what the counts are to be compared with cannot be read: they are there next time.
std::optional<UsageGrowth> CompareWithBaseline(const Array& records, Platform& platform) {
  const auto stored = platform.preferences.DGWPreferencesGetValue(kBaseline, kCollectorsDomain);
  std::optional<Dictionary> noted;
  if (!platform.preferences.isReadable(kCollectorsDomain) ||
      !platform.counterStore.readNote(kNote, noted)) {
    platform.log.error("Network usage is not counted now: its baseline cannot be read");
    return std::nullopt;
  }
  const Dictionary* baseline = stored ? stored->asDictionary() : nullptr;
  const std::string digest = DigestOf(baseline);
  const std::string* replaced = noted ? StringEntry(*noted, "replaced") : nullptr;
  const Dictionary* notedBaseline = noted ? DictionaryEntry(*noted, "baseline") : nullptr;
  const bool isLeftBehind = replaced != nullptr && *replaced == digest && notedBaseline != nullptr;
  const Dictionary* old = isLeftBehind ? notedBaseline : baseline;
  UsageGrowth growth = Compare(records, old != nullptr ? *old : Dictionary(), platform).take();
  if (DigestOf(&growth.baseline) != digest) {
    growth.note = StoreNote{kNote, Dictionary{{"replaced", digest}, {"baseline", growth.baseline}}};
  }
  return growth;
}

// The baseline only after the counters.
void WriteGrowth(UsageGrowth growth, Platform& platform) {
  StoreChanges changes;
  changes.scalars = std::move(growth.changes);
  if (growth.note) changes.notes.push_back(*std::move(growth.note));
  if (changes.empty() || platform.counterStore.write(changes)) {
    storeBaseline(growth.baseline, platform.preferences);
  }
}

// Asks for the counts of all processes. `process` turns the records into what is waited for; `late`
// gets it when nobody waits any more. Both run on the service's thread.
template <typename Result>
std::optional<Result> AskForUsage(Platform& platform,
                                  std::function<std::optional<Result>(const Array&)> process,
                                  std::function<void(Result)> late) {
  // Shared with the reply.
  struct Waiting {
    std::mutex mutex;
    bool hasGivenUp = false;
    std::optional<Result> result;
  };
  const auto waiting = std::make_shared<Waiting>();
  const std::shared_ptr<Semaphore> replied = platform.semaphores.create();
  platform.networkUsage.QueryProcessDataUsage(
      {}, UsageNameKind::kProcessName,
      [replied, waiting, process, late, &log = platform.log](const Array* records) {
        RunStep(log, "network usage reply", [&] {
          if (records == nullptr) return;
          std::optional<Result> result = process(*records);
          if (!result) return;
          // Processing many records takes its time: the pass must not wait for the lock.
          std::unique_lock hold(waiting->mutex);
          if (!waiting->hasGivenUp) {
            waiting->result = std::move(result);
            return;
          }
          hold.unlock();
          late(*std::move(result));
        });
        replied->signal();
      });
  const bool isInTime = replied->wait(kReplyLimit);
  const std::lock_guard hold(waiting->mutex);
  if (!isInTime && !waiting->result) {
    platform.log.log("Vigil timed out, no datausage available");
  }
  waiting->hasGivenUp = true;
  return std::move(waiting->result);
}

}  // namespace

bool storeBaseline(const Dictionary& baseline, Preferences& preferences) {
  preferences.DGWPreferencesSetValue(kBaseline, baseline, kCollectorsDomain);
  return preferences.DGWPreferencesSynchronize(kCollectorsDomain);
}

StoreNote forgottenBaseline() { return {kNote, std::nullopt}; }

void processDataUsageReply(const Array& records, Platform& platform) {
  if (auto growth = CompareWithBaseline(records, platform)) {
    WriteGrowth(*std::move(growth), platform);
  }
}

std::optional<UsageGrowth> collectDataUsage(Platform& platform) {
  return AskForUsage<UsageGrowth>(
      platform,
      [platform](const Array& records) mutable { return CompareWithBaseline(records, platform); },
      [platform](UsageGrowth growth) mutable { WriteGrowth(std::move(growth), platform); });
}

std::optional<Dictionary> askForBaseline(Platform& platform) {
  return AskForUsage<Dictionary>(
      platform,
      [platform](const Array& records) mutable {
        return std::optional(Compare(records, Dictionary(), platform).take().baseline);
      },
      [](const Dictionary&) {});
}

}  // namespace quorlet
