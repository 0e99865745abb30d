#include "platform/linux/counters/counter_store.h"

#include <algorithm>
#include <cmath>
#include <functional>
#include <string>
#include <tuple>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/counters/tally_ledger.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr double kSecondsPerDay = 86400;
constexpr std::int32_t kDaysKept = 30;
// Whatever the clock says, days can be counted on from today.
constexpr double kFarthestDay = 1 << 30;

using NoteTexts = std::vector<std::pair<std::string, std::optional<std::string>>>;

// In the order of the rows, so that pages are changed one after the other; changes of one key stay
// in their order.
template <typename Change>
std::vector<const Change*> InOrder(const std::vector<Change>& changes, CounterStore& store) {
  std::vector<const Change*> sorted;
  sorted.reserve(changes.size());
  for (const Change& change : changes) {
    if (store.takesKey(change.key)) sorted.push_back(&change);
  }
  std::ranges::stable_sort(sorted, std::ranges::less(), [](const Change* change) {
    return std::tuple<std::int32_t, std::string_view>(change->day, change->key);
  });
  return sorted;
}

int Apply(const ScalarChange& change, TallyDatabase& database) {
  return change.kind == ScalarChange::Kind::kSet
             ? database.setScalar(change.key, change.day, change.value)
             : database.addToScalar(change.key, change.day, change.value);
}

int Apply(const RecordedValues& recorded, TallyDatabase& database) {
  std::vector<DistributionSample> samples;
  samples.reserve(recorded.values.size());
  auto value = recorded.values.begin();
  for (const RecordedValues::Run& run : recorded.runs) {
    for (std::uint32_t i = 0; i < run.count; ++i) samples.push_back({*value++, run.second});
  }
  return samples.empty() ? SQLITE_OK : database.recordValues(recorded.key, recorded.day, samples);
}

// Failures are the ledger's to log.
class LinuxCounterStore : public CounterStore {
 public:
  LinuxCounterStore(const Root& root, Access access, Clock& clock, EnvironmentQueries& queries,
                    Preferences& preferences, SystemLog& log, const TallyOptions& options)
      : ledger_(root, access, queries, preferences, log, options), clock_(clock), log_(log) {}

  std::int32_t TLDaysSince1970() override {
    const double day = std::floor(clock_.now().secondsSince1970 / kSecondsPerDay);
    return static_cast<std::int32_t>(std::clamp(day, -kFarthestDay, kFarthestDay));
  }

  Date dateForDaysSince1970(std::int32_t day) override { return {day * kSecondsPerDay}; }

  // Every write is durable before it returns, so only the old rows are left to do.
  void TLClientCheckpoint() override {
    static_cast<void>(ledger_.checkpoint(TLDaysSince1970() - kDaysKept));
  }

  bool takesKey(std::string_view key) override {
    if (key.size() <= kLongestTallyKey) return true;
    log_.error("A counter's key of %llu bytes is too long", key.size());
    return false;
  }

  bool write(const StoreChanges& changes) override {
    const auto scalars = InOrder(changes.scalars, *this);
    const auto values = InOrder(changes.values, *this);
    NoteTexts notes;
    for (const StoreNote& note : changes.notes) {
      if (!addNote(note, notes)) return false;
    }
    return ledger_.write([&](TallyDatabase& database) {
      int code = changes.dropCounters ? database.dropCounters() : SQLITE_OK;
      const auto applyAll = [&](const auto& sorted) {
        for (const auto* change : sorted) {
          if (code == SQLITE_OK) code = Apply(*change, database);
        }
      };
      applyAll(scalars);
      applyAll(values);
      for (const auto& [name, text] : notes) {
        if (code == SQLITE_OK) code = database.setNote(name, text);
      }
      return code;
    });
  }

  bool readNote(std::string_view name, std::optional<Dictionary>& value) override {
    value.reset();
    std::optional<std::string> text;
    if (!ledger_.readNote(name, text)) return false;
    if (!text) return true;
    const auto document = ReadPropertyList(*text);
    const auto* read = std::get_if<PropertyValue>(&document);
    const Dictionary* dictionary = read != nullptr ? read->asDictionary() : nullptr;
    if (dictionary != nullptr) {
      value = *dictionary;
    } else {
      log_.error("The counter store's note %@ is damaged, going on without", name);
    }
    return true;
  }

  bool keysOfDay(std::int32_t day, const DayKeyHandler& handler) override {
    return ledger_.keysOfDay(day, handler);
  }
  bool isSound() override { return ledger_.isSound(); }

  std::unique_ptr<TLHistory> initWithDefaultPath() override { return ledger_.openHistory(); }

 private:
  bool addNote(const StoreNote& note, NoteTexts& notes) {
    if (!note.value) {
      notes.emplace_back(note.name, std::nullopt);
      return true;
    }
    auto text = WriteXmlPropertyList(*note.value);
    if (const auto* error = std::get_if<PropertyListError>(&text)) {
      log_.error("The counter store cannot take the note %@: %@", note.name, error->description);
      return false;
    }
    notes.emplace_back(note.name, std::get<std::string>(std::move(text)));
    return true;
  }

  TallyLedger ledger_;
  Clock& clock_;
  SystemLog& log_;
};

}  // namespace

std::unique_ptr<CounterStore> MakeLinuxCounterStore(const Root& root, Access access, Clock& clock,
                                                    EnvironmentQueries& queries,
                                                    Preferences& preferences, SystemLog& log,
                                                    const TallyOptions& options) {
  return std::make_unique<LinuxCounterStore>(root, access, clock, queries, preferences, log,
                                             options);
}

}  // namespace quorlet
