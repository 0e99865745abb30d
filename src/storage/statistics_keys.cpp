#include "storage/statistics_keys.h"

namespace quorlet {
namespace {

// Otherwise two slots would share a name.
static_assert(std::ranges::adjacent_find(internal::kStatisticsKeysByName, {}, [](std::uint16_t i) {
                return kStatisticsKeys[i].name;
              }) == internal::kStatisticsKeysByName.end());
static_assert(std::ranges::none_of(kStatisticsKeys, [](const StatisticsKey& key) {
  const std::size_t digits = key.name.size() - (key.name.find_last_not_of("0123456789") + 1);
  const auto array =
      internal::FindStatisticsRowByName(key.name.substr(0, key.name.size() - digits));
  return digits != 0 && array && kStatisticsKeys[*array].cap > 1;
}));
// Names are kept whole up to 98 characters.
static_assert(std::ranges::all_of(kStatisticsKeys, [](const StatisticsKey& key) {
  return key.name.size() + 3 <= 98 && key.cap >= 1 && key.cap <= 1000;
}));

}  // namespace

std::string StatisticsName(StatisticsSlot slot) {
  const auto next = std::ranges::upper_bound(internal::kFirstSlot, slot);
  const auto key = static_cast<std::size_t>(next - internal::kFirstSlot.begin()) - 1;
  std::string name(kStatisticsKeys[key].name);
  const std::size_t element = slot - std::size_t{internal::kFirstSlot[key]};
  if (element != 0) name += std::to_string(element - 1);
  return name;
}

}  // namespace quorlet
