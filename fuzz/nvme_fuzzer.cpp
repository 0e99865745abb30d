// Any health page and any line of block counters make a statistics export that its reader takes in
// full, or none.
#include <algorithm>
#include <limits>

#include "fuzz_support.h"
#include "platform/linux/nvme_statistics.h"
#include "storage/statistics_parser.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

void CheckExport(const NvmeFacts& facts) {
  const auto bytes = EncodeNvmeStatistics(facts);
  Expect(bytes.has_value() == (facts.healthPage.size() == kNvmeHealthPageBytes),
         "a page of another length");
  if (!bytes) return;
  std::size_t records = 0;
  for (ByteReader reader(*bytes); reader.remaining() != 0; ++records) {
    const auto word = reader.little<std::uint64_t>();
    const auto value = reader.little<std::uint64_t>();
    Expect(word >> 32 == 1, "not one value");
    // The block counters of the kernel are taken as they are.
    Expect(facts.counters || facts.usedBytes || value <= std::numeric_limits<std::int64_t>::max(),
           "a figure that is negative to its reader");
    Expect(reader.ok(), "half a record");
  }
  FSPParseContext context;
  Expect(FSPParseBufferToCxt(context, *bytes), "the export is refused");
  Expect(context.exportVersion != 0 && context.pairs.size() <= records, "the export is read wrong");
  FSPReleaseContext(context);
}

}  // namespace
}  // namespace quorlet

// The bytes in use, the page, and the counters of the namespaces, one a line.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  const std::string_view input = AsText(data, size);
  ByteReader reader(std::as_bytes(std::span(data, size)));
  const auto used = reader.little<std::uint64_t>();
  NvmeFacts facts;
  facts.healthPage = reader.take(std::min(reader.remaining(), kNvmeHealthPageBytes));
  CheckExport(facts);
  if (!reader.ok()) return 0;
  if (used != 0) facts.usedBytes = used;

  NvmeBlockCounters counters;
  bool isWhole = true;
  std::string_view lines = input.substr(reader.position());
  while (!lines.empty()) {
    const std::string_view line = lines.substr(0, lines.find('\n'));
    lines.remove_prefix(std::min(lines.size(), line.size() + 1));
    const NvmeBlockCounters before = counters;
    const bool isTaken = AddBlockCounters(line, counters);
    Expect(isTaken || (counters.discards == before.discards && counters.flushes == before.flushes),
           "a refused line counts", line);
    isWhole &= isTaken;
  }
  if (isWhole) facts.counters = counters;
  CheckExport(facts);
  return 0;
}
