#include "platform/linux/counter_store.h"

#include <algorithm>
#include <cmath>
#include <functional>
#include <string>
#include <vector>

namespace quorlet {
namespace {

constexpr double kSecondsPerDay = 86400;
constexpr std::int32_t kDaysKept = 30;
// Whatever the clock says, days can be counted on from today.
constexpr double kFarthestDay = 1 << 30;

// Failures are the ledger's to log.
class LinuxCounterStore : public CounterStore {
 public:
  LinuxCounterStore(TallyLedger& ledger, Clock& clock) : ledger_(ledger), clock_(clock) {}

  std::int32_t TLDaysSince1970() override {
    const double day = std::floor(clock_.now().secondsSince1970 / kSecondsPerDay);
    return static_cast<std::int32_t>(std::clamp(day, -kFarthestDay, kFarthestDay));
  }

  Date dateForDaysSince1970(std::int32_t day) override { return {day * kSecondsPerDay}; }

  // Every write is committed before it returns, so only the old rows are left to do.
  void TLClientCheckpoint() override {
    static_cast<void>(ledger_.dropDaysBefore(TLDaysSince1970() - kDaysKept));
  }

  bool writeScalars(std::span<const ScalarChange> changes) override {
    const std::int32_t today = TLDaysSince1970();
    // In key order, which is the order of the rows, so that pages are changed one after the other;
    // changes of one key stay in their order.
    std::vector<const ScalarChange*> sorted;
    sorted.reserve(changes.size());
    for (const ScalarChange& change : changes) {
      if (ledger_.takesKey(change.key)) sorted.push_back(&change);
    }
    std::ranges::stable_sort(
        sorted, std::ranges::less(),
        [](const ScalarChange* change) -> const std::string& { return change->key; });
    return ledger_.inTransaction([&] {
      return std::ranges::all_of(sorted, [&](const ScalarChange* change) {
        return change->kind == ScalarChange::Kind::kSet
                   ? ledger_.setScalar(change->key, today, change->value)
                   : ledger_.addToScalar(change->key, today, change->value);
      });
    });
  }

  std::unique_ptr<TLHistory> initWithDefaultPath() override { return ledger_.openHistory(); }

 private:
  TallyLedger& ledger_;
  Clock& clock_;
};

}  // namespace

std::unique_ptr<CounterStore> MakeLinuxCounterStore(TallyLedger& ledger, Clock& clock) {
  return std::make_unique<LinuxCounterStore>(ledger, clock);
}

}  // namespace quorlet
