// A record of the fixed layout is 63 little-endian u32 words; kLine says which of them are shown.
//
// A snapshot header, little-endian:
//    4  u32  version
//    8  u32  record size in bytes
//   12  u32  number of records
//   24  u32  offset of the field table from the header's start
//   36  legend, up to a terminator (version 6 and later)
// Field table: u32 number of fields at 0; from 8 on the fields, 28 bytes each:
//    0  u16  kind
//    4  u32  offset within the record
//    8  u32  size in bytes (latency fields)
//   12  format text, up to a terminator
#include "storage/snapshot.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <vector>

#include "storage/format_text.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

constexpr std::string_view kLegend =
    "Key: \n"
    "T   - Timestamp\n"
    "E   - Erased bands during this time interval\n"
    "HR  - Host Reads (in 4k sectors)\n"
    "HW  - Host Writes (in 4k sectors)\n"
    "NR  - Nand Reads (in 4k sectors)\n"
    "NW  - Nand Writes (in 4k sectors)\n"
    "TH  - Time in Hysteresis in this time interval (in ms)\n"
    "GC  - Number of sectors (4k bytes) completed GC in this time interval\n"
    "W   - Number of wear level bands completed in this time interval\n"
    "BI  - Bands Intermediate (SLC) PendingErase\n"
    "BU  - Bands User (MLC) PendingErase\n"
    "V   - Number of Free Nodes\n"
    "BF  - Buffer Fragments/BufferHighWater\n"
    "P   - Percent of time in DoPreempt rather than DoNormal\n"
    "H   - Qos Delays: Normal/Extreme\n"
    "X   - Successful expedite commands/Failed expedite commands\n"
    "L   - Age of the oldest command in ms (calculated every second)/Qos Interval (in 100us "
    "units)\n"
    "C   - Command tags in use by host (Min/Max)\n"
    "S   - Number of free segs\n"
    "U   - Sectors of host unmaps\n"
    "RO  - Num read ops for this time interval: priority0/priority1/...\n"
    "RL  - Total Read Latency (in us) for this time interval: priority0/priority1/...\n"
    "RM  - Max Read Latency (int us) for this time interval: priority0/priority1/...\n"
    "WO  - Num write ops for this time interval: priority0/priority1/...\n"
    "WL  - Total write latency (in us) for this time interval: priority0/priority1/...\n"
    "WM  - Max write latency (in us) for this time interval: priority0/priority1/...\n\n";

constexpr std::size_t kMostDigits = 10;  // of a u32

std::uint32_t WordAt(std::span<const std::byte> record, std::size_t offset) {
  ByteReader reader(record.subspan(offset));
  return reader.little<std::uint32_t>();
}

// ---- The fixed layout.

constexpr std::size_t kRecordSize = 252;

enum class Shown : std::uint8_t { kWhole, kThousands, kHundredths };  // 1234567: 1234 and 56

struct LinePiece {
  constexpr LinePiece(std::string_view text, std::uint8_t shownWord, std::uint8_t shownWidth,
                      char filledWith = ' ', Shown whatIsShown = Shown::kWhole)
      : beforeLength(static_cast<std::uint8_t>(text.size())),
        word(shownWord),
        width(shownWidth),
        fill(filledWith),
        shown(whatIsShown) {
    std::ranges::copy(text, before.begin());
  }
  std::array<char, 4> before{};
  std::uint8_t beforeLength;
  std::uint8_t word;
  std::uint8_t width;
  char fill;
  Shown shown;
};

// clang-format off
constexpr auto kLine = std::to_array<LinePiece>({
    {"T=", 0, 4, '0'},
    {" E=", 26, 2, '0'},
    {" HR=", 27, 4},
    {" HW=", 28, 4},
    {" NR=", 29, 4},
    {" NW=", 30, 4},
    {" TH=", 39, 8, ' ', Shown::kThousands}, {".", 39, 2, '0', Shown::kHundredths},
    {" GC=", 31, 4},
    {" W=", 33, 2},
    {" BI=", 36, 3},
    {" BU=", 37, 3},
    {" V=", 45, 5},
    {" BF=", 47, 2}, {"/", 48, 2},
    {" P=", 1, 2},
    {" H=", 41, 2}, {"/", 40, 2},
    {" X=", 50, 2}, {"/", 51, 2},
    {" L=", 43, 3}, {"/", 44, 3},
    {" C=", 53, 2}, {"/", 54, 2},
    {" S=", 42, 4},
    {" U=", 52, 8},
    {" RO=", 14, 4}, {"/", 17, 4}, {"/", 20, 4}, {"/", 23, 4},
    {" RL=", 15, 7}, {"/", 18, 7}, {"/", 21, 7}, {"/", 24, 7},
    {" RM=", 16, 5}, {"/", 19, 5}, {"/", 22, 5}, {"/", 25, 5},
    {" WO=", 2, 4}, {"/", 5, 4}, {"/", 8, 4}, {"/", 11, 4},
    {" WL=", 3, 7}, {"/", 6, 7}, {"/", 9, 7}, {"/", 12, 7},
    {" WM=", 4, 5}, {"/", 7, 5}, {"/", 10, 5}, {"/", 13, 5},
});
// clang-format on
static_assert(std::ranges::all_of(kLine, [](const LinePiece& piece) {
  return piece.width <= kMostDigits && piece.word < kRecordSize / sizeof(std::uint32_t);
}));

constexpr std::size_t kLongestLine = [] {
  std::size_t length = 1;  // the line break
  for (const LinePiece& piece : kLine) length += piece.before.size() + kMostDigits;
  return length;
}();

std::uint32_t ShownValue(std::uint32_t value, Shown shown) {
  switch (shown) {
    case Shown::kWhole:
      return value;
    case Shown::kThousands:
      return value / 1000;
    case Shown::kHundredths:
      return value % 1000 / 10;
  }
  return value;
}

// Writes at most kMostDigits characters, but there must always be room for as many: a copy of fixed
// size is what makes the lines cheap.
char* WriteNumber(char* at, std::uint32_t value, std::size_t width, char fill) {
  std::array<char, 2 * kMostDigits> filled;
  std::memset(filled.data(), fill, kMostDigits);
  char* const digits = &filled[kMostDigits];
  const char* const end = std::to_chars(digits, digits + kMostDigits, value).ptr;
  const std::size_t length = std::max(static_cast<std::size_t>(end - digits), width);
  std::memcpy(at, end - length, kMostDigits);
  return at + length;
}

void AppendLine(BoundedText& text, std::span<const std::byte, kRecordSize> record) {
  std::array<char, kLongestLine> line;
  char* at = line.data();
  for (const LinePiece& piece : kLine) {
    std::memcpy(at, piece.before.data(), piece.before.size());
    at += piece.beforeLength;
    const std::uint32_t word = WordAt(record, piece.word * sizeof(std::uint32_t));
    at = WriteNumber(at, ShownValue(word, piece.shown), piece.width, piece.fill);
  }
  *at++ = '\n';
  text.append(std::string_view(line.data(), at));
}

// ---- Layouts that a header describes.

constexpr std::size_t kFieldSize = 28;
constexpr std::size_t kFieldFormatOffset = 12;
constexpr std::size_t kTripleSize = 12;

enum FieldKind : std::uint16_t { kNumber = 0, kOtherNumber = 1, kMilliseconds = 2, kLatencies = 3 };

struct Field {
  std::uint16_t kind = 0;
  std::size_t offset = 0;
  std::size_t size = 0;
  std::string_view format;
};

struct Layout {
  std::string_view legend = kLegend;
  std::size_t stride = 0;
  std::size_t records = 0;
  std::optional<std::size_t> firstField;  // where the first field lies, shown or not
  std::vector<Field> fields;              // those that lie within a record and show something
};

std::string_view TerminatedText(std::span<const std::byte> bytes) {
  const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  return text.substr(0, text.find('\0'));
}

Field ReadField(std::span<const std::byte> bytes) {
  ByteReader reader(bytes);
  Field field;
  field.kind = reader.little<std::uint16_t>();
  reader.seek(4);
  field.offset = reader.little<std::uint32_t>();
  field.size = reader.little<std::uint32_t>();
  if (field.kind == kLatencies) {
    field.size -= field.size % kTripleSize;
  } else {
    field.size = sizeof(std::uint32_t);
  }
  field.format = TerminatedText(bytes.subspan(kFieldFormatOffset));
  return field;
}

bool LiesWithin(std::size_t offset, std::size_t size, std::size_t limit) {
  return offset <= limit && size <= limit - offset;
}

// A table that is cut short keeps its whole fields.
void ReadFields(std::span<const std::byte> table, Layout& layout) {
  ByteReader reader(table);
  const std::size_t count = reader.little<std::uint32_t>();
  reader.skip(4);
  for (std::size_t i = 0; i < count; ++i) {
    const auto bytes = reader.take(kFieldSize);
    if (!reader.ok()) return;
    const Field field = ReadField(bytes);
    if (i == 0) {
      // Without it no record can be told from one that was never written.
      if (!LiesWithin(field.offset, sizeof(std::uint32_t), layout.stride)) return;
      layout.firstField = field.offset;
    }
    const bool shows =
        field.kind == kLatencies || (field.kind < kLatencies && !field.format.empty());
    if (shows && LiesWithin(field.offset, field.size, layout.stride))
      layout.fields.push_back(field);
  }
}

std::optional<Layout> ReadLayout(std::span<const std::byte> header) {
  constexpr std::size_t kLegendOffset = 36;
  constexpr std::uint32_t kFirstVersionWithLegend = 6;
  ByteReader reader(header);
  reader.skip(4);
  const auto version = reader.little<std::uint32_t>();
  Layout layout;
  layout.stride = reader.little<std::uint32_t>();
  layout.records = reader.little<std::uint32_t>();
  reader.seek(24);
  const std::size_t table = reader.little<std::uint32_t>();
  if (!reader.ok()) return std::nullopt;
  if (version >= kFirstVersionWithLegend) {
    layout.legend = TerminatedText(header.subspan(std::min(kLegendOffset, header.size())));
  }
  ReadFields(header.subspan(std::min(table, header.size())), layout);
  return layout;
}

// One of the three figures of every triple, with its own format.
void AppendLatencies(BoundedText& out, const Field& field, std::span<const std::byte> triples) {
  struct Figure {
    std::string_view letter;
    std::size_t offset;
    std::size_t width;
  };
  constexpr std::array<Figure, 3> kFigures{{{"O", 0, 4}, {"L", 4, 7}, {"M", 8, 5}}};
  for (const Figure& figure : kFigures) {
    AppendFormatted(out, field.format, figure.letter);
    for (std::size_t at = 0; out.ok() && at < triples.size(); at += kTripleSize) {
      if (at != 0) out.append("/");
      std::array<char, kMostDigits> number;
      const char* const end =
          WriteNumber(number.data(), WordAt(triples, at + figure.offset), figure.width, ' ');
      out.append(std::string_view(number.data(), end));
    }
  }
}

void AppendField(BoundedText& out, const Field& field, std::span<const std::byte> record) {
  const auto bytes = record.subspan(field.offset, field.size);
  if (field.kind == kLatencies) {
    AppendLatencies(out, field, bytes);
    return;
  }
  const std::uint32_t value = WordAt(bytes, 0);
  if (field.kind == kMilliseconds) {
    AppendFormatted(
        out, field.format,
        std::array{ShownValue(value, Shown::kThousands), ShownValue(value, Shown::kHundredths)});
  } else {
    AppendFormatted(out, field.format, std::array{value});
  }
}

}  // namespace

std::optional<std::size_t> FSPParseSnapshotBuffer(std::span<const std::byte> records,
                                                  std::span<char> out) {
  BoundedText text(out);
  text.append(kLegend);
  while (text.ok() && records.size() >= kRecordSize) {
    AppendLine(text, records.first<kRecordSize>());
    records = records.subspan(kRecordSize);
  }
  text.append("\n");
  return text.finish();
}

std::optional<std::size_t> FSPParseSnapshotBufferWithInplaceParser(
    std::span<const std::byte> records, std::span<char> out, std::span<const std::byte> header) {
  const std::optional<Layout> layout = ReadLayout(header);
  if (!layout) return std::nullopt;
  BoundedText text(out);
  text.append(layout->legend);
  if (!layout->firstField) return text.finish();
  // Nearly every field shows something. Those that never do must not cost without bound.
  std::size_t affordable = out.size();
  for (std::size_t i = 0; text.ok() && i < layout->records; ++i) {
    if (records.size() < layout->stride) break;
    const auto record = records.first(layout->stride);
    records = records.subspan(layout->stride);
    if (WordAt(record, *layout->firstField) == 0) continue;
    if (layout->fields.size() > affordable) return std::nullopt;
    affordable -= layout->fields.size();
    for (const Field& field : layout->fields) AppendField(text, field, record);
    text.append("\n");
  }
  return text.finish();
}

}  // namespace quorlet
