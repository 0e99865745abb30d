// The aggregate-counter store: one value for each scalar key and day, and for each distribution key
// and day the sequence of values recorded.
//
// Day numbers count days since 1970-01-01 UTC. Keys are byte strings.
#ifndef QUORLET_PLATFORM_COUNTER_STORE_H_
#define QUORLET_PLATFORM_COUNTER_STORE_H_

#include <cstdint>
#include <functional>
#include <iterator>
#include <memory>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "drvreport/property_value.h"

namespace quorlet {

// One recorded value of a distribution.
struct DistributionSample {
  double value = 0;
  std::int32_t secondsInDay = 0;
  bool operator==(const DistributionSample&) const = default;
};

// Walks the values of one distribution row in the order in which they were recorded. Valid during
// the row handler's call only.
class TLHistoryDistributionEnumerator {
 public:
  virtual ~TLHistoryDistributionEnumerator() = default;

  // Writes the next value and the second of the day at which it was recorded, or returns false
  // when there are no more, or no more that could be read.
  bool getNextValueSecondsInDayOffset(double& value, std::int32_t& secondsInDay) {
    if (position_ == block_.size()) {
      block_ = nextBlock();
      position_ = 0;
      if (block_.empty()) return false;
    }
    value = block_[position_].value;
    secondsInDay = block_[position_].secondsInDay;
    ++position_;
    return true;
  }
  // Whether the values ended because the rest could not be read.
  virtual bool failed() const { return false; }

 protected:
  // The next samples, empty at the end; the enumerator owns them until the next call.
  virtual std::span<const DistributionSample> nextBlock() = 0;

 private:
  std::span<const DistributionSample> block_;
  std::size_t position_ = 0;
};

// The recorded past. Both enumerations call `rowHandler` for each row whose key starts with
// `keyPrefix` (bytewise) and whose day d satisfies minDay < d <= maxDay, ordered by key (bytewise),
// then day, before they return; the handler sets `stop` to end the enumeration. A store that turns
// out to be damaged ends the enumeration early.
class TLHistory {
 public:
  using ScalarHandler =
      std::function<void(std::string_view key, std::int32_t day, std::int64_t value, bool& stop)>;
  using DistributionHandler = std::function<void(
      std::string_view key, std::int32_t day, TLHistoryDistributionEnumerator& values, bool& stop)>;

  virtual ~TLHistory() = default;

  virtual void scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      std::string_view keyPrefix, std::int32_t minDay, std::int32_t maxDay,
      const ScalarHandler& rowHandler) = 0;

  virtual void distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      std::string_view keyPrefix, std::int32_t minDay, std::int32_t maxDay,
      const DistributionHandler& rowHandler) = 0;

  // Whether rows are missing because they could not be read.
  virtual bool failed() const = 0;
};

// One change of a day's value of a scalar key.
struct ScalarChange {
  enum class Kind { kSet, kAdd };
  Kind kind;
  std::string key;
  std::int64_t value;
  std::int32_t day;  // the day on which the value was measured
};

// Values that are appended to those of one distribution key and day, in this order.
struct RecordedValues {
  // So many of them in a row have this second of the day.
  struct Run {
    std::int32_t second;
    std::uint32_t count;
  };
  std::string key;
  std::int32_t day = 0;
  std::vector<double> values;
  std::vector<Run> runs;

  void add(double value, std::int32_t second) {
    values.push_back(value);
    if (runs.empty() || runs.back().second != second || runs.back().count == UINT32_MAX) {
      runs.push_back({second, 0});
    }
    ++runs.back().count;
  }
};

// What the program itself has to remember in step with the counters. No value: it is forgotten.
struct StoreNote {
  std::string name;
  std::optional<Dictionary> value;
};

// Changes that are made together, in this order.
struct StoreChanges {
  bool dropCounters = false;  // every scalar and distribution of every day
  std::vector<ScalarChange> scalars;
  std::vector<RecordedValues> values;
  std::vector<StoreNote> notes;

  bool empty() const { return !dropCounters && scalars.empty() && values.empty() && notes.empty(); }
};

// Given a key of a day, and how many values it has; nothing for a scalar's. False: no more keys.
using DayKeyHandler =
    std::function<bool(std::string_view key, std::optional<std::uint64_t> values)>;

class CounterStore {
 public:
  virtual ~CounterStore() = default;

  // Today's day number.
  virtual std::int32_t TLDaysSince1970() = 0;

  // The instant at which `day` starts.
  virtual Date dateForDaysSince1970(std::int32_t day) = 0;

  // Makes everything recorded so far durable, looks for damage and drops rows older than 30 days.
  virtual void TLClientCheckpoint() = 0;

  // Makes all changes in one short transaction, durable when it returns. A failure leaves one error
  // line, and none of them is made: false. A change whose key the store cannot take is left out,
  // with an error line of its own.
  [[nodiscard]] virtual bool write(const StoreChanges& changes) = 0;

  // Whether the key is short enough for the store (64 KiB); one error line when it is not.
  [[nodiscard]] virtual bool takesKey(std::string_view key) = 0;

  // Reads the note of that name, nothing when there is none. False, after an error line, when that
  // cannot be known.
  [[nodiscard]] virtual bool readNote(std::string_view name, std::optional<Dictionary>& value) = 0;

  // Names the keys of a day until `handler` answers false. False, after an error line, when they
  // cannot be read.
  [[nodiscard]] virtual bool keysOfDay(std::int32_t day, const DayKeyHandler& handler) = 0;

  // Looks for damage, in every value too, and changes nothing. False, after an error line, when
  // there is some or when it cannot be known; true where there is no store.
  [[nodiscard]] virtual bool isSound() = 0;

  // Sets, or adds to (saturating), today's value of one key.
  void TLClientSetValueForScalarKey(std::string_view key, std::int64_t value) {
    change(ScalarChange::Kind::kSet, key, value);
  }
  void TLClientAddValueForScalarKey(std::string_view key, std::int64_t value) {
    change(ScalarChange::Kind::kAdd, key, value);
  }

  // A reader on the store's default location, or nullptr when there is no store. One that cannot be
  // opened gives a reader that has failed, after an error line.
  virtual std::unique_ptr<TLHistory> initWithDefaultPath() = 0;

  // The days d with low < d <= high that have counters; nothing when not all could be read.
  std::optional<std::set<std::int32_t>> daysWithCounters(std::int32_t low, std::int32_t high) {
    std::set<std::int32_t> days;
    const auto history = initWithDefaultPath();
    if (history == nullptr) return days;
    history->scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
        "", low, high,
        [&](std::string_view, std::int32_t day, std::int64_t, bool&) { days.insert(day); });
    history->distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
        "", low, high,
        [&](std::string_view, std::int32_t day, TLHistoryDistributionEnumerator&, bool&) {
          days.insert(day);
        });
    return history->failed() ? std::nullopt : std::optional(days);
  }

 private:
  void change(ScalarChange::Kind kind, std::string_view key, std::int64_t value) {
    StoreChanges changes;
    changes.scalars.push_back({kind, std::string(key), value, TLDaysSince1970()});
    static_cast<void>(write(changes));
  }
};

// Collects changes and hands them to the store together, so that writers with many values hold its
// lock once and briefly. For one thread.
class CounterBatch {
 public:
  explicit CounterBatch(CounterStore& store) : store_(store) {}
  CounterBatch(const CounterBatch&) = delete;
  CounterBatch& operator=(const CounterBatch&) = delete;
  // What has not been committed is dropped.
  ~CounterBatch() = default;

  // A value that was measured today.
  void TLClientSetValueForScalarKey(std::string_view key, std::int64_t value) {
    changes_.scalars.push_back(
        {ScalarChange::Kind::kSet, std::string(key), value, store_.TLDaysSince1970()});
  }
  void add(std::vector<ScalarChange> changes) {
    changes_.scalars.insert(changes_.scalars.end(), std::make_move_iterator(changes.begin()),
                            std::make_move_iterator(changes.end()));
  }
  void add(StoreNote note) { changes_.notes.push_back(std::move(note)); }
  // Writes what was collected; the batch is empty afterwards. False when none of it was written.
  bool commit() {
    const StoreChanges changes = std::exchange(changes_, {});
    return changes.empty() || store_.write(changes);
  }

 private:
  CounterStore& store_;
  StoreChanges changes_;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_COUNTER_STORE_H_
