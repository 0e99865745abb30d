// The counters that the statistics export of the storage controller may hold.
//
// A counter name is a key's name, or for an element of a record with several values, the name with
// the element's index: "padSizes2". Each has a slot, a small number that stands for the name.
#ifndef QUORLET_STORAGE_STATISTICS_KEYS_H_
#define QUORLET_STORAGE_STATISTICS_KEYS_H_

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/statistics_keys.h"

namespace quorlet {

// Of all names, those of records with one value included.
using StatisticsSlot = std::uint16_t;

namespace internal {

inline constexpr auto kStatisticsKeyById = [] {
  std::array<std::uint16_t, kStatisticsKeys.back().id + 1> indexes{};  // one too high; 0: no key
  for (std::size_t i = 0; i < kStatisticsKeys.size(); ++i) {
    indexes[kStatisticsKeys[i].id] = static_cast<std::uint16_t>(i + 1);
  }
  return indexes;
}();

// The slot of each key's plain name; those of its elements follow. One more for the end.
inline constexpr auto kFirstSlot = [] {
  std::array<StatisticsSlot, kStatisticsKeys.size() + 1> slots{};
  for (std::size_t i = 0; i < kStatisticsKeys.size(); ++i) {
    const std::uint16_t cap = kStatisticsKeys[i].cap;
    slots[i + 1] = static_cast<StatisticsSlot>(slots[i] + 1 + (cap > 1 ? cap : 0));
  }
  return slots;
}();

inline constexpr auto kStatisticsKeysByName = [] {
  std::array<std::uint16_t, kStatisticsKeys.size()> indexes{};
  for (std::size_t i = 0; i < indexes.size(); ++i) indexes[i] = static_cast<std::uint16_t>(i);
  std::ranges::sort(indexes, {}, [](std::uint16_t i) { return kStatisticsKeys[i].name; });
  return indexes;
}();

// The row, not a pointer to it: g++ with UBSan takes no null test of a pointer for a constant.
constexpr std::optional<std::size_t> FindStatisticsRowByName(std::string_view name) {
  const auto nameOf = [](std::uint16_t i) { return kStatisticsKeys[i].name; };
  const auto found = std::ranges::lower_bound(kStatisticsKeysByName, name, {}, nameOf);
  if (found == kStatisticsKeysByName.end() || nameOf(*found) != name) return std::nullopt;
  return *found;
}

}  // namespace internal

inline constexpr std::size_t kStatisticsSlots = internal::kFirstSlot.back();

// The key of that id, or nullptr.
constexpr const StatisticsKey* FindStatisticsKey(std::uint32_t id) {
  if (id >= internal::kStatisticsKeyById.size()) return nullptr;
  const std::uint16_t index = internal::kStatisticsKeyById[id];
  return index != 0 ? &kStatisticsKeys[index - 1U] : nullptr;
}

// The slot of the key's plain name; with `index`, below the key's cap, that of the element.
constexpr StatisticsSlot SlotOf(const StatisticsKey& key) {
  return internal::kFirstSlot[static_cast<std::size_t>(&key - kStatisticsKeys.data())];
}
constexpr StatisticsSlot SlotOf(const StatisticsKey& key, std::size_t index) {
  return static_cast<StatisticsSlot>(SlotOf(key) + 1 + index);
}

// The slot of a counter name, or nothing when no key gives that name.
constexpr std::optional<StatisticsSlot> FindStatisticsSlot(std::string_view name) {
  if (const auto row = internal::FindStatisticsRowByName(name)) return internal::kFirstSlot[*row];
  const std::size_t digits = name.size() - (name.find_last_not_of("0123456789") + 1);
  const std::string_view number = name.substr(name.size() - digits);
  if (digits == 0 || digits > 3 || (digits > 1 && number[0] == '0')) return std::nullopt;
  std::size_t index = 0;
  for (const char digit : number) index = index * 10 + static_cast<std::size_t>(digit - '0');
  name.remove_suffix(digits);
  const auto row = internal::FindStatisticsRowByName(name);
  if (!row) return std::nullopt;
  const StatisticsKey& key = kStatisticsKeys[*row];
  return key.cap != 1 && index < key.cap ? std::optional(SlotOf(key, index)) : std::nullopt;
}

// The slot of a counter name that is known to exist.
consteval StatisticsSlot StatisticsSlotOf(std::string_view name) {
  return FindStatisticsSlot(name).value();
}

// The counter name of a slot.
std::string StatisticsName(StatisticsSlot slot);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_STATISTICS_KEYS_H_
