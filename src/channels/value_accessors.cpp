// Values of simple, array and state samples.
#include "channels/value_accessors.h"

#include <limits>
#include <span>
#include <string_view>
#include <utility>

namespace quorlet {
namespace {

std::optional<ElementValues> StateAt(const Dictionary& sample, std::int32_t index) {
  ElementValues values;
  if (_getStateElement(sample, index, values) != kKernelSuccess) return std::nullopt;
  return values;
}

KernelReturn GetElement(const Dictionary& sample, std::uint8_t format, std::int32_t index,
                        ElementValues& values) {
  const auto run = ElementRun::Counted(sample, format);
  if (!run || index < 0 || std::cmp_greater_equal(index, run->count())) return kKernelError;
  values = run->values(static_cast<std::size_t>(index));
  return kKernelSuccess;
}

// Nothing when one state has no printable ID.
std::optional<Array> MakeStateNames(const Dictionary& sample) {
  Array names;
  const int count = DrvReportStateGetCount(sample);
  if (count <= 0) return names;
  const auto run = ElementRun::Counted(sample, kDrvReportFormatState);
  if (!run) return std::nullopt;
  for (std::size_t i = 0; i < run->count(); ++i) {
    auto name = _copyPrintableIDString(static_cast<std::uint64_t>(run->values(i)[0]));
    if (!name) return std::nullopt;
    names.push_back(*std::move(name));
  }
  return names;
}

}  // namespace

std::optional<ElementRun> ElementRun::Of(const Dictionary& sample, std::uint8_t format) {
  std::uint16_t count = 0;
  const std::byte* records = getRawElements(sample, count, format);
  if (records == nullptr) return std::nullopt;
  return ElementRun(records, count);
}

std::optional<ElementRun> ElementRun::Counted(const Dictionary& sample, std::uint8_t format) {
  const auto run = Of(sample, format);
  std::uint64_t type = 0;
  if (!run || getChannelType(sample, type) != kKernelSuccess || formatOfType(type) != format ||
      elementCountOfType(type) != run->count()) {
    return std::nullopt;
  }
  return run;
}

ByteReader ElementRun::at(std::size_t index, std::size_t offset) const {
  return ByteReader(std::span(records_ + index * kRawElementSize, kRawElementSize).subspan(offset));
}

ElementValues ElementRun::values(std::size_t index) const {
  ByteReader reader = at(index, kRawElementValuesOffset);
  ElementValues values;
  for (std::int64_t& value : values) {
    value = static_cast<std::int64_t>(reader.little<std::uint64_t>());
  }
  return values;
}

std::uint64_t ElementRun::channelID(std::size_t index) const {
  return at(index, kRawElementChannelOffset).little<std::uint64_t>();
}

std::uint64_t ElementRun::updateTime(std::size_t index) const {
  return at(index, kRawElementTimeOffset).little<std::uint64_t>();
}

KernelReturn _getStateElement(const Dictionary& sample, std::int32_t index, ElementValues& values) {
  return GetElement(sample, kDrvReportFormatState, index, values);
}

KernelReturn _getHistogramElement(const Dictionary& sample, std::int32_t index,
                                  ElementValues& values) {
  return GetElement(sample, kDrvReportFormatHistogram, index, values);
}

std::int64_t DrvReportSimpleGetIntegerValue(const Dictionary& sample, std::uint64_t* unit) {
  const auto run = ElementRun::Of(sample, kDrvReportFormatSimple);
  if (!run || run->count() != 1) return kDrvReportInvalidValue;
  if (unit != nullptr) *unit = DrvReportChannelGetUnit(sample);
  return run->values(0)[0];
}

std::int64_t DrvReportArrayGetValueAtIndex(const Dictionary& sample, std::int32_t index) {
  if (index < 0) return kDrvReportInvalidValue;
  const auto run = ElementRun::Of(sample, kDrvReportFormatArray);
  const auto at = static_cast<std::size_t>(index);
  if (!run || at / 4 >= run->count()) return kDrvReportInvalidValue;
  return run->values(at / 4)[at % 4];
}

int DrvReportStateGetCount(const Dictionary& sample) {
  std::uint64_t type = 0;
  if (getChannelType(sample, type) != kKernelSuccess ||
      formatOfType(type) != kDrvReportFormatState) {
    return -1;
  }
  return elementCountOfType(type);
}

std::int64_t DrvReportStateGetIDForIndex(const Dictionary& sample, std::int32_t index) {
  const auto state = StateAt(sample, index);
  return state ? (*state)[0] : kDrvReportInvalidValue;
}

int DrvReportStateGetIndexForID(const Dictionary& sample, std::uint64_t id) {
  const int count = DrvReportStateGetCount(sample);
  if (count < 1) return -1;
  const auto wanted = static_cast<std::int64_t>(id);
  const auto run = ElementRun::Counted(sample, kDrvReportFormatState);
  // Every state that cannot be read has the invalid value for its ID.
  if (!run) return wanted == kDrvReportInvalidValue ? count - 1 : -1;
  for (int i = count - 1; i >= 0; --i) {
    if (run->values(static_cast<std::size_t>(i))[0] == wanted) return i;
  }
  return -1;
}

const Array* getStateNames(Dictionary& sample) {
  constexpr std::string_view kStateNames = "StateNames";
  if (const PropertyValue* kept = sample.find(kStateNames)) return kept->asArray();
  auto names = MakeStateNames(sample);
  if (!names) return nullptr;
  sample[kStateNames] = *std::move(names);
  return ArrayEntry(sample, kStateNames);
}

const std::string* DrvReportStateGetNameForIndex(Dictionary& sample, std::int32_t index) {
  const Array* names = getStateNames(sample);
  if (names == nullptr || index < 0 || std::cmp_greater_equal(index, names->size())) return nullptr;
  return (*names)[static_cast<std::size_t>(index)].asString();
}

std::int64_t DrvReportStateGetInTransitions(const Dictionary& sample, std::int32_t index) {
  const auto state = StateAt(sample, index);
  return state ? (*state)[1] : kDrvReportInvalidValue;
}

std::int64_t DrvReportStateGetResidency(const Dictionary& sample, std::int32_t index) {
  const auto state = StateAt(sample, index);
  return state ? (*state)[2] : kDrvReportInvalidValue;
}

std::optional<std::uint64_t> sumOfResidencies(const Dictionary& sample) {
  const auto run = ElementRun::Counted(sample, kDrvReportFormatState);
  if (!run) return std::nullopt;
  std::uint64_t sum = 0;
  for (std::size_t i = 0; i < run->count(); ++i) {
    sum += static_cast<std::uint64_t>(run->values(i)[2]);
  }
  return sum;
}

double dutyCycle(std::int64_t residency, std::optional<std::uint64_t> sum) {
  if (sum.value_or(0) == 0) return std::numeric_limits<double>::quiet_NaN();
  return static_cast<double>(static_cast<std::uint64_t>(residency)) / static_cast<double>(*sum);
}

double DrvReportStateGetDutyCycle(const Dictionary& sample, std::int32_t index) {
  const auto state = StateAt(sample, index);
  return state ? dutyCycle((*state)[2], sumOfResidencies(sample))
               : std::numeric_limits<double>::quiet_NaN();
}

int DrvReportStateGetCurrent(const Dictionary& sample) {
  const auto run = ElementRun::Counted(sample, kDrvReportFormatState);
  if (!run) return -1;
  int current = -1;
  std::uint64_t latest = 0;
  for (std::size_t i = 0; i < run->count(); ++i) {
    const std::uint64_t time = run->updateTime(i);
    if (time <= latest) continue;
    latest = time;
    current = static_cast<int>(i);
  }
  return current;
}

}  // namespace quorlet
