// Differences of samples: record by record, and channel by channel of two samples aggregates.
#include "channels/deltas.h"

#include <cstring>
#include <span>
#include <string_view>
#include <utility>

#include "channels/value_accessors.h"
#include "channels/walk.h"
#include "values/byte_writer.h"

namespace quorlet {
namespace {

constexpr KernelReturn kElementsDisagree = 1;

// Counters wrap, and so do their differences.
std::int64_t Difference(std::int64_t later, std::int64_t earlier) {
  return static_cast<std::int64_t>(static_cast<std::uint64_t>(later) -
                                   static_cast<std::uint64_t>(earlier));
}

bool IsInvalid(std::int64_t value) { return value == kDrvReportInvalidValue; }

// The records of a delta, written in place.
class ResultRun {
 public:
  static std::optional<ResultRun> Of(Dictionary& result, std::uint8_t format) {
    std::uint16_t count = 0;
    std::byte* records = getRawElements(result, count, format);
    if (records == nullptr) return std::nullopt;
    return ResultRun(std::span(records, std::size_t{count} * kRawElementSize));
  }

  std::size_t count() const { return records_.size() / kRawElementSize; }

  // Takes over the later sample's records whole; false when they are not as many.
  bool copyFrom(const Dictionary& later, std::uint8_t format) {
    std::uint16_t count = 0;
    const std::byte* records = getRawElements(later, count, format);
    if (records == nullptr || count != this->count()) return false;
    std::memcpy(records_.data(), records, records_.size());
    return true;
  }

  void set(std::size_t index, const ElementValues& values) {
    std::byte* slot = records_.data() + index * kRawElementSize + kRawElementValuesOffset;
    for (const std::int64_t value : values) {
      WriteLittle(static_cast<std::uint64_t>(value), std::span(slot, sizeof value));
      slot += sizeof value;
    }
  }

 private:
  explicit ResultRun(std::span<std::byte> records) : records_(records) {}
  std::span<std::byte> records_;
};

KernelReturn SimpleDelta(const Dictionary& earlier, const Dictionary& later, Dictionary& result) {
  const std::int64_t before = DrvReportSimpleGetIntegerValue(earlier);
  const std::int64_t after = DrvReportSimpleGetIntegerValue(later);
  auto records = ResultRun::Of(result, kDrvReportFormatSimple);
  if (IsInvalid(before) || IsInvalid(after) || !records || records->count() != 1) {
    return kKernelError;
  }
  ElementValues values = ElementRun::Of(result, kDrvReportFormatSimple)->values(0);
  values[0] = Difference(after, before);
  records->set(0, values);
  return kKernelSuccess;
}

// What happened between two readings of one state; nothing when it cannot be known.
std::optional<ElementValues> SubtractState(const ElementValues& old, const ElementValues& now) {
  if (IsInvalid(old[1]) || IsInvalid(now[1]) || IsInvalid(old[2]) || IsInvalid(now[2])) {
    return std::nullopt;
  }
  return ElementValues{now[0], Difference(now[1], old[1]), Difference(now[2], old[2]), now[3]};
}

// The same for a bucket. Its minimum and maximum stay those since the driver started.
std::optional<ElementValues> SubtractBucket(const ElementValues& old, const ElementValues& now) {
  if (IsInvalid(old[0]) || IsInvalid(now[0])) return std::nullopt;
  ElementValues delta{Difference(now[0], old[0]), now[1], now[2], kDrvReportInvalidValue};
  if (old[0] == now[0]) return delta;
  // Before the first hit the sum means nothing.
  const std::int64_t oldSum = old[0] == 0 ? 0 : old[3];
  if (IsInvalid(oldSum) || IsInvalid(now[3])) return std::nullopt;
  delta[3] = Difference(now[3], oldSum);
  return delta;
}

// `elements` is what the type word of the result counts.
template <typename Subtract>
KernelReturn CountedDelta(const Dictionary& earlier, const Dictionary& later, Dictionary& result,
                          std::uint8_t format, int elements, Subtract subtract) {
  auto records = ResultRun::Of(result, format);
  if (!records || std::cmp_not_equal(records->count(), elements) ||
      !records->copyFrom(later, format)) {
    return kElementsDisagree;
  }
  const auto before = ElementRun::Counted(earlier, format);
  const auto after = ElementRun::Counted(later, format);
  for (std::size_t i = 0; i < records->count(); ++i) {
    if (!before || !after || i >= before->count()) return kElementsDisagree;
    const auto delta = subtract(before->values(i), after->values(i));
    if (!delta) return kElementsDisagree;
    records->set(i, *delta);
  }
  return kKernelSuccess;
}

KernelReturn ArrayDelta(const Dictionary& earlier, const Dictionary& later, Dictionary& result) {
  constexpr std::uint8_t kFormat = kDrvReportFormatArray;
  auto records = ResultRun::Of(result, kFormat);
  if (!records || !records->copyFrom(later, kFormat)) return kElementsDisagree;
  const auto before = ElementRun::Of(earlier, kFormat);
  const auto after = ElementRun::Of(later, kFormat);
  for (std::size_t i = 0; i < records->count(); ++i) {
    // An earlier sample with fewer records has no values there: the later ones stay.
    if (!before || i >= before->count()) break;
    const ElementValues old = before->values(i);
    ElementValues delta = after->values(i);
    for (std::size_t value = 0; value < delta.size(); ++value) {
      if (IsInvalid(old[value])) continue;
      delta[value] = IsInvalid(delta[value]) ? old[value] : Difference(delta[value], old[value]);
    }
    records->set(i, delta);
  }
  return kKernelSuccess;
}

}  // namespace

KernelReturn _computeDelta(const Dictionary& earlier, const Dictionary& later, Dictionary& result,
                           std::optional<ErrorValue>* error) {
  const auto failed = [error](KernelReturn code, std::optional<std::string_view> reason = {}) {
    storeErr(error, code, reason);
    return code;
  };
  const std::uint8_t format = DrvReportChannelGetFormat(earlier);
  const std::uint8_t laterFormat = DrvReportChannelGetFormat(later);
  if (format == 0 || laterFormat == 0) return failed(kKernelBadArgument);
  if (format != laterFormat) return failed(kKernelBadArgument, "mismatched formats");
  KernelReturn code = kKernelSuccess;
  switch (format) {
    case kDrvReportFormatSimple:
      code = SimpleDelta(earlier, later, result);
      break;
    case kDrvReportFormatState:
      code = CountedDelta(earlier, later, result, format, DrvReportStateGetCount(result),
                          SubtractState);
      break;
    case kDrvReportFormatHistogram:
      code = CountedDelta(earlier, later, result, format, DrvReportHistogramGetBucketCount(result),
                          SubtractBucket);
      break;
    case kDrvReportFormatArray:
      code = ArrayDelta(earlier, later, result);
      break;
    default:
      return failed(kDrvReportUnknownFormat, "unknown report format");
  }
  return code == kKernelSuccess ? code : failed(code);
}

std::optional<Dictionary> DrvReportSampleCreateDelta(const Dictionary& earlier,
                                                     const Dictionary& later,
                                                     std::optional<ErrorValue>* error) {
  // The copy shares no records with the earlier sample: data is copied with its channel.
  Dictionary result = earlier.shallowCopy();
  if (_computeDelta(earlier, later, result, error) != kKernelSuccess) return std::nullopt;
  return result;
}

std::optional<Dictionary> DrvReportCreateSamplesDelta(const Dictionary& earlierSamples,
                                                      const Dictionary& laterSamples,
                                                      std::optional<ErrorValue>* error) {
  return compareAggregates(
      earlierSamples, laterSamples,
      [error](const Dictionary& earlier, const Dictionary& later, Dictionary& result) {
        return _computeDelta(earlier, later, result, error) == kKernelSuccess ? 0 : 1;
      });
}

}  // namespace quorlet
