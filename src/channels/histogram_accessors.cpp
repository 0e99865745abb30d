// Values and bucket bounds of histogram samples.
//
// The configuration of the bounds is an array of 16-byte little-endian segments: u32 base, u32 mode
// (0 linear, otherwise exponential), u32 that is not read, i32 number of buckets. A shorter rest is
// left unread.
#include <utility>

#include "channels/value_accessors.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

constexpr std::string_view kProcessedConfig = "ProcessedChannelConfig";
constexpr std::size_t kSegmentSize = 16;

std::optional<ElementValues> BucketAt(const Dictionary& sample, std::int32_t index) {
  ElementValues values;
  if (_getHistogramElement(sample, index, values) != kKernelSuccess) return std::nullopt;
  return values;
}

std::int64_t BucketValue(const Dictionary& sample, std::int32_t index, std::size_t value) {
  const auto bucket = BucketAt(sample, index);
  return bucket ? (*bucket)[value] : kDrvReportInvalidValue;
}

// Adds the upper bounds of one segment; false when they are more than `limit` in all or do not
// grow. The driver's number of buckets may be anything: only `limit` says how often this loops.
bool AppendBounds(ByteReader& segment, std::size_t limit, std::uint64_t& previous, Array& bounds) {
  const auto base = segment.little<std::uint32_t>();
  const bool exponential = segment.little<std::uint32_t>() != 0;
  segment.skip(4);
  const auto buckets = static_cast<std::int32_t>(segment.little<std::uint32_t>());
  std::uint64_t power = 1;   // modulo 2^64
  std::uint32_t linear = 0;  // modulo 2^32
  for (std::int32_t j = 0; j < buckets; ++j) {
    if (bounds.size() >= limit) return false;
    power *= base;
    linear += base;
    const std::uint64_t bound = exponential ? power : linear;
    if (bound <= previous) return false;
    bounds.push_back(Int64(static_cast<std::int64_t>(bound)));
    previous = bound;
  }
  return true;
}

std::optional<Array> MakeBounds(const Dictionary& channel) {
  std::uint64_t type = 0;
  const Data* config = getChannelConfig(channel);
  if (getChannelType(channel, type) != kKernelSuccess ||
      formatOfType(type) != kDrvReportFormatHistogram || config == nullptr ||
      config->size() < kSegmentSize) {
    return std::nullopt;
  }
  ByteReader reader(*config);
  Array bounds;
  std::uint64_t previous = 0;
  while (reader.remaining() >= kSegmentSize) {
    if (!AppendBounds(reader, elementCountOfType(type), previous, bounds)) return std::nullopt;
  }
  return bounds;
}

// The bound at `index`; nothing beyond the last one or when it is no number.
std::optional<std::int64_t> BoundAt(const Array& bounds, std::size_t index) {
  const Number* bound = index < bounds.size() ? bounds[index].asNumber() : nullptr;
  return bound == nullptr ? std::nullopt : std::optional(bound->toInt64());
}

}  // namespace

int DrvReportHistogramGetBucketCount(const Dictionary& sample) {
  std::uint64_t type = 0;
  if (getChannelType(sample, type) != kKernelSuccess ||
      formatOfType(type) != kDrvReportFormatHistogram) {
    return -1;
  }
  return elementCountOfType(type);
}

std::int64_t DrvReportHistogramGetBucketHits(const Dictionary& sample, std::int32_t index) {
  return BucketValue(sample, index, 0);
}

std::int64_t DrvReportHistogramGetBucketMinValue(const Dictionary& sample, std::int32_t index) {
  return BucketValue(sample, index, 1);
}

std::int64_t DrvReportHistogramGetBucketMaxValue(const Dictionary& sample, std::int32_t index) {
  return BucketValue(sample, index, 2);
}

std::int64_t DrvReportHistogramGetBucketSum(const Dictionary& sample, std::int32_t index) {
  return BucketValue(sample, index, 3);
}

std::int64_t DrvReportHistogramGetMinValue(const Dictionary& sample) {
  const auto run = ElementRun::Counted(sample, kDrvReportFormatHistogram);
  for (std::size_t i = 0; run && i < run->count(); ++i) {
    const ElementValues bucket = run->values(i);
    if (bucket[0] != 0) return bucket[1];
  }
  return kDrvReportInvalidValue;
}

std::int64_t DrvReportHistogramGetMaxValue(const Dictionary& sample) {
  const auto run = ElementRun::Counted(sample, kDrvReportFormatHistogram);
  for (std::size_t i = run ? run->count() : 0; i-- > 0;) {
    const ElementValues bucket = run->values(i);
    if (bucket[0] != 0) return bucket[2];
  }
  return kDrvReportInvalidValue;
}

KernelReturn DrvReportHistogramGetBucketBounds(Dictionary& channel, std::int32_t index,
                                               std::int64_t* lower, std::int64_t* upper) {
  if (!channel.contains(kProcessedConfig)) {
    auto made = MakeBounds(channel);
    if (!made) return kKernelError;
    channel[kProcessedConfig] = *std::move(made);
  }
  const Array* bounds = ArrayEntry(channel, kProcessedConfig);
  if (bounds == nullptr || index < 0 || std::cmp_greater(index, bounds->size())) {
    return kKernelError;
  }
  const auto at = static_cast<std::size_t>(index);
  const auto above = BoundAt(*bounds, at);
  const auto below = at == 0 ? std::optional<std::int64_t>(0) : BoundAt(*bounds, at - 1);
  if ((upper != nullptr && !above) || (lower != nullptr && !below)) return kKernelError;
  if (upper != nullptr) *upper = *above;
  if (lower != nullptr) *lower = *below;
  return kKernelSuccess;
}

}  // namespace quorlet
