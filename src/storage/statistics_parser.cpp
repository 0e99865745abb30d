// The export is a sequence of records of little-endian 64-bit words: key id in the low 32 bits and
// number of values n in the high 32 bits, then n values. Bytes after the last whole word are
// ignored.
#include "storage/statistics_parser.h"

#include <algorithm>
#include <bit>
#include <cstring>

namespace quorlet {
namespace {

constexpr std::uint32_t kHighestKeyId = 0x30000000;  // what lies above is no statistics export
constexpr std::size_t kWordSize = sizeof(std::uint64_t);

static_assert(std::endian::native == std::endian::little);

// Words of a buffer that need not be aligned.
class Words {
 public:
  explicit Words(std::span<const std::byte> buffer) : buffer_(buffer) {}
  std::size_t size() const { return buffer_.size() / kWordSize; }
  // `index` must be below size().
  std::uint64_t operator[](std::size_t index) const {
    std::uint64_t word = 0;
    std::memcpy(&word, &buffer_[index * kWordSize], kWordSize);
    return word;
  }
  Words from(std::size_t index) const { return Words(buffer_.subspan(index * kWordSize)); }

 private:
  std::span<const std::byte> buffer_;
};

// `count` is at least 1.
void StoreField(FSPParseContext& context, std::uint32_t id, Words values, std::size_t count) {
  const std::uint64_t value = values[0];
  const auto low = static_cast<std::uint32_t>(value);
  // clang-format off
  switch (id) {
    case 4: context.hostWrites = value; break;
    case 7: context.hostReads = value; break;
    case 12: context.IND_pool_free = value; break;
    case 13: context.IND_pool_count = value; break;
    case 17: context.wearLevMoves = value; break;
    case 18: context.nandWrites = value; break;
    case 19: context.nandReads = value; break;
    case 20: context.bandErases = value; break;
    case 28: context.numSleepOps = value; break;
    case 45: context.maxHighEnduranceBlockErases = value; break;
    case 48: context.numFreeVirtualBlocks = value; break;
    case 49: context.bytesPerPage = low; break;
    case 50: context.pagesPerVirtualBlock = low; break;
    case 51: context.blocksPerVirtualBlock = low; break;
    case 52: context.numVirtualBlocks = low; break;
    case 53: context.exportVersion = low; break;
    case 56: context.utilFormatTime = value; break;
    case 265:
      for (std::size_t i = 0; i < count; ++i) context.readCountHisto[i] = values[i];
      break;
    default: break;
  }
  // clang-format on
}
static_assert(FindStatisticsKey(265)->cap ==
              std::tuple_size_v<decltype(FSPParseContext::readCountHisto)>);

void StoreValues(FSPParseContext& context, const StatisticsKey& key, Words values,
                 std::size_t count) {
  if (count == 0) return;
  StoreField(context, key.id, values, count);
  if (count == 1) {
    context.pairs.push_back({SlotOf(key), values[0]});
    return;
  }
  const StatisticsSlot first = SlotOf(key, 0);
  for (std::size_t i = 0; i < count; ++i) {
    context.pairs.push_back({static_cast<StatisticsSlot>(first + i), values[i]});
  }
}

}  // namespace

bool FSPParseBufferToCxt(FSPParseContext& context, std::span<const std::byte> buffer) {
  context.driverVersion = 0xFFFFFFFF;
  const Words words(buffer);
  if (words.size() == 0) return false;
  // Room for one value a word, once: a hostile export cannot make it grow again and again.
  context.pairs.reserve(context.pairs.size() + words.size());
  for (std::size_t position = 0; position < words.size();) {
    const std::uint64_t header = words[position++];
    const auto id = static_cast<std::uint32_t>(header);
    const auto count = static_cast<std::uint32_t>(header >> 32);
    if (id > kHighestKeyId || count > words.size() - position) {
      context.exportVersion = 0;
      return false;
    }
    if (const StatisticsKey* key = FindStatisticsKey(id)) {
      StoreValues(context, *key, words.from(position), std::min<std::size_t>(count, key->cap));
    }
    position += count;
  }
  return true;
}

void FSPReleaseContext(FSPParseContext& context) { context = FSPParseContext(); }

}  // namespace quorlet
