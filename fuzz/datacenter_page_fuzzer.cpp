// Any datacenter page: figures only behind its identifier, none negative, none of all ones.
#include <algorithm>
#include <limits>

#include "fuzz_support.h"
#include "platform/linux/drives/drive_figures.h"
#include "platform/linux/drives/drive_statistics.h"
#include "platform/linux/drives/nvme_pages.h"
#include "storage/statistics_parser.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  constexpr std::uint8_t kIdentifier[] = {0xC5, 0xAF, 0x10, 0x28, 0xEA, 0xBF, 0xF2, 0xA4,
                                          0x9C, 0x4F, 0x6F, 0x7C, 0xC9, 0x14, 0xD5, 0xAF};
  const auto bytes = std::as_bytes(std::span(data, size));
  DriveFigures figures;
  AddNvmeDatacenter(bytes, figures);
  const bool isPage = size == kNvmePageBytes && std::equal(data + 496, data + 512, kIdentifier);
  Expect(isPage || figures.empty(), "figures of another page");

  // The same bytes as a page.
  Data page(bytes.begin(),
            bytes.begin() + static_cast<std::ptrdiff_t>(std::min(size, kNvmePageBytes)));
  page.resize(kNvmePageBytes);
  std::ranges::copy(std::as_bytes(std::span(kIdentifier)), page.begin() + 496);
  DriveFacts facts;
  AddNvmeDatacenter(page, facts.figures);
  for (const DriveFigureInfo& info : kDriveFigures) {
    Expect(facts.figures[info.figure].value_or(0) >= 0, "a figure that is negative", info.name);
  }
  Expect(facts.figures[DriveFigure::kFreeBlocks] != 255, "a figure that is not told");
  Expect(facts.figures[DriveFigure::kErasesMax] != std::numeric_limits<std::uint32_t>::max(),
         "a figure that is not told");
  FSPParseContext context;
  Expect(FSPParseBufferToCxt(context, EncodeDriveStatistics(facts)), "the export is refused");
  FSPReleaseContext(context);
  return 0;
}
