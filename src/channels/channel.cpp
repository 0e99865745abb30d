// Channels as value trees: their getters, their records, and the library's errors.
#include "channels/channel.h"

#include <algorithm>
#include <cstdio>
#include <utility>

namespace quorlet {
namespace {

constexpr std::string_view kChannelNameKey = "ChannelName";
constexpr char kErrorDomain[] = "KernelReturn";

bool IsPrintable(unsigned char byte) { return byte >= 0x20 && byte <= 0x7E; }

// A number of the legend entry, or nullptr.
const Number* LegendNumber(const Dictionary& channel, std::size_t index) {
  const Array* legend = ArrayEntry(channel, kLegendChannelKey);
  return legend != nullptr && index < legend->size() ? (*legend)[index].asNumber() : nullptr;
}

// Numbers are 64 bits here, whether they were written signed or unsigned.
std::uint64_t Bits(const Number& number) {
  return number.kind() == NumberKind::kUInt64 ? number.toUInt64()
                                              : static_cast<std::uint64_t>(number.toInt64());
}

const std::byte* FindRawElements(const Data* data, std::uint16_t& count, std::uint8_t format) {
  if (data == nullptr || data->size() < kRawElementSize ||
      std::to_integer<std::uint8_t>((*data)[kRawElementTypeOffset]) != format) {
    return nullptr;
  }
  count = static_cast<std::uint16_t>(data->size() / kRawElementSize);
  return data->data();
}

}  // namespace

std::int64_t DrvReportChannelGetDriverID(const Dictionary& channel) {
  const PropertyValue* value = channel.find(kDriverIDKey);
  const Number* number = value != nullptr ? value->asNumber() : nullptr;
  return number != nullptr ? static_cast<std::int64_t>(Bits(*number)) : kDrvReportInvalidValue;
}

std::int64_t DrvReportChannelGetChannelID(const Dictionary& channel) {
  const Number* number = LegendNumber(channel, 0);
  return number != nullptr ? static_cast<std::int64_t>(Bits(*number)) : kDrvReportInvalidValue;
}

KernelReturn getChannelType(const Dictionary& channel, std::uint64_t& type) {
  const Number* number = LegendNumber(channel, 1);
  if (number == nullptr) return kKernelError;
  type = Bits(*number);
  return kKernelSuccess;
}

KernelReturn setChannelType(Dictionary& channel, std::uint64_t type) {
  PropertyValue* value = channel.find(kLegendChannelKey);
  Array* legend = value != nullptr ? value->asArray() : nullptr;
  if (legend == nullptr || legend->size() < 2) return kKernelError;
  (*legend)[1] = Int64(static_cast<std::int64_t>(type));
  return kKernelSuccess;
}

std::uint8_t DrvReportChannelGetFormat(const Dictionary& channel) {
  std::uint64_t type = 0;
  return getChannelType(channel, type) == kKernelSuccess ? formatOfType(type)
                                                         : kDrvReportFormatUnknown;
}

std::uint16_t DrvReportChannelGetCategories(const Dictionary& channel) {
  std::uint64_t type = 0;
  return getChannelType(channel, type) == kKernelSuccess ? categoriesOfType(type) : 0xFFFF;
}

std::uint16_t DrvReportChannelGetElementCount(const Dictionary& channel) {
  std::uint64_t type = 0;
  return getChannelType(channel, type) == kKernelSuccess ? elementCountOfType(type)
                                                         : std::uint16_t{0};
}

std::uint16_t DrvReportSampleGetElementCount(const Dictionary& sample) {
  const Data* records = DataEntry(sample, kRawElementsKey);
  const std::size_t count = records != nullptr ? records->size() / kRawElementSize : 0;
  return static_cast<std::uint16_t>(std::min(count, kMaxElementCount));
}

const std::string* DrvReportChannelGetGroup(const Dictionary& channel) {
  return StringEntry(channel, kGroupNameKey);
}

const std::string* DrvReportChannelGetSubGroup(const Dictionary& channel) {
  return StringEntry(channel, kSubGroupNameKey);
}

const std::string* DrvReportChannelGetDriverName(const Dictionary& channel) {
  return StringEntry(channel, kDriverNameKey);
}

std::uint64_t DrvReportChannelGetUnit(const Dictionary& channel) {
  const Dictionary* info = DictionaryEntry(channel, kChannelInfoKey);
  const PropertyValue* unit = info != nullptr ? info->find("DrvReportChannelUnit") : nullptr;
  const Number* number = unit != nullptr ? unit->asNumber() : nullptr;
  return number != nullptr ? Bits(*number) : static_cast<std::uint64_t>(kDrvReportInvalidValue);
}

const Data* getChannelConfig(const Dictionary& channel) {
  const Dictionary* info = DictionaryEntry(channel, kChannelInfoKey);
  return info != nullptr ? DataEntry(*info, "DrvReportChannelConfig") : nullptr;
}

const std::string* DrvReportChannelGetChannelName(Dictionary& channel) {
  if (const PropertyValue* kept = channel.find(kChannelNameKey)) return kept->asString();
  const Array* legend = ArrayEntry(channel, kLegendChannelKey);
  const std::string* given =
      legend != nullptr && legend->size() > 2 ? (*legend)[2].asString() : nullptr;
  const auto name = given != nullptr ? std::optional(*given)
                                     : _copyPrintableIDString(static_cast<std::uint64_t>(
                                           DrvReportChannelGetChannelID(channel)));
  if (!name) return nullptr;
  channel[kChannelNameKey] = *name;
  return StringEntry(channel, kChannelNameKey);
}

std::optional<std::string> _copyPrintableIDString(std::uint64_t id) {
  std::string text;
  for (int shift = 56; shift >= 0; shift -= 8) {
    const auto byte = static_cast<unsigned char>((id >> shift) & 0xFF);
    if (byte == 0) continue;
    if (!IsPrintable(byte)) return std::nullopt;
    text += static_cast<char>(byte);
  }
  return text.empty() ? std::nullopt : std::optional(text);
}

const std::byte* getRawElements(const Dictionary& sample, std::uint16_t& count,
                                std::uint8_t format) {
  return FindRawElements(DataEntry(sample, kRawElementsKey), count, format);
}

std::byte* getRawElements(Dictionary& sample, std::uint16_t& count, std::uint8_t format) {
  // The sample may be written to, and so may what is in it.
  return const_cast<std::byte*>(getRawElements(std::as_const(sample), count, format));
}

std::optional<ErrorValue> createErr(KernelReturn code, std::optional<std::string_view> reason) {
  const std::string_view text = reason.value_or("createErr() passed a NULL string!");
  const bool isAscii =
      std::ranges::all_of(text, [](char c) { return static_cast<unsigned char>(c) < 0x80; });
  if (!isAscii) return std::nullopt;
  return ErrorValue{kErrorDomain, static_cast<std::int32_t>(code), std::string(text)};
}

void storeErr(std::optional<ErrorValue>* error, KernelReturn code,
              std::optional<std::string_view> reason) {
  if (error != nullptr) *error = createErr(code, reason);
}

void drvErrLog(std::uint32_t opts, const std::optional<std::string>& name,
               const std::optional<ErrorValue>& error) {
  if ((opts & kDrvReportLogFailures) == 0) return;
  std::string line = name.value_or("<unknown> function") + ": ";
  line += error ? error->reason : "<unknown> error";
  // The name is the driver's: it stays one line, and controls no terminal.
  std::ranges::replace_if(
      line, [](char c) { return !IsPrintable(static_cast<unsigned char>(c)); }, '?');
  line += '\n';
  std::fwrite(line.data(), 1, line.size(), stderr);
}

}  // namespace quorlet
