#include "platform/linux/live/live_publisher.h"

namespace quorlet {
namespace {

constexpr std::uint64_t kLiveCategory = 0x0001;
std::uint64_t TypeWord(const LiveChannel& channel) {
  const std::uint64_t categories = kLiveCategory | (channel.isDaily ? kDailyCategory : 0);
  return makeType(channel.format, categories, channel.elements);
}

}  // namespace

void LiveLegend::add(const LiveGroup& group, const LiveChannel& channel) {
  if (channel.elements == 0 || channel.elements > kMaxElementCount) return;
  const std::uint64_t type = TypeWord(channel);
  if (!types_.try_emplace(channel.id, type).second) return;
  const auto [channels, isNew] =
      channels_.try_emplace(std::tuple(group.group, group.subgroup, group.unit));
  if (isNew) {
    Dictionary info{{"DrvReportChannelUnit", Int64(static_cast<std::int64_t>(group.unit))}};
    if (!group.bucketConfig.empty()) info["DrvReportChannelConfig"] = group.bucketConfig;
    Dictionary described{{"DrvReportGroupName", group.group},
                         {"DrvReportChannelInfo", info},
                         {"DrvReportChannels", channels->second}};  // shared: it grows below
    if (!group.subgroup.empty()) described["DrvReportSubGroupName"] = group.subgroup;
    groups_.push_back(described);
  }
  channels->second.push_back(Array{Int64(static_cast<std::int64_t>(channel.id)),
                                   Int64(static_cast<std::int64_t>(type)), channel.name});
}

std::uint64_t LiveLegend::typeOf(std::uint64_t id) const {
  const auto found = types_.find(id);
  return found != types_.end() ? found->second : 0;
}

void LiveRuns::add(std::uint64_t id, std::span<const LiveValues> records) {
  const std::uint64_t type = legend_->typeOf(id);
  if (records.empty() || elementCountOfType(type) != records.size()) return;
  if (!places_.try_emplace(id, Place{bytes_.size(), records.size() * kRawElementSize}).second)
    return;
  const bool isStamped = formatOfType(type) != static_cast<std::uint8_t>(ReportFormat::kState);
  for (const LiveValues& values : records) {
    bytes_.u64(driverID_).u64(id).u64(type).u64(isStamped ? now_ : 0);
    for (const std::int64_t value : values) bytes_.u64(static_cast<std::uint64_t>(value));
  }
}

void LiveRuns::addSimple(std::uint64_t id, std::int64_t value) {
  const LiveValues values{value};
  add(id, std::span(&values, 1));
}

std::span<const std::byte> LiveRuns::find(std::uint64_t id) const {
  const auto found = places_.find(id);
  if (found == places_.end()) return {};
  return std::span(bytes_.data()).subspan(found->second.offset, found->second.length);
}

}  // namespace quorlet
