// Any statistics export is read without harm, gives at most one counter a word, and turns into a
// dictionary of the usual keys.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <span>
#include <vector>

#include "fakes/fake_platform.h"
#include "storage/nand_info.h"
#include "storage/statistics_parser.h"

namespace quorlet {
namespace {

void ReadOne(std::span<const std::byte> bytes) {
  FakePlatform platform;
  const std::vector<std::byte> exact(bytes.begin(), bytes.end());  // its end is guarded
  FSPParseContext context;
  const bool accepted = FSPParseBufferToCxt(context, exact);
  if (context.pairs.size() > exact.size() / 8) std::abort();
  if (!accepted && context.exportVersion != 0) std::abort();
  for (const StatisticsPair& pair : context.pairs) {
    if (FindStatisticsSlot(pair.name()) != pair.slot) std::abort();
  }
  const auto merged = BuildNANDInfoDictionary(platform.services, context, true);
  const auto whole = BuildNANDInfoDictionary(platform.services, context, false);
  if (merged.has_value() != (context.exportVersion != 0) || !whole) std::abort();
  if (merged && whole->size() != merged->size() + 3) std::abort();
  FSPReleaseContext(context);
}

}  // namespace
}  // namespace quorlet

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  quorlet::ReadOne(std::as_bytes(std::span(data, size)));
  return 0;
}
