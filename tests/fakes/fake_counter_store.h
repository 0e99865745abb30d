// The counter store in memory: plain sorted state.
#ifndef QUORLET_TESTS_FAKES_FAKE_COUNTER_STORE_H_
#define QUORLET_TESTS_FAKES_FAKE_COUNTER_STORE_H_

#include <cmath>
#include <limits>
#include <map>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "platform/clock.h"
#include "platform/counter_store.h"

namespace quorlet {

class FakeCounterStore : public CounterStore {
 public:
  using RowKey = std::pair<std::string, std::int32_t>;  // key and day, in the order of enumeration
  using Samples = std::vector<DistributionSample>;

  explicit FakeCounterStore(Clock& clock) : clock_(clock) {}

  void hasScalar(std::string_view key, std::int32_t day, std::int64_t value) {
    scalars[{std::string(key), day}] = value;
  }
  // Appends `values`, recorded at midnight.
  void hasDistribution(std::string_view key, std::int32_t day, const std::vector<double>& values) {
    Samples& samples = distributions[{std::string(key), day}];
    for (const double value : values) samples.push_back({value, 0});
  }

  std::int32_t TLDaysSince1970() override {
    return static_cast<std::int32_t>(std::floor(clock_.now().secondsSince1970 / 86400));
  }
  Date dateForDaysSince1970(std::int32_t day) override { return {day * 86400.0}; }
  void TLClientCheckpoint() override {
    ++checkpoints;
    const auto isOld = [today = TLDaysSince1970()](const auto& row) {
      return row.first.second < today - 30;
    };
    std::erase_if(scalars, isOld);
    std::erase_if(distributions, isOld);
  }
  bool write(const StoreChanges& changes) override {
    if (isFull) return false;
    if (changes.dropCounters) {
      scalars.clear();
      distributions.clear();
    }
    for (const ScalarChange& change : changes.scalars) {
      std::int64_t& value = scalars[{change.key, change.day}];
      if (change.kind == ScalarChange::Kind::kSet) {
        value = change.value;
      } else if (__builtin_add_overflow(value, change.value, &value)) {
        value = change.value < 0 ? std::numeric_limits<std::int64_t>::min()
                                 : std::numeric_limits<std::int64_t>::max();
      }
    }
    for (const RecordedValues& recorded : changes.values) {
      Samples& samples = distributions[{recorded.key, recorded.day}];
      auto value = recorded.values.begin();
      for (auto [second, count] : recorded.runs) {
        while (count-- > 0) samples.push_back({*value++, second});
      }
    }
    for (const StoreNote& note : changes.notes) {
      notes.erase(note.name);
      if (note.value) notes.emplace(note.name, note.value->deepCopy());
    }
    return true;
  }
  bool readNote(std::string_view name, std::optional<Dictionary>& value) override {
    const auto found = notes.find(name);
    value = found != notes.end() ? std::optional(found->second.deepCopy()) : std::nullopt;
    return true;
  }
  bool takesKey(std::string_view) override { return true; }
  bool keysOfDay(std::int32_t day, const DayKeyHandler& handler) override {
    for (const auto& [row, value] : scalars) {
      if (row.second == day && !handler(row.first, std::nullopt)) return true;
    }
    for (const auto& [row, samples] : distributions) {
      if (row.second == day && !handler(row.first, samples.size())) return true;
    }
    return true;
  }
  bool isSound() override { return torn.empty(); }
  std::unique_ptr<TLHistory> initWithDefaultPath() override {
    ++historiesOpened;
    return isMissing ? nullptr : std::make_unique<History>(*this);
  }

  std::map<RowKey, std::int64_t> scalars;
  std::map<RowKey, Samples> distributions;
  std::map<std::string, Dictionary, std::less<>> notes;
  std::set<std::string, std::less<>> torn;  // distributions that can be read only in part
  bool isMissing = false;                   // no reader can be opened
  bool isUnreadable = false;                // readers have failed
  bool isFull = false;                      // nothing can be written
  int checkpoints = 0;
  int historiesOpened = 0;

 private:
  class Enumerator : public TLHistoryDistributionEnumerator {
   public:
    Enumerator(const Samples& samples, bool isTorn) : samples_(samples), isTorn_(isTorn) {}
    bool failed() const override { return isTorn_; }

   protected:
    std::span<const DistributionSample> nextBlock() override { return std::exchange(samples_, {}); }

   private:
    std::span<const DistributionSample> samples_;
    bool isTorn_;
  };

  class History : public TLHistory {
   public:
    explicit History(FakeCounterStore& store) : store_(store) {}
    bool failed() const override { return store_.isUnreadable; }
    void scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
        std::string_view keyPrefix, std::int32_t minDay, std::int32_t maxDay,
        const ScalarHandler& rowHandler) override {
      bool stop = false;
      for (const auto& [row, value] : store_.scalars) {
        if (!matches(row, keyPrefix, minDay, maxDay)) continue;
        rowHandler(row.first, row.second, value, stop);
        if (stop) return;
      }
    }
    void distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
        std::string_view keyPrefix, std::int32_t minDay, std::int32_t maxDay,
        const DistributionHandler& rowHandler) override {
      bool stop = false;
      for (const auto& [row, samples] : store_.distributions) {
        if (!matches(row, keyPrefix, minDay, maxDay)) continue;
        Enumerator values(samples, store_.torn.contains(row.first));
        rowHandler(row.first, row.second, values, stop);
        if (stop) return;
      }
    }

   private:
    static bool matches(const RowKey& row, std::string_view prefix, std::int32_t minDay,
                        std::int32_t maxDay) {
      return row.first.starts_with(prefix) && minDay < row.second && row.second <= maxDay;
    }
    FakeCounterStore& store_;
  };

  Clock& clock_;
};

}  // namespace quorlet

#endif  // QUORLET_TESTS_FAKES_FAKE_COUNTER_STORE_H_
