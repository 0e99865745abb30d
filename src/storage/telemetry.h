// The storage controller's telemetry lists: raw counters of each NAND channel, whose layout depends
// on the controller and on who made the NAND, as one structured log record a channel.
#ifndef QUORLET_STORAGE_TELEMETRY_H_
#define QUORLET_STORAGE_TELEMETRY_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

#include "drvreport/property_value.h"
#include "platform/crash_support.h"
#include "platform/standard_error.h"

namespace quorlet {

inline constexpr std::size_t kCountersRecordWords = 177;
inline constexpr std::size_t kRawCounterWords = 1024;

// The counters of one channel in an order that no longer depends on the device.
using CountersRecord = std::array<std::uint32_t, kCountersRecordWords>;
// The counters as the controller exports them: little-endian u32 words.
using RawCounters = std::span<const std::byte, kRawCounterWords * sizeof(std::uint32_t)>;

// The handler of each telemetry list. `characteristics` is the dictionary that tells the controller
// ("chip-id"), the NAND's maker ("manufacturer-id") and the number of channels ("num-bus"). False,
// with a message on standard error and nothing logged, when one of them is missing or odd or the
// buffer is too short for the channels.
bool LogTelemetryList(CrashSupport& crashSupport, StandardError& errors,
                      std::span<const std::byte> buffer, const PropertyValue& characteristics);

// Fill a record from one channel's raw counters; words that the layout lacks stay as they are.
void parseCountersAlgoGenericK4(RawCounters raw, CountersRecord& record);
void parseCountersAlgoGeneric(RawCounters raw, CountersRecord& record);
void parseCounters1xSandisk(RawCounters raw, CountersRecord& record);
void parseCounters1xHynix(RawCounters raw, CountersRecord& record);
void parseCounters1y(RawCounters raw, CountersRecord& record);

// The value of the first two hexadecimal digits; a warning on standard output for each character
// that is none and counts as 0.
std::uint8_t hexStringToByte(std::string_view text);
// The first eight characters, two at a time from the left: "4582603A" is 0x4582603A. A last
// character without a partner is the lowest byte by itself: "ABC" is 0xAB0C.
std::uint32_t hexStringToInt32(std::string_view text);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_TELEMETRY_H_
