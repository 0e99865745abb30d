// What a channel is made of, for the library's own files.
#ifndef QUORLET_CHANNELS_CHANNEL_H_
#define QUORLET_CHANNELS_CHANNEL_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "drvreport/drvreport.h"
#include "platform/report_records.h"

namespace quorlet {

inline constexpr std::string_view kDriverIDKey = "DriverID";
inline constexpr std::string_view kDriverNameKey = "DriverName";
inline constexpr std::string_view kLegendChannelKey = "LegendChannel";
inline constexpr std::string_view kGroupNameKey = "DrvReportGroupName";
inline constexpr std::string_view kSubGroupNameKey = "DrvReportSubGroupName";
inline constexpr std::string_view kChannelInfoKey = "DrvReportChannelInfo";
inline constexpr std::string_view kRawElementsKey = "RawElements";
inline constexpr std::string_view kQueryOptsKey = "QueryOpts";
inline constexpr std::string_view kChannelsKey = "DrvReportChannels";
inline constexpr std::string_view kDriversKey = "DrvReportDrivers";
inline constexpr std::string_view kGroupsKey = "DrvReportChannelGroups";

// kKernelError, and nothing written, when the channel has no type word that is a number.
KernelReturn getChannelType(const Dictionary& channel, std::uint64_t& type);
// Replaces the type word in the legend entry, which copies of the channel share.
KernelReturn setChannelType(Dictionary& channel, std::uint64_t type);

// The histogram's bucket configuration, or nullptr.
const Data* getChannelConfig(const Dictionary& channel);

// The bytes of the ID from the highest on, without those that are 0; nothing when one of them does
// not print, or none is left.
std::optional<std::string> _copyPrintableIDString(std::uint64_t id);

// The sample's records and their number, when the first one is of the format; else nullptr.
const std::byte* getRawElements(const Dictionary& sample, std::uint16_t& count,
                                std::uint8_t format);
std::byte* getRawElements(Dictionary& sample, std::uint16_t& count, std::uint8_t format);

// An error with the code; without a reason, a text that says that there was none. Nothing for a
// reason that is not ASCII.
std::optional<ErrorValue> createErr(KernelReturn code, std::optional<std::string_view> reason = {});
// The same, handed to whoever asked for errors.
void storeErr(std::optional<ErrorValue>* error, KernelReturn code,
              std::optional<std::string_view> reason = {});
// One line on standard error, when `opts` asks for it.
void drvErrLog(std::uint32_t opts, const std::optional<std::string>& name,
               const std::optional<ErrorValue>& error);

}  // namespace quorlet

#endif  // QUORLET_CHANNELS_CHANNEL_H_
