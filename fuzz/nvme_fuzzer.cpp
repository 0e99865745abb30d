// Any health page and any line of block counters make a statistics export that its reader takes in
// full, or none.
#include <algorithm>
#include <limits>

#include "fuzz_support.h"
#include "platform/linux/drives/drive_figures.h"
#include "platform/linux/drives/drive_statistics.h"
#include "platform/linux/drives/nvme_pages.h"
#include "storage/statistics_parser.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

void CheckExport(const DriveFacts& facts) {
  const Data bytes = EncodeDriveStatistics(facts);
  std::size_t records = 0;
  for (ByteReader reader(bytes); reader.remaining() != 0; ++records) {
    const auto word = reader.little<std::uint64_t>();
    const auto value = reader.little<std::uint64_t>();
    Expect(word >> 32 == 1, "not one value");
    // The block counters of the kernel are taken as they are.
    Expect(facts.counters || facts.usedBytes || value <= std::numeric_limits<std::int64_t>::max(),
           "a figure that is negative to its reader");
    Expect(reader.ok(), "half a record");
  }
  FSPParseContext context;
  Expect(FSPParseBufferToCxt(context, bytes), "the export is refused");
  Expect(context.exportVersion != 0 && context.pairs.size() <= records, "the export is read wrong");
  FSPReleaseContext(context);
}

// The figures are the export's, in other units.
void CheckFigures(std::span<const std::byte> page) {
  DriveFigures figures;
  AddNvmeHealth(page, figures);
  Expect(figures.empty() == (page.size() != kNvmePageBytes), "a page of another length");
  for (const DriveFigureInfo& info : kDriveFigures) {
    Expect(figures[info.figure].value_or(0) >= 0, "a figure that is negative", info.name);
  }
  Expect(figures[DriveFigure::kUsed].value_or(0) <= 255, "more than a byte is used");
}

}  // namespace
}  // namespace quorlet

// The bytes in use, the page, and the counters of the namespaces, one a line.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  const std::string_view input = AsText(data, size);
  ByteReader reader(std::as_bytes(std::span(data, size)));
  const auto used = reader.little<std::uint64_t>();
  DriveFacts facts;
  facts.healthPage = reader.take(std::min(reader.remaining(), kNvmePageBytes));
  CheckExport(facts);
  CheckFigures(facts.healthPage);
  if (!reader.ok()) return 0;
  if (used != 0) facts.usedBytes = used;

  BlockCounters counters;
  bool isWhole = true;
  std::string_view lines = input.substr(reader.position());
  while (!lines.empty()) {
    const std::string_view line = lines.substr(0, lines.find('\n'));
    lines.remove_prefix(std::min(lines.size(), line.size() + 1));
    const BlockCounters before = counters;
    const bool isTaken = AddBlockCounters(line, counters);
    Expect(isTaken || (counters.discards == before.discards && counters.flushes == before.flushes),
           "a refused line counts", line);
    isWhole &= isTaken;
  }
  if (isWhole) facts.counters = counters;
  CheckExport(facts);
  return 0;
}
