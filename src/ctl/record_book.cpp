#include "ctl/record_book.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <utility>

#include "ctl/options.h"

namespace quorlet {
namespace {

constexpr uid_t kRootUser = 0;
// More keys of a day than a listener remembers are only counted.
constexpr std::size_t kMostRemembered = 20'000;
constexpr double kBeyond64Bits = 9223372036854775808.0;

// A whole number of at most 2^63.
WideInteger Whole(double whole) {
  if (whole < kBeyond64Bits) return static_cast<std::int64_t>(whole);
  WideInteger largest = std::numeric_limits<std::int64_t>::max();
  return largest += 1;
}

bool IsReserved(std::string_view key) {
  return key.starts_with("nuvex.") || key.starts_with("datausage.");
}

}  // namespace

void RecordBook::Sum::add(const StatsdNumber& number, double rate) {
  if (number.whole && rate == 1) {
    whole += *number.whole;
  } else {
    const double real = std::clamp(number.real / rate, -kBeyond64Bits, kBeyond64Bits);
    const double part = std::trunc(real);
    whole += Whole(part);
    fraction += real - part;
  }
  if (fraction == 0) return;
  // Carries, then gives both parts one sign, which is what rounding goes by.
  const double carried = std::trunc(fraction);
  whole += Whole(carried);
  fraction -= carried;
  if (whole.isPositive() && fraction < 0) {
    whole -= 1;
    fraction += 1;
  } else if (whole.isNegative() && fraction > 0) {
    whole += 1;
    fraction -= 1;
  }
}

// Half away from zero.
WideInteger RecordBook::Sum::rounded() const {
  WideInteger nearest = whole;
  return nearest += fraction >= 0.5 ? 1 : fraction <= -0.5 ? -1 : 0;
}

bool RecordBook::enterDay(std::int32_t day, CounterStore& store) {
  if (day_ == day) return true;
  if (day_) closeDay();
  day_ = day;
  forgetOldKeys();
  keysOfDay_ = 0;
  const bool isRead =
      store.keysOfDay(day, [this](std::string_view key, std::optional<std::uint64_t> values) {
        const bool isExact = whitelist_.match(key) == RecordWhitelist::Match::kNamedExactly;
        if (!isExact) ++keysOfDay_;
        const bool isKept = isExact || entries_.size() < kMostRemembered;
        if (key.size() <= kLongestRecordedKey && isKept) {
          Entry& entry = entries_[std::string(key)];
          // A key of both kinds was counted with its scalar.
          if (entry.isKnown && !isExact) --keysOfDay_;
          entry.isKnown = true;
          entry.isNamedExactly = isExact;
          if (values) entry.valuesOfDay = *values;
        }
        return true;
      });
  readOwners(store);
  return isRead;
}

// Its fractions stay with the keys.
void RecordBook::forgetOldKeys() {
  const bool isCrowded = entries_.size() > kMostRemembered;
  std::erase_if(entries_, [isCrowded](const auto& item) {
    const Entry& entry = item.second;
    return entry.sum.fraction == 0 || (isCrowded && !entry.wasUsed);
  });
  for (auto& [key, entry] : entries_) {
    entry.isKnown = false;
    entry.wasUsed = false;
    entry.valuesOfDay = 0;
  }
}

Refusal RecordBook::admit(std::string_view key, Sender sender, Entries::iterator& found) {
  const bool isTrusted = sender == kRootUser || sender == self_;
  const RecordWhitelist::Match match = whitelist_.match(key);
  if (match == RecordWhitelist::Match::kNone) return Refusal::kNotInWhitelist;
  const bool isExact = match == RecordWhitelist::Match::kNamedExactly;
  if (!isExact) {
    if (keysOfDay_ >= limits_.keys) return Refusal::kTooManyKeys;
    if (!isTrusted) {
      std::size_t& owned = owners_[sender];
      if (owned >= limits_.keysOfUser) return Refusal::kTooManyKeysOfUser;
      ++owned;
      ownersChanged_ = true;
    }
    ++keysOfDay_;
  }
  if (found == entries_.end()) found = entries_.emplace(std::string(key), Entry()).first;
  found->second.isKnown = true;
  found->second.isNamedExactly = isExact;
  return Refusal::kNone;
}

Refusal RecordBook::add(const StatsdLine& line, Sender sender, std::int32_t second) {
  if (IsReserved(line.key) && sender != kRootUser && sender != self_) return Refusal::kReserved;
  auto found = entries_.find(line.key);
  if (found == entries_.end() || !found->second.isKnown) {
    const Refusal refusal = admit(line.key, sender, found);
    if (refusal != Refusal::kNone) return refusal;
  } else if (!found->second.wasUsed && !found->second.isNamedExactly &&
             whitelist_.match(line.key) == RecordWhitelist::Match::kNone) {
    // Others may have put it into the store.
    return Refusal::kNotInWhitelist;
  }
  Entry& entry = found->second;
  if (line.kind == StatsdKind::kValues &&
      entry.valuesOfDay + line.numbers.size() > limits_.values) {
    return Refusal::kTooManyValues;
  }
  entry.wasUsed = true;
  if (!entry.isListed) changed_.push_back(&*found);
  entry.isListed = true;
  if (line.kind == StatsdKind::kValues) {
    if (!entry.values) entry.values = std::make_unique<RecordedValues>();
    for (const StatsdNumber& number : line.numbers) entry.values->add(number.real, second);
    entry.valuesOfDay += line.numbers.size();
    waitingValues_ += line.numbers.size();
    return Refusal::kNone;
  }
  entry.hasScalar = true;
  for (const StatsdNumber& number : line.numbers) {
    if (line.kind == StatsdKind::kGauge && !number.isSigned) {
      entry.sum = {};
      entry.written = {};
      entry.isSet = true;
    }
    entry.sum.add(number, line.kind == StatsdKind::kCounter ? line.rate : 1);
  }
  return Refusal::kNone;
}

// Moves what is to be written of the day over to what is ready.
void RecordBook::closeDay() {
  for (Entries::value_type* item : changed_) {
    auto& [key, entry] = *item;
    if (entry.hasScalar) {
      const WideInteger rounded = entry.sum.rounded();
      WideInteger growth = rounded;
      growth -= entry.written;
      const auto kind = entry.isSet ? ScalarChange::Kind::kSet : ScalarChange::Kind::kAdd;
      closed_.scalars.push_back({kind, key, growth.saturated(), *day_});
      entry.written = rounded;
    }
    if (const auto values = std::exchange(entry.values, nullptr)) {
      RecordedValues& recorded = closed_.values.emplace_back(std::move(*values));
      recorded.key = key;
      recorded.day = *day_;
    }
    entry.isSet = entry.hasScalar = entry.isListed = false;
  }
  changed_.clear();
  if (ownersChanged_) closed_.notes = {ownersNote()};
  ownersChanged_ = false;
}

StoreChanges RecordBook::take() {
  closeDay();
  waitingValues_ = 0;
  return std::exchange(closed_, {});
}

// "-" is the user that the kernel does not tell.
StoreNote RecordBook::ownersNote() const {
  Dictionary owners;
  for (const auto& [owner, count] : owners_) {
    owners[owner ? std::to_string(*owner) : "-"] = Int64(static_cast<std::int64_t>(count));
  }
  return {kKeyOwnersNote, Dictionary{{"day", Int32(*day_)}, {"owners", owners}}};
}

void RecordBook::readOwners(CounterStore& store) {
  owners_.clear();
  std::optional<Dictionary> note;
  if (!store.readNote(kKeyOwnersNote, note) || !note || IntegerEntry(*note, "day") != day_) return;
  const Dictionary* owners = DictionaryEntry(*note, "owners");
  if (owners == nullptr || owners->size() > limits_.keys) return;
  for (const auto& [owner, count] : *owners) {
    const auto known = IntegerEntry(*owners, owner).value_or(0);
    owners_[ParseNumber<uid_t>(owner)] = static_cast<std::size_t>(std::max<std::int64_t>(known, 0));
  }
}

}  // namespace quorlet
