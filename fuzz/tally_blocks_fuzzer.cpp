// Any bytes are either refused or one block, which packs into the same bytes again; and whatever is
// recorded is read back, however it is spread over blocks.
#include <algorithm>
#include <cstring>

#include "fuzz_support.h"
#include "platform/linux/counters/tally_blocks.h"

namespace quorlet {
namespace {

std::string Packed(std::uint64_t before, std::span<const DistributionSample> samples) {
  std::string bytes;
  AppendBlockHeader(bytes, {before, static_cast<std::uint32_t>(samples.size())});
  AppendPackedSamples(bytes, samples);
  return bytes;
}

void CheckBlock(std::string_view block, std::uint64_t before) {
  std::vector<DistributionSample> samples(1);
  const auto capacity = BlockCapacity(block.size());
  const auto header = capacity ? ReadBlockHeader(block, *capacity) : std::nullopt;
  const bool taken = UnpackBlock(block, before, samples);
  Expect(taken == (header && header->before == before), "a block and its header disagree");
  Expect(taken != samples.empty(), "a refused block has samples");
  if (!taken) return;
  Expect(samples.size() == header->count && samples.size() <= *capacity, "too many samples");
  Expect(block.starts_with(Packed(before, samples)), "a block has changed");
}

// Sizes that no block has are rare among the inputs this way.
std::string Fitted(std::string_view bytes) {
  std::size_t capacity = NextBlockCapacity(0, 1);
  while (BlockSize(capacity) < bytes.size() && NextBlockCapacity(capacity + 1, 1) > capacity) {
    capacity = NextBlockCapacity(capacity + 1, 1);
  }
  std::string block(bytes.substr(0, BlockSize(capacity)));
  block.resize(BlockSize(capacity));
  return block;
}

// What is recorded is a sequence of blocks, as the store writes them.
void CheckSequence(std::string_view packed, std::size_t repeats) {
  std::vector<DistributionSample> all(packed.size() / kPackedSampleSize);
  for (std::size_t i = 0; i < all.size(); ++i) {
    const char* at = packed.data() + i * kPackedSampleSize;
    std::memcpy(&all[i].value, at, sizeof(double));
    std::memcpy(&all[i].secondsInDay, at + sizeof(double), sizeof(std::int32_t));
  }
  const std::size_t once = all.size();
  for (std::size_t i = 1; i < repeats; ++i) {
    all.insert(all.end(), all.begin(), all.begin() + static_cast<std::ptrdiff_t>(once));
  }
  std::size_t before = 0;
  while (before < all.size()) {
    const std::size_t capacity = NextBlockCapacity(before, all.size() - before);
    const auto part = std::span(all).subspan(before, std::min(capacity, all.size() - before));
    std::string block = Packed(before, part);
    block.resize(BlockSize(capacity), '\x5a');
    std::vector<DistributionSample> read;
    Expect(UnpackBlock(block, before, read), "a written block is refused");
    Expect(Packed(before, read) == Packed(before, part), "samples have changed");
    Expect(!UnpackBlock(block, before + 1, read) && read.empty(), "a gap is not noticed");
    before += part.size();
  }
}

}  // namespace
}  // namespace quorlet

// The first eight bytes are the number of values before the block.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  std::string_view input = AsText(data, size);
  std::uint64_t before = 0;
  if (size < sizeof before) return 0;
  std::memcpy(&before, data, sizeof before);
  CheckBlock(input, before);
  CheckBlock(Fitted(input), before);
  input.remove_prefix(sizeof before);
  CheckSequence(input, 1 + before % 64);
  return 0;
}
