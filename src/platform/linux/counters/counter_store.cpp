#include "platform/linux/counters/counter_store.h"

#include <algorithm>
#include <cmath>
#include <functional>
#include <string>
#include <tuple>
#include <utility>
#include <variant>
#include <vector>

#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr double kSecondsPerDay = 86400;
constexpr std::int32_t kDaysKept = 30;
// Whatever the clock says, days can be counted on from today.
constexpr double kFarthestDay = 1 << 30;

// Failures are the ledger's to log.
class LinuxCounterStore : public CounterStore {
 public:
  LinuxCounterStore(TallyLedger& ledger, Clock& clock, SystemLog& log)
      : ledger_(ledger), clock_(clock), log_(log) {}

  std::int32_t TLDaysSince1970() override {
    const double day = std::floor(clock_.now().secondsSince1970 / kSecondsPerDay);
    return static_cast<std::int32_t>(std::clamp(day, -kFarthestDay, kFarthestDay));
  }

  Date dateForDaysSince1970(std::int32_t day) override { return {day * kSecondsPerDay}; }

  // Every write is durable before it returns, so only the old rows are left to do.
  void TLClientCheckpoint() override {
    static_cast<void>(ledger_.checkpoint(TLDaysSince1970() - kDaysKept));
  }

  bool write(const StoreChanges& changes) override {
    // In the order of the rows, so that pages are changed one after the other; changes of one key
    // stay in their order.
    std::vector<const ScalarChange*> sorted;
    sorted.reserve(changes.scalars.size());
    for (const ScalarChange& change : changes.scalars) {
      if (ledger_.takesKey(change.key)) sorted.push_back(&change);
    }
    std::ranges::stable_sort(sorted, std::ranges::less(), [](const ScalarChange* change) {
      return std::tuple<std::int32_t, std::string_view>(change->day, change->key);
    });
    std::vector<std::pair<std::string, std::optional<std::string>>> notes;
    for (const StoreNote& note : changes.notes) {
      if (!addNote(note, notes)) return false;
    }
    return ledger_.inTransaction([&] {
      return (!changes.dropCounters || ledger_.dropCounters()) &&
             std::ranges::all_of(sorted,
                                 [this](const ScalarChange* change) { return apply(*change); }) &&
             std::ranges::all_of(notes, [this](const auto& note) {
               return ledger_.setNote(note.first, note.second);
             });
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

  std::unique_ptr<TLHistory> initWithDefaultPath() override { return ledger_.openHistory(); }

 private:
  bool apply(const ScalarChange& change) {
    return change.kind == ScalarChange::Kind::kSet
               ? ledger_.setScalar(change.key, change.day, change.value)
               : ledger_.addToScalar(change.key, change.day, change.value);
  }

  bool addNote(const StoreNote& note,
               std::vector<std::pair<std::string, std::optional<std::string>>>& notes) {
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

  TallyLedger& ledger_;
  Clock& clock_;
  SystemLog& log_;
};

}  // namespace

std::unique_ptr<CounterStore> MakeLinuxCounterStore(TallyLedger& ledger, Clock& clock,
                                                    SystemLog& log) {
  return std::make_unique<LinuxCounterStore>(ledger, clock, log);
}

}  // namespace quorlet
