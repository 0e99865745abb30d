// What was taken in on the recording socket and is not written yet.
#ifndef QUORLET_CTL_RECORD_BOOK_H_
#define QUORLET_CTL_RECORD_BOOK_H_

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "ctl/record_refusals.h"
#include "ctl/record_whitelist.h"
#include "ctl/statsd_line.h"
#include "ctl/wide_integer.h"
#include "platform/counter_store.h"

namespace quorlet {

// How much may be recorded.
struct RecordLimits {
  std::size_t keys = 10'000;            // in the store's day, but for those that are named exactly
  std::size_t keysOfUser = 2'500;       // of them
  std::uint64_t values = 1'000'000;     // of one key and day
  std::size_t waitingValues = 500'000;  // the book is full with these
};

// When a datagram was taken in.
struct RecordTime {
  std::int32_t day = 0;
  std::int32_t second = 0;  // of the day
};

// A note of the store: what a later listener has to know. {"day", "owners": {uid: keys}}
inline constexpr char kKeyOwnersNote[] = "RecordedKeyOwners";

// Sums up lines for the next transaction and keeps within the limits. For one thread.
class RecordBook {
 public:
  // `self` is the user of this service.
  RecordBook(RecordWhitelist whitelist, uid_t self, const RecordLimits& limits = {})
      : limits_(limits), self_(self), whitelist_(std::move(whitelist)) {}

  // The day of the lines that follow. Where it is another than before, what the store holds for it
  // is read: false, after an error line, when that failed; then it counts as empty.
  bool enterDay(std::int32_t day, CounterStore& store);
  // Takes in a line of the entered day, or says why not.
  [[nodiscard]] Refusal add(const StatsdLine& line, Sender sender, std::int32_t second);

  bool empty() const { return changed_.empty() && closed_.empty(); }
  // Whether nothing more should be taken in before the next take().
  bool isFull() const { return waitingValues_ >= limits_.waitingValues; }
  // What is to be written; the book is empty afterwards, but for the fractions.
  StoreChanges take();

 private:
  // A sum, exact in its whole part; both parts have one sign or are 0.
  struct Sum {
    WideInteger whole;
    double fraction = 0;
    void add(const StatsdNumber& number, double rate);
    WideInteger rounded() const;
  };
  struct Entry {
    Sum sum;              // of everything since the listener started, or the gauge was set
    WideInteger written;  // of it
    bool isSet = false;
    bool hasScalar = false;  // to be written
    bool isListed = false;   // in changed_
    bool isKnown = false;    // of this day: it may be added to
    bool isNamedExactly = false;
    bool wasUsed = false;  // on this day
    std::uint64_t valuesOfDay = 0;
    // Without their key and day. Elsewhere, since what scalars need is better close together.
    std::unique_ptr<RecordedValues> values;
  };
  struct Hash {
    using is_transparent = void;
    std::size_t operator()(std::string_view key) const {
      return std::hash<std::string_view>()(key);
    }
  };
  using Entries = std::unordered_map<std::string, Entry, Hash, std::equal_to<>>;

  Refusal admit(std::string_view key, Sender sender, Entries::iterator& found);
  void closeDay();
  void forgetOldKeys();
  void readOwners(CounterStore& store);
  StoreNote ownersNote() const;

  const RecordLimits limits_;
  const uid_t self_;
  const RecordWhitelist whitelist_;
  std::optional<std::int32_t> day_;
  Entries entries_;
  std::vector<Entries::value_type*> changed_;
  StoreChanges closed_;  // of days that are over
  std::size_t waitingValues_ = 0;
  std::size_t keysOfDay_ = 0;
  std::map<Sender, std::size_t> owners_;  // how many of them each user made
  bool ownersChanged_ = false;
};

}  // namespace quorlet

#endif  // QUORLET_CTL_RECORD_BOOK_H_
