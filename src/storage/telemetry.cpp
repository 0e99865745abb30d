// A telemetry list for B channels: 4096 bytes of raw counters for each channel, then a summary of
// 32 bytes for each, of which seven little-endian u32 words are reported.
#include "storage/telemetry.h"

#include <algorithm>
#include <cstdio>
#include <optional>
#include <string>

#include "storage/nand_info.h"
#include "storage/telemetry_word_maps.h"
#include "values/byte_reader.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr std::int32_t kStructuredLogType = 176;
constexpr std::size_t kChipIdBuffer = 64;  // with a terminator

constexpr std::size_t kRawSize = kRawCounterWords * sizeof(std::uint32_t);
constexpr std::size_t kSummarySize = 32;
constexpr std::array<std::string_view, 7> kSummaryKeys{"RD",  "PE",         "Max_PE_rate", "t0",
                                                       "Ret", "block_type", "num_pages"};

enum Generation : std::uint8_t { kOlder, kK3A, kK4A };
constexpr std::size_t kGenerations = 3;

// Counters that are reported as "name[0]", "name[1]" and so on.
struct CounterGroup {
  std::string_view name;
  std::uint8_t firstWord;
  std::array<std::uint8_t, kGenerations> count;
};

// clang-format off
constexpr auto kCounterGroups = std::to_array<CounterGroup>({
    {"readStage", 0, {23, 23, 33}},
    {"initialReadStage", 33, {23, 23, 23}},
    {"nandStageOfLife", 56, {8, 8, 8}},
    {"dspExceptionParameter", 65, {12, 12, 38}},
    {"readStage18NumOfErrorsBin", 103, {12, 12, 12}},
    {"readStage9NumOfErrorsBin", 115, {10, 10, 10}},
    {"readStage10NumOfErrorsBin", 125, {10, 10, 10}},
    {"readStage17NumOfErrorsBin", 135, {10, 10, 10}},
    {"readStage19NumOfErrorsBin", 145, {12, 12, 12}},
    {"algoNANDAccessesBin", 157, {0, 8, 0}},
    {"retentionIndication", 165, {0, 0, 12}},
});
// clang-format on
static_assert([] {
  std::size_t next = 0;
  for (const CounterGroup& group : kCounterGroups) {
    if (group.firstWord < next) return false;
    next = std::size_t{group.firstWord} + std::ranges::max(group.count);
  }
  return next == kCountersRecordWords;
}());

using CounterParser = void (*)(RawCounters, CountersRecord&);

// What the characteristics say about the device.
struct Device {
  Generation generation = kOlder;
  CounterParser parser = nullptr;
  std::size_t channels = 0;
};

void Fill(CountersRecord& record, RawCounters raw, std::span<const WordRun> map) {
  for (const WordRun& run : map) {
    ByteReader reader(raw.subspan(run.raw * sizeof(std::uint32_t)));
    for (std::size_t i = 0; i < run.count; ++i) {
      record[run.record + i] = reader.little<std::uint32_t>();
    }
  }
}

std::optional<Generation> ReadGeneration(StandardError& errors, const Dictionary& characteristics) {
  constexpr char kKey[] = "chip-id";
  const PropertyValue* value = characteristics.find(kKey);
  if (value == nullptr) {
    errors.write(FormatText("ERROR: Could not determine the %s\n", kKey));
    return std::nullopt;
  }
  const std::string* chip = value->asString();
  if (chip == nullptr) {
    errors.write(FormatText("ERROR: %s is not stored as a PropStringTypeID\n", kKey));
    return std::nullopt;
  }
  if (chip->size() >= kChipIdBuffer) {
    errors.write(
        FormatText("ERROR: Unable to obtain %s as conversion from the UniChar contents of "
                   "PropString failed, or the buffer of %d bytes is too small\n",
                   kKey, kChipIdBuffer));
    return std::nullopt;
  }
  return *chip == "K3A" ? kK3A : *chip == "K4A" ? kK4A : kOlder;
}

// The vendor key: the first four digits above 32 bits, then up to eight more whose last byte does
// not count.
std::optional<std::uint64_t> ReadVendorKey(StandardError& errors,
                                           const Dictionary& characteristics) {
  constexpr char kKey[] = "manufacturer-id";
  constexpr std::size_t kHighDigits = 4;
  const PropertyValue* value = characteristics.find(kKey);
  if (value == nullptr) {
    errors.write(FormatText("ERROR: Could not determine the %s\n", kKey));
    return std::nullopt;
  }
  const std::string* text = value->asString();
  if (text == nullptr) {
    errors.write(FormatText("ERROR: %s is NULL\n", kKey));
    return std::nullopt;
  }
  // Only plain text can be read as it is stored.
  if (PrintableAsciiPrefix(*text) != text->size()) {
    errors.write(FormatText("ERROR: %s is not stored as a PropStringTypeID\n", kKey));
    return std::nullopt;
  }
  const std::string_view digits = *text;
  const std::uint64_t high = hexStringToInt32(digits.substr(0, kHighDigits));
  const std::uint64_t low = hexStringToInt32(digits.substr(std::min(kHighDigits, digits.size())));
  return (high << 32) | (low & ~std::uint64_t{0xFF});
}

CounterParser ChooseParser(Generation generation, std::uint64_t vendorKey) {
  switch (generation) {
    case kK4A:
      return parseCountersAlgoGenericK4;
    case kK3A:
      return parseCountersAlgoGeneric;
    case kOlder:
      break;
  }
  switch (vendorKey) {
    case 0x4582603A5700:
    case 0x458260DE5700:
      return parseCounters1xSandisk;
    case 0xAD8252232100:
      return parseCounters1xHynix;
    default:
      return parseCounters1y;
  }
}

std::optional<Device> ReadDevice(StandardError& errors, const Dictionary& characteristics,
                                 std::size_t length) {
  const auto generation = ReadGeneration(errors, characteristics);
  if (!generation) return std::nullopt;
  const auto vendorKey = ReadVendorKey(errors, characteristics);
  if (!vendorKey) return std::nullopt;
  const auto channels = IntegerEntry(characteristics, "num-bus");
  if (!channels) {
    errors.write("ERROR: could not determine the number of channels\n");
    return std::nullopt;
  }
  // A negative number is a huge one here.
  if (static_cast<std::uint64_t>(*channels) > length / (kRawSize + kSummarySize)) {
    errors.write("ERROR: Attempting to parse beyond the bounds of the buffer\n");
    return std::nullopt;
  }
  return Device{*generation, ChooseParser(*generation, *vendorKey),
                static_cast<std::size_t>(*channels)};
}

// Every counter as a 32-bit number.
Dictionary ChannelEntry(StandardError& errors, std::span<const std::byte> summary,
                        const CountersRecord& record, Generation generation) {
  Dictionary entry;
  ByteReader reader(summary);
  for (const std::string_view key : kSummaryKeys) {
    SetNumberValue(errors, entry, key, static_cast<std::int32_t>(reader.little<std::uint32_t>()));
  }
  for (const CounterGroup& group : kCounterGroups) {
    for (std::size_t i = 0; i < group.count[generation]; ++i) {
      SetNumberValue(errors, entry, FormatText("%s[%d]", group.name, i),
                     static_cast<std::int32_t>(record[group.firstWord + i]));
    }
  }
  return entry;
}

char LowerCase(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }

}  // namespace

bool LogTelemetryList(CrashSupport& crashSupport, StandardError& errors,
                      std::span<const std::byte> buffer, const PropertyValue& characteristics) {
  const Dictionary* dictionary = characteristics.asDictionary();
  if (dictionary == nullptr) {
    errors.write("ERROR: Could not parse the Device Characteristics dictionary\n");
    return false;
  }
  const auto device = ReadDevice(errors, *dictionary, buffer.size());
  if (!device) return false;
  const auto summaries = buffer.subspan(device->channels * kRawSize);
  for (std::size_t channel = 0; channel < device->channels; ++channel) {
    CountersRecord record{};
    device->parser(buffer.subspan(channel * kRawSize).first<kRawSize>(), record);
    const auto summary = summaries.subspan(channel * kSummarySize, kSummarySize);
    crashSupport.FSLogStructuredData(kStructuredLogType,
                                     ChannelEntry(errors, summary, record, device->generation));
  }
  return true;
}

void parseCountersAlgoGenericK4(RawCounters raw, CountersRecord& record) {
  Fill(record, raw, kAlgoGenericK4WordMap);
}

void parseCountersAlgoGeneric(RawCounters raw, CountersRecord& record) {
  Fill(record, raw, kAlgoGenericWordMap);
}

void parseCounters1xSandisk(RawCounters raw, CountersRecord& record) {
  Fill(record, raw, k1xSandiskWordMap);
}

void parseCounters1xHynix(RawCounters raw, CountersRecord& record) {
  Fill(record, raw, k1xHynixWordMap);
}

void parseCounters1y(RawCounters raw, CountersRecord& record) { Fill(record, raw, k1yWordMap); }

std::uint8_t hexStringToByte(std::string_view text) {
  unsigned value = 0;
  for (const char c : text.substr(0, 2)) {
    value <<= 4;
    if (c >= '0' && c <= '9') {
      value += static_cast<unsigned>(c - '0');
    } else if (const char lower = LowerCase(c); lower >= 'a' && lower <= 'f') {
      value += static_cast<unsigned>(lower - 'a' + 10);
    } else {
      std::printf("unrecognized hex character: %c", c);
    }
  }
  return static_cast<std::uint8_t>(value);
}

std::uint32_t hexStringToInt32(std::string_view text) {
  const std::string_view digits = text.substr(0, 8);
  std::uint32_t value = 0;
  for (std::size_t i = 0; i < digits.size(); i += 2) {
    value = (value << 8) | hexStringToByte(digits.substr(i));
  }
  return value;
}

}  // namespace quorlet
