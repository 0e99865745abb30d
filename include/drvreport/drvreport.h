// Reporting channels: counters, state machines, histograms and arrays that drivers publish.
//
// A driver describes its channels in a legend in the driver registry; the kernel's hub delivers
// their values. A program finds channels (an aggregate), subscribes to them, takes samples, may
// subtract two sets of samples, and reads values:
//
//   auto registry = MakeMachineDriverRegistry();  // machine_registry.h
//   auto channels = DrvReportCopyChannelsInGroup(*registry, "CPU Idle", std::nullopt, 0);
//   Dictionary subscribed;
//   auto subscription =
//       DrvReportCreateSubscription(*registry, nullptr, &*channels, &subscribed, 0);
//   auto before = DrvReportCreateSamples(subscription.get(), &subscribed);
//   ...
//   auto after = DrvReportCreateSamples(subscription.get(), &subscribed);
//   auto growth = DrvReportCreateSamplesDelta(*before, *after);
//   DrvReportIterate(*growth, [](Dictionary& sample) {
//     if (auto text = DrvReportSampleCopyDescription(sample)) std::cout << *text;
//     return 0;
//   });
//
// Conventions, for all operations:
// - Channels, samples and aggregates are plain value trees (property_value.h), and so belong
//   to whoever holds them. A copy of a Dictionary is a handle on the same one. Getters of names,
//   labels and bounds write caches into the channel that they are given.
// - A pointer result points into the tree that was passed in, and lives as long as that is not
//   changed; nullptr stands for "none". What is returned by value is new.
// - A failure is a result: nothing, the invalid value, -1 or a return code. `error`, where there is
//   one, is the last parameter; it may be nullptr, and is left alone on success.
// - Nothing here is safe to use from two threads at once on the same tree, subscription or
// registry.
// - Whatever drivers put into legends and samples is checked before it is used. Texts are handed on
//   as they are: escape them before a terminal sees them.
#ifndef DRVREPORT_DRVREPORT_H_
#define DRVREPORT_DRVREPORT_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <limits>
#include <memory>
#include <memory_resource>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "drvreport/driver_registry.h"
#include "drvreport/property_value.h"

namespace quorlet {

// ---- Channels ----------------------------------------------------------------------------------
//
// A channel is a dictionary: "DriverID", "DriverName", "LegendChannel" ([ID, type word, name]), and
// "DrvReportGroupName", "DrvReportSubGroupName", "DrvReportChannelInfo" where the driver gives
// them. The type word holds, from its lowest byte on: format (1 byte), a byte that is not read,
// categories (2), element count (2). A sample is a channel with "RawElements": records of 64 bytes.

// Of 64-bit values that are missing or cannot be read.
inline constexpr std::int64_t kDrvReportInvalidValue = std::numeric_limits<std::int64_t>::min();

inline constexpr std::uint8_t kDrvReportFormatUnknown = 0;    // known from the first sample on
inline constexpr std::uint8_t kDrvReportFormatSimple = 1;     // one 64-bit integer
inline constexpr std::uint8_t kDrvReportFormatState = 2;      // one element a state
inline constexpr std::uint8_t kDrvReportFormatHistogram = 3;  // one element a bucket
inline constexpr std::uint8_t kDrvReportFormatArray = 4;      // four values an element

// Return codes, besides those of driver_registry.h.
inline constexpr KernelReturn kDrvReportMalformedLegend = 0xE00002C9;
inline constexpr KernelReturn kDrvReportWriteFailed = 0xE00002CA;
inline constexpr KernelReturn kDrvReportUnknownFormat = 0xE00002E6;
inline constexpr KernelReturn kDrvReportWriteShort = 0xE00002E7;
inline constexpr KernelReturn kDrvReportRegistryChanged = 0xE00002EB;

// Why an operation failed.
struct ErrorValue {
  std::string domain;     // always that of the kernel's return codes
  std::int64_t code = 0;  // the 32-bit return code, sign-extended
  std::string reason;     // for people
};

std::int64_t DrvReportChannelGetDriverID(const Dictionary& channel);
std::int64_t DrvReportChannelGetChannelID(const Dictionary& channel);
// 0 when the type word cannot be read.
std::uint8_t DrvReportChannelGetFormat(const Dictionary& channel);
// 0xFFFF when the type word cannot be read.
std::uint16_t DrvReportChannelGetCategories(const Dictionary& channel);
// How many elements the type word counts; 0 when it cannot be read.
std::uint16_t DrvReportChannelGetElementCount(const Dictionary& channel);
// How many records a sample holds, whatever its type word says; 0 for a channel without records.
std::uint16_t DrvReportSampleGetElementCount(const Dictionary& sample);
const std::string* DrvReportChannelGetGroup(const Dictionary& channel);
const std::string* DrvReportChannelGetSubGroup(const Dictionary& channel);
const std::string* DrvReportChannelGetDriverName(const Dictionary& channel);
// The unit code (see "Units"); the invalid value, as 64 bits, for a channel without one.
std::uint64_t DrvReportChannelGetUnit(const Dictionary& channel);
// The name of the legend, else the ID as text where it prints; kept in the channel ("ChannelName")
// and never looked up again.
const std::string* DrvReportChannelGetChannelName(Dictionary& channel);

// ---- Discovery and selection -------------------------------------------------------------------
//
// An aggregate is a dictionary: "QueryOpts", "DrvReportChannels" (an array), and, with the options
// below, "DrvReportDrivers" and "DrvReportChannelGroups": dictionaries from names to aggregates
// without options. The order of channels matters to samples and deltas, which keep it.
//
// A driver takes part when its entry has the property "DrvReportLegendPublic". Reading a legend
// stops at the first group that is not a dictionary, and reading a group at the first entry that is
// not an array. An entry without an ID and a type word fails the driver.

inline constexpr std::uint32_t kDrvReportByDriver = 1;  // files channels under their driver
inline constexpr std::uint32_t kDrvReportByGroup = 2;   // and under their group and subgroup
// Tells standard error about each driver that cannot be read.
inline constexpr std::uint32_t kDrvReportLogFailures = 0x80000000;

// An empty aggregate.
Dictionary DrvReportCreateAggregate(std::uint32_t opts);

// The public channels of all drivers; a driver that cannot be read is left out.
std::optional<Dictionary> DrvReportCopyAllChannels(DriverRegistry& registry, std::uint32_t opts,
                                                   std::optional<ErrorValue>* error = nullptr);
// The public channels of one driver; nothing for a handle that is not alive, and for a public
// driver without a legend.
std::optional<Dictionary> DrvReportCopyChannelsForDriver(
    DriverRegistry& registry, RegistryHandle driver, std::uint32_t opts,
    std::optional<ErrorValue>* error = nullptr);
// The channels of all drivers that `match` (see driver_registry.h) selects; one that
// cannot be read fails the whole. nullptr is an error.
std::optional<Dictionary> DrvReportCopyChannelsForDrivers(
    DriverRegistry& registry, const Dictionary* match, std::uint32_t opts,
    std::optional<ErrorValue>* error = nullptr);
// All channels that have a category of the mask (its low 16 bits); of the format (low 8 bits); of
// exactly the unit; of the group, the subgroup or both.
std::optional<Dictionary> DrvReportCopyChannelsInCategories(
    DriverRegistry& registry, std::uint64_t categories, std::uint32_t opts,
    std::optional<ErrorValue>* error = nullptr);
std::optional<Dictionary> DrvReportCopyChannelsOfFormat(DriverRegistry& registry,
                                                        std::uint64_t format, std::uint32_t opts,
                                                        std::optional<ErrorValue>* error = nullptr);
std::optional<Dictionary> DrvReportCopyChannelsWithUnit(DriverRegistry& registry,
                                                        std::uint64_t unit, std::uint32_t opts,
                                                        std::optional<ErrorValue>* error = nullptr);
std::optional<Dictionary> DrvReportCopyChannelsInGroup(DriverRegistry& registry,
                                                       std::optional<std::string_view> group,
                                                       std::optional<std::string_view> subgroup,
                                                       std::uint32_t opts,
                                                       std::optional<ErrorValue>* error = nullptr);
// A channel of the ID for each driver that `match` selects, whether or not it has one: its format
// is 0 until a sample tells. nullptr gives nothing, without an error.
std::optional<Dictionary> DrvReportCopyChannelsWithID(DriverRegistry& registry,
                                                      const Dictionary* match,
                                                      std::uint64_t channelID,
                                                      std::optional<ErrorValue>* error = nullptr);

// Leaves only the channels of the group, the subgroup or both in the aggregate. Bit 0 of the result
// is set on failure; 16 when channels were removed.
int DrvReportSelectChannelsInGroup(Dictionary& aggregate, std::optional<std::string_view> group,
                                   std::optional<std::string_view> subgroup,
                                   std::optional<ErrorValue>* error = nullptr);
// Files every channel of `source` into `destination`, which shares them from then on, by the
// destination's options. 0, or a value with bit 0 set on failure; nullptr and a source that is the
// destination are errors.
int DrvReportMergeChannels(Dictionary* destination, const Dictionary* source,
                           std::optional<ErrorValue>* error = nullptr);
// Adds a channel that the caller describes. DrvReportCreateUnitInfo makes a suitable channel info.
KernelReturn DrvReportAddChannelDescription(
    Dictionary& aggregate, std::uint64_t driverID, std::string_view driverName,
    std::uint64_t channelID, std::uint64_t channelType, std::optional<std::string_view> channelName,
    std::optional<std::string_view> group, std::optional<std::string_view> subgroup,
    const Dictionary* channelInfo, std::optional<ErrorValue>* error = nullptr);

// "name <id 0x12>", which is also the key of the driver's channels; nothing when the registry does
// not tell.
std::optional<std::string> DrvReportCopyDriverName(DriverRegistry& registry, RegistryHandle driver);

// ---- Walking -----------------------------------------------------------------------------------
//
// A walk visits the channels of an aggregate in array order, then those filed under drivers, then
// those under groups, both by name. Callbacks give 0 to go on; a value with bit 0 set ends the walk
// and is its result. Otherwise the result is all their values, ORed; 0x111 when the aggregate is
// malformed. The aggregate must not change meanwhile.

inline constexpr int kDrvReportLeaveOut = 16;
inline constexpr int kDrvReportWalkFailed = 0x111;

int DrvReportIterate(const Dictionary& aggregate, const std::function<int(Dictionary&)>& visit);
// Removes the channels for which `prune` gives 16, once all channels of their array are visited,
// and drivers and groups that have none left.
int DrvReportPrune(Dictionary& aggregate, const std::function<int(Dictionary&)>& prune);
// The number of channels; -1 for a malformed aggregate.
int DrvReportGetChannelCount(const Dictionary& aggregate);

// ---- Subscription and samples ------------------------------------------------------------------

// What a process is interested in, as the hub knows it, and the memory that the hub fills. Ends
// with its last reference; samples outlive it. The registry must outlive the subscription.
class DrvReportSubscription;

// Subscribes to the channels of an aggregate. `subscribed`, which becomes a copy of them (empty
// when copying fails), is what DrvReportCreateSamples takes. `allocator` makes the object, nullptr
// is the default one; `options` is not read. Without channels, or without a hub that takes the
// list, nothing.
std::shared_ptr<DrvReportSubscription> DrvReportCreateSubscription(
    DriverRegistry& registry, std::pmr::memory_resource* allocator, const Dictionary* desired,
    Dictionary* subscribed, std::uint64_t options, std::optional<ErrorValue>* error = nullptr);

// Has the hub fill its memory, and gives the channels with what they report now. A channel that the
// hub does not know is left out. Channels of format 0 learn their type word.
std::optional<Dictionary> DrvReportCreateSamples(DrvReportSubscription* subscription,
                                                 const Dictionary* subscribed,
                                                 std::optional<ErrorValue>* error = nullptr);
// The same from memory that was filled before: runs of records of 64 bytes.
std::optional<Dictionary> DrvReportCreateSamplesRaw(
    const Dictionary* subscribed, std::optional<std::span<const std::byte>> buffer,
    std::optional<ErrorValue>* error = nullptr);

// ---- Values ------------------------------------------------------------------------------------
//
// These read a sample: a channel with its records. An index counts from 0. Failures are results:
// the invalid value, -1 for a count or an index, NaN for a share, nullptr for a name. States and
// buckets are read only when the type word counts as many as the sample has records.

// The value of a simple sample. On success `unit`, when given, receives the channel's unit.
std::int64_t DrvReportSimpleGetIntegerValue(const Dictionary& sample,
                                            std::uint64_t* unit = nullptr);

// Value number `index` of an array sample; a record holds four of them.
std::int64_t DrvReportArrayGetValueAtIndex(const Dictionary& sample, std::int32_t index);

// The number of states that the type word counts, whether or not there are records.
int DrvReportStateGetCount(const Dictionary& sample);
std::int64_t DrvReportStateGetIDForIndex(const Dictionary& sample, std::int32_t index);
// The last state with this ID.
int DrvReportStateGetIndexForID(const Dictionary& sample, std::uint64_t id);
// The state's ID as text; owned by the sample. The names of all states are kept in the sample on
// the first call ("StateNames"); when the ID of one state does not print, none has a name.
const std::string* DrvReportStateGetNameForIndex(Dictionary& sample, std::int32_t index);
// How often the state was entered.
std::int64_t DrvReportStateGetInTransitions(const Dictionary& sample, std::int32_t index);
// The time spent in the state, in the channel's unit.
std::int64_t DrvReportStateGetResidency(const Dictionary& sample, std::int32_t index);
// The state's share of the residencies of all states, 0 to 1; NaN when they add up to 0. Adds up
// all states on every call.
double DrvReportStateGetDutyCycle(const Dictionary& sample, std::int32_t index);
// The state that was updated last (of several with the same time stamp the first); -1 when no state
// has a time stamp.
int DrvReportStateGetCurrent(const Dictionary& sample);

// The number of buckets that the type word counts, whether or not there are records.
int DrvReportHistogramGetBucketCount(const Dictionary& sample);
std::int64_t DrvReportHistogramGetBucketHits(const Dictionary& sample, std::int32_t index);
// The smallest and the largest value and the sum of all values that hit the bucket.
std::int64_t DrvReportHistogramGetBucketMinValue(const Dictionary& sample, std::int32_t index);
std::int64_t DrvReportHistogramGetBucketMaxValue(const Dictionary& sample, std::int32_t index);
std::int64_t DrvReportHistogramGetBucketSum(const Dictionary& sample, std::int32_t index);
// The smallest and the largest value of the whole histogram: of its first and its last bucket with
// hits. The invalid value when nothing was hit.
std::int64_t DrvReportHistogramGetMinValue(const Dictionary& sample);
std::int64_t DrvReportHistogramGetMaxValue(const Dictionary& sample);
// The values that a bucket takes are above `lower` and up to `upper`; either may be nullptr. Any
// channel with a histogram type and a bucket configuration will do. The bounds are computed on the
// first call and kept in the channel ("ProcessedChannelConfig"). kKernelError, and nothing written,
// when the configuration is missing, describes more buckets than the type word counts or bounds
// that do not grow, or when there is no such bound: a configuration may leave the last buckets
// without bounds, the first of them has a lower bound only.
KernelReturn DrvReportHistogramGetBucketBounds(Dictionary& channel, std::int32_t index,
                                               std::int64_t* lower, std::int64_t* upper);

// ---- Deltas ------------------------------------------------------------------------------------
//
// A delta has the shape of a sample and is read by the same operations. Its values are the later
// ones minus the earlier ones, modulo 2^64, except: state IDs, bucket minimum and maximum are the
// later sample's; a bucket without new hits has the invalid value for its sum; an array value that
// is invalid on one side is the other side's. The samples are not changed.

// The difference of two samples of one channel; nothing on failure. `error` then holds
//   kKernelBadArgument        a format is not known, or "mismatched formats"
//   kDrvReportUnknownFormat   "unknown report format"
//   kKernelError              a simple value cannot be read
//   1                         the samples have different numbers of records, a record does not
//                             agree with the type word, or a value is invalid
std::optional<Dictionary> DrvReportSampleCreateDelta(const Dictionary& earlier,
                                                     const Dictionary& later,
                                                     std::optional<ErrorValue>* error = nullptr);

// The same for all channels of two samples aggregates, in the order of the later one: channels are
// paired by driver ID, channel ID and type word. A channel that only the later side has keeps its
// totals, one that only the earlier side has is left out. Nothing when a pair fails (`error` is
// that of the last one) or when the aggregates differ in structure (`error` is left alone).
std::optional<Dictionary> DrvReportCreateSamplesDelta(const Dictionary& earlierSamples,
                                                      const Dictionary& laterSamples,
                                                      std::optional<ErrorValue>* error = nullptr);

// ---- Units and descriptions --------------------------------------------------------------------
//
// A unit is 64 bits: quantity (63-56: 1 s, 2 W, 3 J, 4 A, 5 V, 6 F, 7 H, 8 Hz, 9 bits, 10 C, 100
// events, 101 packets), hardware-relative code (55-48: 1 ticks, 2 pages), binary and decimal
// exponent bytes (47-40, 39-32: 0 none, else exponent + 127), multiplier direction (31: 1 divides)
// and multiplier (30-0: 0 means 1). Microseconds are 0x0100007900000000, bytes 0x0900820000000000.
// The invalid value is no unit.

// "us", "KiB", "packets"; nullptr for a channel without unit. Made once and kept in the channel
// ("UnitLabel"), which owns it.
const std::string* DrvReportChannelGetUnitLabel(Dictionary& channel);

// `value` in the unit `to`. NaN for different quantities and for hardware-relative units; infinite
// or NaN where a factor does not fit 64 bits.
double DrvReportScaleValue(std::uint64_t value, std::uint64_t from, std::uint64_t to);

// A channel info {"DrvReportChannelUnit": unit}.
Dictionary DrvReportCreateUnitInfo(std::uint64_t unit);

// One line with a line end: driver, name, ID, unit, group, categories, format and elements, after
// `prefix`. What is missing prints as "(null)", a missing group as "(none)". Names are put in as
// they are, control bytes and all: escape the text before a terminal sees it. Nothing when the type
// word cannot be read. `options` is not read.
std::optional<std::string> DrvReportChannelCopyDescription(Dictionary& channel,
                                                           std::uint64_t options = 0,
                                                           std::string_view prefix = {});

// One line for each record of a sample, as above; an array sample is not described. Nothing when
// there are no records of the channel's format, when a bucket or its bounds cannot be read, or when
// the text would be longer than 64 MiB.
std::optional<std::string> DrvReportSampleCopyDescription(Dictionary& sample,
                                                          std::uint64_t options = 0,
                                                          std::string_view prefix = {});

// "name <pid 123>" of this process.
std::string DrvReportCopyCurrentProcessName();

// Writes the text, without a terminator, in one write that is not repeated: a signal fails it, a
// full pipe may cut it. nullptr gives kKernelBadArgument, a text that is not UTF-8 kKernelNoMemory,
// a failed write kDrvReportWriteFailed and a short one kDrvReportWriteShort.
KernelReturn DrvReportWriteStringUTF8(int fd, const std::string* text);

}  // namespace quorlet

#endif  // DRVREPORT_DRVREPORT_H_
