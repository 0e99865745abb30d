#include "channels/walk.h"

#include <algorithm>
#include <array>
#include <compare>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "channels/channel.h"

namespace quorlet {
namespace {

constexpr int kFailureBit = 1;
// Drivers, groups and subgroups make three; a tree that holds itself ends here.
constexpr int kDeepestLevel = 32;

// What tells a channel from others.
struct Identity {
  std::int64_t driverID = 0;
  std::int64_t channelID = 0;
  std::uint64_t type = 0;
  // NOLINTNEXTLINE(modernize-use-nullptr): a 0 that nobody wrote
  auto operator<=>(const Identity&) const = default;
};

std::optional<Identity> IdentityOf(const PropertyValue& value) {
  const Dictionary* channel = value.asDictionary();
  Identity identity;
  if (channel == nullptr || getChannelType(*channel, identity.type) != kKernelSuccess) {
    return std::nullopt;
  }
  identity.driverID = DrvReportChannelGetDriverID(*channel);
  identity.channelID = DrvReportChannelGetChannelID(*channel);
  return identity;
}

// Finds the partners of one channel array's channels, which mostly stand at the same place.
class PartnerSearch {
 public:
  explicit PartnerSearch(const Array& partners) : partners_(partners) {}

  // False when a candidate is malformed. Without a partner, `partner` is nullptr.
  bool find(const PropertyValue& channel, std::size_t index, const Dictionary*& partner) {
    partner = nullptr;
    const auto wanted = IdentityOf(channel);
    std::size_t found = kNowhere;
    if (index < partners_.size()) {
      const auto candidate = IdentityOf(partners_[index]);
      if (!wanted || !candidate) return false;
      if (candidate == wanted) {
        found = index;
      } else if (!findForward(*wanted, index, found)) {
        return false;
      }
    }
    // One that the search has passed: channels were missing before it, or stood in another order.
    if (found == kNowhere && wanted) found = firstFrom(0, places(*wanted));
    if (found != kNowhere) partner = partners_[found].asDictionary();
    return true;
  }

 private:
  using Places = std::vector<std::size_t>;  // in ascending order
  static constexpr std::size_t kNowhere = SIZE_MAX;

  static std::size_t firstFrom(std::size_t start, const Places& places) {
    const auto found = std::ranges::lower_bound(places, start);
    return found != places.end() ? *found : kNowhere;
  }

  // False when a malformed candidate comes first.
  bool findForward(const Identity& wanted, std::size_t index, std::size_t& found) {
    const std::size_t start = hint_.value_or(index + 1);
    hint_ = start;
    found = firstFrom(start, places(wanted));
    if (firstFrom(start, malformed_) < found) return false;
    if (found != kNowhere) hint_ = found + 1;
    return true;
  }

  const Places& places(const Identity& wanted) {
    if (!isIndexed_) {
      isIndexed_ = true;
      for (std::size_t i = 0; i < partners_.size(); ++i) {
        const auto identity = IdentityOf(partners_[i]);
        (identity ? places_[*identity] : malformed_).push_back(i);
      }
    }
    return places_[wanted];
  }

  const Array& partners_;
  std::optional<std::size_t> hint_;  // where the next search begins
  // So that many channels without a partner do not each go through all of them.
  bool isIndexed_ = false;
  std::map<Identity, Places> places_;
  Places malformed_;
};

// The partner's records in the new channel's format, with every value invalid; false when it has
// none.
bool TakeInvalidRecords(const Dictionary& partner, Dictionary& newChannel) {
  constexpr std::size_t kValueBytes = 8;
  std::uint16_t count = 0;
  const std::uint8_t format = DrvReportChannelGetFormat(newChannel);
  if (getRawElements(partner, count, format) == nullptr) return false;
  Data records = *DataEntry(partner, kRawElementsKey);
  for (std::size_t at = 0; at + kRawElementSize <= records.size(); at += kRawElementSize) {
    if (std::to_integer<std::uint8_t>(records[at + kRawElementTypeOffset]) != format) return false;
    for (std::size_t i = kRawElementValuesOffset; i < kRawElementSize; ++i) {
      records[at + i] = std::byte(i % kValueBytes == kValueBytes - 1 ? 0x80 : 0);
    }
  }
  newChannel[kRawElementsKey] = std::move(records);
  return true;
}

// Removes the elements at the places, which ascend, in one go.
void Remove(const std::vector<std::size_t>& places, Array& array) {
  if (places.empty()) return;
  std::size_t kept = places.front();
  auto next = places.begin();
  for (std::size_t i = kept; i < array.size(); ++i) {
    if (next != places.end() && *next == i) {
      ++next;
    } else {
      array[kept++] = std::move(array[i]);
    }
  }
  array.truncate(kept);
}

class Walk {
 public:
  explicit Walk(const WalkContext& context)
      : context_(context),
        mode_(context.iterate   ? Mode::kIterate
              : context.prune   ? Mode::kPrune
              : context.clone   ? Mode::kClone
              : context.compare ? Mode::kCompare
                                : Mode::kNone) {}

  // `aggregate` is a handle: pruning changes what the caller has.
  int run(Dictionary aggregate, const Dictionary* partner, std::optional<Dictionary>* out,
          int level) const {
    const bool isComparing = mode_ == Mode::kCompare;
    if (level > kDeepestLevel || (isComparing && partner == nullptr)) return kDrvReportWalkFailed;
    if (!isComparing) partner = nullptr;
    std::optional<Dictionary> made;
    if (isMaking()) made.emplace();
    int result = walkChannels(aggregate, partner, made);
    for (const std::string_view key : {kDriversKey, kGroupsKey}) {
      if ((result & kFailureBit) != 0) return result;
      const int nested = walkLevel(aggregate, key, partner, made, level);
      result = (nested & kFailureBit) != 0 ? nested : result | nested;
    }
    if ((result & kFailureBit) != 0 || !made) return result;
    if (out == nullptr) return kDrvReportWalkFailed;
    *out = std::move(made);
    return result;
  }

 private:
  enum class Mode : std::uint8_t { kNone, kIterate, kPrune, kClone, kCompare };

  bool isMaking() const { return mode_ == Mode::kClone || mode_ == Mode::kCompare; }
  bool isPruning() const { return mode_ == Mode::kPrune; }

  int walkChannels(Dictionary& aggregate, const Dictionary* partner,
                   std::optional<Dictionary>& made) const {
    PropertyValue* value = aggregate.find(kChannelsKey);
    if (value == nullptr) return 0;
    Array* found = value->asArray();
    const Array* partners = partner != nullptr ? ArrayEntry(*partner, kChannelsKey) : nullptr;
    if (found == nullptr || (partner != nullptr && partners == nullptr)) {
      return kDrvReportWalkFailed;
    }
    Array channels = *found;
    Array newChannels;
    const Array none;
    PartnerSearch search(partners != nullptr ? *partners : none);
    std::vector<std::size_t> removed;
    int result = 0;
    // Read once: a visitor may add to the array that it visits.
    const std::size_t count = channels.size();
    for (std::size_t i = 0; i < std::min(count, channels.size()); ++i) {
      const int one = visit(channels[i], i, search, newChannels);
      if ((one & kFailureBit) != 0) {
        result = one;
        break;
      }
      result |= one;
      if (isPruning() && one == kDrvReportLeaveOut) removed.push_back(i);
    }
    Remove(removed, channels);
    if ((result & kFailureBit) != 0) return result;
    if (made) (*made)[kChannelsKey] = newChannels;
    if (isPruning() && channels.empty()) aggregate.remove(kChannelsKey);
    return result;
  }

  int visit(PropertyValue& value, std::size_t index, PartnerSearch& search,
            Array& newChannels) const {
    Dictionary* channel = value.asDictionary();
    if (channel == nullptr) return kDrvReportWalkFailed;
    Dictionary newChannel;
    int result = 0;
    switch (mode_) {
      case Mode::kNone:
        return kDrvReportWalkFailed;
      case Mode::kIterate:
        return context_.iterate(*channel);
      case Mode::kPrune:
        return context_.prune(*channel);
      case Mode::kClone:
        newChannel = channel->shallowCopy();
        result = context_.clone(*channel, newChannel);
        break;
      case Mode::kCompare: {
        newChannel = channel->shallowCopy();
        const Dictionary* partner = nullptr;
        if (!search.find(value, index, partner)) return kDrvReportWalkFailed;
        if (partner == nullptr) break;
        if (!TakeInvalidRecords(*partner, newChannel)) return kDrvReportWalkFailed;
        result = context_.compare(*partner, *channel, newChannel);
      }
    }
    if (result == 0) newChannels.push_back(std::move(newChannel));
    return result;
  }

  // The aggregates filed under `key` of an aggregate. A failure of one ends the level; a level in
  // which there is nothing to walk fails.
  int walkLevel(Dictionary& aggregate, std::string_view key, const Dictionary* partner,
                std::optional<Dictionary>& made, int level) const {
    PropertyValue* value = aggregate.find(key);
    if (value == nullptr) return 0;
    if (value->asDictionary() == nullptr) return kDrvReportWalkFailed;
    Dictionary entries = *value->asDictionary();
    const Dictionary* partners = partner != nullptr ? DictionaryEntry(*partner, key) : nullptr;
    if (partner != nullptr && partners == nullptr) return kDrvReportWalkFailed;
    Dictionary newEntries;
    std::vector<std::string> emptied;
    std::optional<int> result;
    for (const auto& [name, entry] : entries) {
      const Dictionary* sub = entry.asDictionary();
      if (sub == nullptr) continue;
      std::optional<Dictionary> newSub;
      const int one = run(*sub, partners != nullptr ? DictionaryEntry(*partners, name) : nullptr,
                          isMaking() ? &newSub : nullptr, level + 1);
      if ((one & kFailureBit) != 0) return one;
      result = result.value_or(0) | one;
      if (newSub) newEntries[name] = *newSub;
      if (isPruning() && sub->empty()) emptied.push_back(name);
    }
    if (!result) return kDrvReportWalkFailed;
    for (const std::string& name : emptied) entries.remove(name);
    if (made) (*made)[key] = newEntries;
    if (isPruning() && entries.empty()) aggregate.remove(key);
    return *result;
  }

  const WalkContext& context_;
  const Mode mode_;
};

}  // namespace

int iterateAggregate(const Dictionary& aggregate, const Dictionary* partner,
                     const WalkContext& context, std::optional<Dictionary>* out) {
  return Walk(context).run(aggregate, partner, out, 0);
}

int DrvReportIterate(const Dictionary& aggregate, const std::function<int(Dictionary&)>& visit) {
  return iterateAggregate(aggregate, nullptr, {.iterate = visit}, nullptr);
}

int DrvReportPrune(Dictionary& aggregate, const std::function<int(Dictionary&)>& prune) {
  return iterateAggregate(aggregate, nullptr, {.prune = prune}, nullptr);
}

int DrvReportGetChannelCount(const Dictionary& aggregate) {
  std::uint32_t count = 0;
  const int result = DrvReportIterate(aggregate, [&count](Dictionary&) {
    ++count;
    return 0;
  });
  return result == 0 ? static_cast<int>(count) : -1;
}

std::optional<Dictionary> cloneAggregate(const Dictionary& aggregate, const CloneCallback& clone) {
  std::optional<Dictionary> made;
  const int result = iterateAggregate(aggregate, nullptr, {.clone = clone}, &made);
  return (result & kFailureBit) == 0 ? made : std::nullopt;
}

std::optional<Dictionary> compareAggregates(const Dictionary& first, const Dictionary& second,
                                            const CompareCallback& compare) {
  std::optional<Dictionary> made;
  const int result = iterateAggregate(second, &first, {.compare = compare}, &made);
  return result == 0 ? made : std::nullopt;
}

}  // namespace quorlet
