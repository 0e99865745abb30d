// Finding channels in the driver registry, and choosing among them.
#include <charconv>
#include <iterator>
#include <utility>

#include "channels/channel.h"
#include "channels/walk.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr std::string_view kPublicKey = "DrvReportLegendPublic";
constexpr std::string_view kLegendKey = "DrvReportLegend";
constexpr int kFailureBit = 1;

using ErrorOut = std::optional<ErrorValue>*;
using Text = std::optional<std::string_view>;

// Visits the services that match; a visitor's result that is not 0 ends the visit.
template <typename Visit>
KernelReturn _iterateMatchingServices(DriverRegistry& registry, const Dictionary& match,
                                      Visit visit) {
  RegistryHandle iterator = 0;
  const KernelReturn found = registry.FindServicesMatching(match, iterator);
  if (found != kKernelSuccess) return found;
  KernelReturn result = kKernelSuccess;
  if (registry.IteratorIsValid(iterator)) {
    while (result == kKernelSuccess) {
      const RegistryHandle service = registry.IteratorNext(iterator);
      if (service == 0) {
        if (!registry.IteratorIsValid(iterator)) result = kDrvReportRegistryChanged;
        break;
      }
      result = visit(service);
      registry.ReleaseHandle(service);
    }
  }
  registry.ReleaseHandle(iterator);
  return result;
}

Array _createChannelLegend(std::uint64_t channelID, std::uint64_t channelType, Text name) {
  Array legend{Int64(static_cast<std::int64_t>(channelID)),
               Int64(static_cast<std::int64_t>(channelType))};
  if (name) legend.push_back(*name);
  return legend;
}

// What the channels of one group share.
struct GroupOfChannels {
  const std::string* group = nullptr;
  const std::string* subgroup = nullptr;
  const Dictionary* info = nullptr;
};

bool IsUsableNumber(const PropertyValue& value) {
  const Number* number = value.asNumber();
  return number != nullptr &&
         (number->kind() == NumberKind::kUInt64 ? number->toUInt64() != std::uint64_t{1} << 63
                                                : number->toInt64() != kDrvReportInvalidValue);
}

std::optional<Dictionary> _createChannel(std::uint64_t driverID, std::string_view driverName,
                                         const Array& legend, const GroupOfChannels& group,
                                         ErrorOut error) {
  if (legend.size() < 2 || !IsUsableNumber(legend[0]) || !IsUsableNumber(legend[1])) {
    storeErr(error, kKernelError, "couldn't create channel");
    return std::nullopt;
  }
  Dictionary channel;
  channel[kDriverIDKey] = Int64(static_cast<std::int64_t>(driverID));
  channel[kDriverNameKey] = driverName;
  channel[kLegendChannelKey] = legend;
  if (group.group != nullptr) channel[kGroupNameKey] = *group.group;
  if (group.subgroup != nullptr) channel[kSubGroupNameKey] = *group.subgroup;
  if (group.info != nullptr) channel[kChannelInfoKey] = *group.info;
  return channel;
}

// Makes the channels of one driver, which is asked for its ID and name once.
class DriverChannels {
 public:
  DriverChannels(DriverRegistry& registry, RegistryHandle driver)
      : registry_(registry), driver_(driver) {}

  std::optional<Dictionary> _createDriverChannel(const Array& legend, const GroupOfChannels& group,
                                                 ErrorOut error) {
    if (!isAsked_) {
      isAsked_ = true;
      idStatus_ = registry_.GetEntryID(driver_, id_);
      name_ = DrvReportCopyDriverName(registry_, driver_);
    }
    if (idStatus_ != kKernelSuccess) {
      storeErr(error, idStatus_, "error extracting driver info");
      return std::nullopt;
    }
    if (!name_) return std::nullopt;
    return _createChannel(id_, *name_, legend, group, error);
  }

 private:
  DriverRegistry& registry_;
  const RegistryHandle driver_;
  bool isAsked_ = false;
  KernelReturn idStatus_ = kKernelSuccess;
  std::uint64_t id_ = 0;
  std::optional<std::string> name_;
};

// The dictionary under `key`, made when there is nothing; nothing when there is something else.
std::optional<Dictionary> _getOrCreateSubDict(Dictionary& dictionary, std::string_view key) {
  PropertyValue* value = dictionary.find(key);
  if (value == nullptr) {
    const Dictionary made;
    dictionary[key] = made;
    return made;
  }
  const Dictionary* found = value->asDictionary();
  return found != nullptr ? std::optional(*found) : std::nullopt;
}

// The aggregate in which a channel is filed, or nothing.
std::optional<Dictionary> FindPlace(Dictionary target, const Dictionary& channel,
                                    std::uint32_t opts) {
  const auto descend = [&target](std::string_view level, const std::string* name) {
    auto entries = _getOrCreateSubDict(target, level);
    auto next = entries && name != nullptr ? _getOrCreateSubDict(*entries, *name) : std::nullopt;
    if (next) target = *next;
    return next.has_value();
  };
  if ((opts & kDrvReportByDriver) != 0 &&
      !descend(kDriversKey, DrvReportChannelGetDriverName(channel))) {
    return std::nullopt;
  }
  const std::string* group = DrvReportChannelGetGroup(channel);
  if ((opts & kDrvReportByGroup) != 0 && group != nullptr) {
    const std::string* subgroup = DrvReportChannelGetSubGroup(channel);
    if (!descend(kGroupsKey, group)) return std::nullopt;
    if (subgroup != nullptr && !descend(kGroupsKey, subgroup)) return std::nullopt;
  }
  return target;
}

KernelReturn _addChannel(const Dictionary& aggregate, const Dictionary& channel, std::uint32_t opts,
                         ErrorOut error) {
  if (auto target = FindPlace(aggregate, channel, opts)) {
    PropertyValue* value = target->find(kChannelsKey);
    if (value == nullptr) {
      (*target)[kChannelsKey] = Array{channel};
      return kKernelSuccess;
    }
    if (Array* channels = value->asArray()) {
      channels->push_back(channel);
      return kKernelSuccess;
    }
  }
  storeErr(error, kKernelError, "_addChannel() failed");
  return kKernelError;
}

// What comes after a group that is malformed is not read; after an entry that is, the next group.
KernelReturn _addLegendChannels(const Dictionary& aggregate, DriverChannels& driver,
                                const Array& legend, std::uint32_t opts, ErrorOut error) {
  for (const PropertyValue& item : legend) {
    const Dictionary* description = item.asDictionary();
    if (description == nullptr) return kKernelSuccess;
    const GroupOfChannels group{StringEntry(*description, kGroupNameKey),
                                StringEntry(*description, kSubGroupNameKey),
                                DictionaryEntry(*description, kChannelInfoKey)};
    if (group.group == nullptr && group.subgroup != nullptr) return kKernelSuccess;
    const Array* entries = ArrayEntry(*description, kChannelsKey);
    if (entries == nullptr) return kKernelSuccess;
    for (const PropertyValue& entry : *entries) {
      const Array* channelLegend = entry.asArray();
      if (channelLegend == nullptr) break;
      const auto channel = driver._createDriverChannel(*channelLegend, group, error);
      if (!channel || _addChannel(aggregate, *channel, opts, error) != kKernelSuccess) {
        return kKernelError;
      }
    }
  }
  return kKernelSuccess;
}

std::uint32_t _getAggregateOpts(const Dictionary& aggregate) {
  return static_cast<std::uint32_t>(IntegerEntry(aggregate, kQueryOptsKey).value_or(0));
}

// Keeps the channels for which `keeps` says so; nothing when that failed.
template <typename Keeps>
std::optional<Dictionary> Narrow(std::optional<Dictionary> aggregate, ErrorOut error, Keeps keeps) {
  if (!aggregate) return std::nullopt;
  const int result = DrvReportPrune(*aggregate, [&keeps](Dictionary& channel) {
    return keeps(channel) ? 0 : kDrvReportLeaveOut;
  });
  if ((result & kFailureBit) == 0) return aggregate;
  storeErr(error, kKernelError, "channel pruning failed");
  return std::nullopt;
}

}  // namespace

Dictionary DrvReportCreateAggregate(std::uint32_t opts) {
  Dictionary aggregate;
  aggregate[kQueryOptsKey] = Int32(static_cast<std::int32_t>(opts));
  return aggregate;
}

std::optional<Dictionary> DrvReportCopyChannelsForDriver(DriverRegistry& registry,
                                                         RegistryHandle driver, std::uint32_t opts,
                                                         ErrorOut error) {
  if (driver == 0 || registry.HandleRetainCount(driver) == 0) {
    storeErr(error, kKernelBadArgument, "invalid driver");
    return std::nullopt;
  }
  Dictionary aggregate = DrvReportCreateAggregate(opts);
  if (!registry.CopyEntryProperty(driver, kPublicKey)) return aggregate;
  const auto legend = registry.CopyEntryProperty(driver, kLegendKey);
  if (!legend || legend->asArray() == nullptr) {
    legend ? storeErr(error, kDrvReportMalformedLegend, "bad legend")
           : storeErr(error, kKernelNotFound, "no legend");
    return std::nullopt;
  }
  DriverChannels channels(registry, driver);
  const KernelReturn result =
      _addLegendChannels(aggregate, channels, *legend->asArray(), opts, error);
  if (result == kKernelSuccess) return aggregate;
  storeErr(error, result);
  return std::nullopt;
}

std::optional<Dictionary> DrvReportCopyAllChannels(DriverRegistry& registry, std::uint32_t opts,
                                                   ErrorOut error) {
  Dictionary match;
  match[kMatchProperties] = Dictionary{{kPublicKey, true}};
  Dictionary all = DrvReportCreateAggregate(opts);
  const KernelReturn result = _iterateMatchingServices(registry, match, [&](RegistryHandle driver) {
    std::optional<ErrorValue> failure;
    const auto channels = DrvReportCopyChannelsForDriver(registry, driver, opts, &failure);
    if (channels) {
      return static_cast<KernelReturn>(DrvReportMergeChannels(&all, &*channels, error));
    }
    // One driver that cannot be read does not cost the others.
    drvErrLog(opts, DrvReportCopyDriverName(registry, driver), failure);
    return kKernelSuccess;
  });
  return result == kKernelSuccess ? std::optional(all) : std::nullopt;
}

std::optional<Dictionary> DrvReportCopyChannelsForDrivers(DriverRegistry& registry,
                                                          const Dictionary* match,
                                                          std::uint32_t opts, ErrorOut error) {
  Dictionary all = DrvReportCreateAggregate(opts);
  if (match == nullptr) {
    storeErr(error, kKernelBadArgument, "no matching dict");
    return std::nullopt;
  }
  const KernelReturn result =
      _iterateMatchingServices(registry, *match, [&](RegistryHandle driver) {
        const auto channels = DrvReportCopyChannelsForDriver(registry, driver, 0, error);
        if (!channels) return kKernelError;
        return static_cast<KernelReturn>(DrvReportMergeChannels(&all, &*channels, error));
      });
  return result == kKernelSuccess ? std::optional(all) : std::nullopt;
}

std::optional<Dictionary> DrvReportCopyChannelsInCategories(DriverRegistry& registry,
                                                            std::uint64_t categories,
                                                            std::uint32_t opts, ErrorOut error) {
  return Narrow(DrvReportCopyAllChannels(registry, opts, error), error, [=](Dictionary& channel) {
    return (DrvReportChannelGetCategories(channel) & categories & 0xFFFF) != 0;
  });
}

std::optional<Dictionary> DrvReportCopyChannelsOfFormat(DriverRegistry& registry,
                                                        std::uint64_t format, std::uint32_t opts,
                                                        ErrorOut error) {
  return Narrow(DrvReportCopyAllChannels(registry, opts, error), error, [=](Dictionary& channel) {
    return DrvReportChannelGetFormat(channel) == (format & 0xFF);
  });
}

std::optional<Dictionary> DrvReportCopyChannelsWithUnit(DriverRegistry& registry,
                                                        std::uint64_t unit, std::uint32_t opts,
                                                        ErrorOut error) {
  return Narrow(DrvReportCopyAllChannels(registry, opts, error), error,
                [=](Dictionary& channel) { return DrvReportChannelGetUnit(channel) == unit; });
}

std::optional<Dictionary> DrvReportCopyChannelsInGroup(DriverRegistry& registry, Text group,
                                                       Text subgroup, std::uint32_t opts,
                                                       ErrorOut error) {
  auto all = DrvReportCopyAllChannels(registry, opts, error);
  if (!all) return std::nullopt;
  const int result = DrvReportSelectChannelsInGroup(*all, group, subgroup, error);
  return (result & kFailureBit) == 0 ? all : std::nullopt;
}

std::optional<Dictionary> DrvReportCopyChannelsWithID(DriverRegistry& registry,
                                                      const Dictionary* match,
                                                      std::uint64_t channelID, ErrorOut error) {
  if (match == nullptr) return std::nullopt;
  Dictionary all = DrvReportCreateAggregate(0);
  const KernelReturn result =
      _iterateMatchingServices(registry, *match, [&](RegistryHandle driver) {
        const auto legend = _createChannelLegend(channelID, 0, std::nullopt);
        const auto channel =
            DriverChannels(registry, driver)._createDriverChannel(legend, {}, error);
        return channel ? _addChannel(all, *channel, 0, error) : kKernelError;
      });
  return result == kKernelSuccess ? std::optional(all) : std::nullopt;
}

int DrvReportSelectChannelsInGroup(Dictionary& aggregate, Text group, Text subgroup,
                                   ErrorOut error) {
  if (!group && !subgroup) {
    storeErr(error, kKernelBadArgument, "no group or subgroup!");
    return kFailureBit;
  }
  const auto isWanted = [](const std::string* name, const Text& wanted) {
    return !wanted || (name != nullptr && *name == *wanted);
  };
  const int result = DrvReportPrune(aggregate, [&](Dictionary& channel) {
    return isWanted(DrvReportChannelGetGroup(channel), group) &&
                   isWanted(DrvReportChannelGetSubGroup(channel), subgroup)
               ? 0
               : kDrvReportLeaveOut;
  });
  if ((result & kFailureBit) == 0) return result;
  storeErr(error, kKernelError, "channel pruning failed");
  return kFailureBit;
}

int DrvReportMergeChannels(Dictionary* destination, const Dictionary* source, ErrorOut error) {
  if (destination == nullptr || source == nullptr || destination->sharesWith(*source)) {
    storeErr(error, kKernelBadArgument, "bad argument");
    return kDrvReportWalkFailed;
  }
  const std::uint32_t opts = _getAggregateOpts(*destination);
  return DrvReportIterate(*source, [&](Dictionary& channel) {
    return _addChannel(*destination, channel, opts, error) == kKernelSuccess ? 0 : kFailureBit;
  });
}

KernelReturn DrvReportAddChannelDescription(Dictionary& aggregate, std::uint64_t driverID,
                                            std::string_view driverName, std::uint64_t channelID,
                                            std::uint64_t channelType, Text channelName, Text group,
                                            Text subgroup, const Dictionary* channelInfo,
                                            ErrorOut error) {
  const auto legend = _createChannelLegend(channelID, channelType, channelName);
  const auto groupName = group ? std::optional<std::string>(*group) : std::nullopt;
  const auto subgroupName = subgroup ? std::optional<std::string>(*subgroup) : std::nullopt;
  const GroupOfChannels names{groupName ? &*groupName : nullptr,
                              subgroupName ? &*subgroupName : nullptr, channelInfo};
  const auto channel = _createChannel(driverID, driverName, legend, names, error);
  if (!channel) return kKernelError;
  return _addChannel(aggregate, *channel, _getAggregateOpts(aggregate), error);
}

std::optional<std::string> DrvReportCopyDriverName(DriverRegistry& registry,
                                                   RegistryHandle driver) {
  std::uint64_t id = 0;
  std::string name;
  if (registry.GetEntryID(driver, id) != kKernelSuccess ||
      registry.GetEntryName(driver, name) != kKernelSuccess) {
    return std::nullopt;
  }
  char digits[17];
  const auto printed = std::to_chars(std::begin(digits), std::end(digits), id, 16);
  // As "%#llx" has it: no prefix before 0.
  return FormatText("%s <id %s%s>", name, id == 0 ? "" : "0x",
                    std::string_view(digits, printed.ptr));
}

}  // namespace quorlet
