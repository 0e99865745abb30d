#include "platform/linux/counters/tally_blocks.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cstring>

namespace quorlet {
namespace {

static_assert(std::endian::native == std::endian::little, "blocks are copied as they are");

// What a block may take so that its row fills `overflowPages` pages and leaves only the least
// possible part in the table itself, where many rows then share a page: dropping a day journals
// the table's pages, but not the overflow pages. (See "Record format" of the SQLite file format;
// 5 bytes are the row's own header.)
constexpr std::size_t OverflowCapacity(std::size_t overflowPages) {
  const std::size_t least = (kTallyPageSize - 12) * 32 / 255 - 23;
  const std::size_t payload = least + overflowPages * (kTallyPageSize - 4);
  return (payload - 5 - kBlockHeaderSize) / kPackedSampleSize;
}

constexpr auto kCapacities = std::to_array<std::size_t>(
    {16, 32, 96, OverflowCapacity(1), OverflowCapacity(2), OverflowCapacity(4)});
static_assert(std::ranges::is_sorted(kCapacities));

template <typename T>
void AppendBytes(std::string& bytes, const T& value) {
  char raw[sizeof(T)];
  std::memcpy(raw, &value, sizeof(T));
  bytes.append(raw, sizeof(T));
}

}  // namespace

std::optional<std::size_t> BlockCapacity(std::size_t size) {
  const auto fits = [size](std::size_t capacity) { return BlockSize(capacity) == size; };
  const auto found = std::ranges::find_if(kCapacities, fits);
  if (found == kCapacities.end()) return std::nullopt;
  return *found;
}

std::size_t NextBlockCapacity(std::uint64_t before, std::size_t remaining) {
  const std::uint64_t wanted = std::max<std::uint64_t>(before, remaining);
  const auto found = std::ranges::lower_bound(kCapacities, wanted);
  return found == kCapacities.end() ? kCapacities.back() : *found;
}

std::optional<BlockHeader> ReadBlockHeader(std::string_view bytes, std::size_t capacity) {
  if (bytes.size() < kBlockHeaderSize) return std::nullopt;
  BlockHeader header;
  std::memcpy(&header.before, bytes.data(), sizeof(header.before));
  std::memcpy(&header.count, bytes.data() + sizeof(header.before), sizeof(header.count));
  if (header.count == 0 || header.count > capacity) return std::nullopt;
  return header;
}

void AppendBlockHeader(std::string& bytes, const BlockHeader& header) {
  AppendBytes(bytes, header.before);
  AppendBytes(bytes, header.count);
}

void AppendPackedSamples(std::string& bytes, std::span<const DistributionSample> samples) {
  for (const DistributionSample& sample : samples) {
    AppendBytes(bytes, sample.value);
    AppendBytes(bytes, sample.secondsInDay);
  }
}

bool UnpackBlock(std::string_view block, std::uint64_t before,
                 std::vector<DistributionSample>& samples) {
  samples.clear();
  const std::optional<std::size_t> capacity = BlockCapacity(block.size());
  if (!capacity) return false;
  const std::optional<BlockHeader> header = ReadBlockHeader(block, *capacity);
  if (!header || header->before != before) return false;
  samples.resize(header->count);
  const char* packed = block.data() + kBlockHeaderSize;
  for (DistributionSample& sample : samples) {
    std::memcpy(&sample.value, packed, sizeof(sample.value));
    std::memcpy(&sample.secondsInDay, packed + sizeof(sample.value), sizeof(sample.secondsInDay));
    packed += kPackedSampleSize;
  }
  return true;
}

}  // namespace quorlet
