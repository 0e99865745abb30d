// The statistics export of the storage controller, parsed.
#ifndef QUORLET_STORAGE_STATISTICS_PARSER_H_
#define QUORLET_STORAGE_STATISTICS_PARSER_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "storage/statistics_keys.h"

namespace quorlet {

// One recognised counter.
struct StatisticsPair {
  StatisticsSlot slot = 0;  // compare it with StatisticsSlotOf("wearLevMoves")
  std::uint64_t value = 0;

  std::string name() const { return StatisticsName(slot); }
};

struct FSPParseContext {
  std::uint32_t exportVersion = 0;
  std::uint32_t driverVersion = 0;  // all ones after a parse: no export tells it

  // Geometry, cut to 32 bits.
  std::uint32_t numVirtualBlocks = 0;
  std::uint32_t blocksPerVirtualBlock = 0;
  std::uint32_t pagesPerVirtualBlock = 0;
  std::uint32_t bytesPerPage = 0;

  // Counts since the device was made; those of the host in sectors of 4 KiB.
  std::uint64_t hostReads = 0;
  std::uint64_t hostWrites = 0;
  std::uint64_t numFreeVirtualBlocks = 0;
  std::uint64_t wearLevMoves = 0;
  std::uint64_t nandReads = 0;
  std::uint64_t nandWrites = 0;
  std::uint64_t bandErases = 0;
  std::uint64_t IND_pool_free = 0;
  std::uint64_t IND_pool_count = 0;
  std::uint64_t utilFormatTime = 0;  // seconds since 1970
  std::uint64_t numSleepOps = 0;
  std::uint64_t maxHighEnduranceBlockErases = 0;
  std::array<std::uint64_t, 5> readCountHisto{};

  // Every recognised counter, in the order of the export. A counter may appear more than once.
  std::vector<StatisticsPair> pairs;
};

// Reads an export into `context`, whose pairs it adds to: release a context before another parse.
// False when the export is empty or damaged; `exportVersion` is 0 then, unless the export is empty,
// and the context holds what came before the damage.
bool FSPParseBufferToCxt(FSPParseContext& context, std::span<const std::byte> buffer);

// Gives the context's memory back and sets everything to 0.
void FSPReleaseContext(FSPParseContext& context);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_STATISTICS_PARSER_H_
