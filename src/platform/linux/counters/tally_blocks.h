// Blocks: how the values of a distribution are packed into the counter store's database.
//
// The values of one key and day are a sequence of blocks, each a byte string of fixed capacity
// that fills up in place, so that recording a value touches a page or two and reading thousands
// takes few rows. Little-endian throughout:
//
//   0  u64  number of values in the blocks before this one
//   8  u32  number of values in this block, at least 1 and at most the capacity
//   12      capacity times: f64 value, i32 second of the day
//
// Bytes after the last value are unspecified.
#ifndef QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_BLOCKS_H_
#define QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_BLOCKS_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/counter_store.h"

namespace quorlet {

inline constexpr std::size_t kTallyPageSize = 4096;
inline constexpr std::size_t kBlockHeaderSize = 12;
inline constexpr std::size_t kPackedSampleSize = 12;

struct BlockHeader {
  std::uint64_t before = 0;
  std::uint32_t count = 0;
};

constexpr std::size_t BlockSize(std::size_t capacity) {
  return kBlockHeaderSize + capacity * kPackedSampleSize;
}

// The capacity of a block of `size` bytes, or nothing when no block has that size.
std::optional<std::size_t> BlockCapacity(std::size_t size);

// The capacity for a new block: it grows with the values that are there already, and takes all
// `remaining` ones (at least 1) if it can.
std::size_t NextBlockCapacity(std::uint64_t before, std::size_t remaining);

// Reads the header of a block; nothing when it is damaged.
std::optional<BlockHeader> ReadBlockHeader(std::string_view bytes, std::size_t capacity);
// Appends the packed form to `bytes`.
void AppendBlockHeader(std::string& bytes, const BlockHeader& header);
void AppendPackedSamples(std::string& bytes, std::span<const DistributionSample> samples);

// Replaces `samples` by those of a block; false (and no samples) when it is damaged or does not
// follow `before` values.
[[nodiscard]] bool UnpackBlock(std::string_view block, std::uint64_t before,
                               std::vector<DistributionSample>& samples);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_BLOCKS_H_
