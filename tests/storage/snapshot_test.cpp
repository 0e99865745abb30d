#include "storage/snapshot.h"

#include <gtest/gtest.h>

#include <numeric>

namespace quorlet {
namespace {

using Words = std::vector<std::uint32_t>;

std::span<const std::byte> Bytes(const Words& words) { return std::as_bytes(std::span(words)); }

std::optional<std::string> Rendered(std::span<const std::byte> records, const Words& header = {},
                                    std::size_t capacity = 1 << 16) {
  std::vector<char> out(capacity, '#');
  const auto length = header.empty()
                          ? FSPParseSnapshotBuffer(records, out)
                          : FSPParseSnapshotBufferWithInplaceParser(records, out, Bytes(header));
  if (!length) return std::nullopt;
  EXPECT_EQ(out.at(*length), '\0');
  return std::string(out.data(), *length);
}

struct FieldRow {
  std::uint32_t kind, offset, size;
  std::string format;
};

Words Header(std::uint32_t stride, const std::vector<FieldRow>& fields, std::uint32_t version = 6) {
  const auto count = static_cast<std::uint32_t>(fields.size());
  Words header{0xAAAA, version, stride, 3, 0xBBBB, 0xCCCC, 44, 0, 0, 0, 0, count, 0xDDDD};
  std::string("Legend\n").copy(reinterpret_cast<char*>(&header[9]), 8);
  for (const FieldRow& field : fields) {
    header.insert(header.end(), {field.kind, field.offset, field.size, 0, 0, 0, 0});
    field.format.copy(reinterpret_cast<char*>(&*header.end() - 4), 16);
  }
  return header;
}

TEST(Snapshot, FixedRecords) {
  const std::string legend = Rendered(Bytes(Words(62))).value();
  EXPECT_TRUE(legend.starts_with("Key: \nT   - Timestamp\nE   - "));
  EXPECT_TRUE(legend.ends_with("priority0/priority1/...\n\n\n"));
  Words two(126);
  std::iota(two.begin(), two.begin() + 63, 100);
  two[0] = 7, two[39] = 1234567, two[52] = 4294967295;
  std::copy_n(two.begin(), 63, two.begin() + 63);
  const std::string line =
      "T=0007 E=126 HR= 127 HW= 128 NR= 129 NW= 130 TH=    1234.56 GC= 131 W=133 BI=136 BU=137 "
      "V=  145 BF=147/148 P=101 H=141/140 X=150/151 L=143/144 C=153/154 S= 142 U=4294967295 "
      "RO= 114/ 117/ 120/ 123 RL=    115/    118/    121/    124 RM=  116/  119/  122/  125 "
      "WO= 102/ 105/ 108/ 111 WL=    103/    106/    109/    112 WM=  104/  107/  110/  113\n";
  const std::string whole = std::string(legend).insert(legend.size() - 1, line + line);
  EXPECT_EQ(Rendered(Bytes(two)), whole);
  EXPECT_EQ(Rendered(Bytes(two), {}, whole.size() + 1), whole);
  for (const std::size_t capacity : {std::size_t{0}, legend.size() - 1, whole.size()}) {
    EXPECT_EQ(Rendered(Bytes(two), {}, capacity), std::nullopt) << capacity;
  }
}

TEST(Snapshot, DescribedRecords) {
  const Words records{5, 1234567, 1, 22, 333, 4,  55, 666, 0, 1, 1, 1,
                      1, 1,       1, 1,  12,  99, 0,  0,   0, 0, 0, 99999};
  const std::vector<FieldRow> fields{
      {0, 0, 0, "T=%04u"}, {2, 4, 0, " TH=%8u.%02u"}, {1, 8, 0, ""},      {9, 8, 0, " other=%u"},
      {3, 8, 25, " R%s="}, {1, 29, 0, " beyond=%u"},  {3, 24, 12, " %s"}, {1, ~0U, 0, " %u"}};
  const std::string text =
      "Legend\nT=0005 TH=    1234.56 RO=   1/   4 RL=     22/     55 RM=  333/  666\n"
      "T=0012 TH=       0.09 RO=   0/   0 RL=      0/      0 RM=    0/99999\n";
  const Words header = Header(32, fields);
  EXPECT_EQ(Rendered(Bytes(records), header, text.size() + 1), text);
  EXPECT_EQ(Rendered(Bytes(records), header, text.size()), std::nullopt);
  EXPECT_EQ(Rendered(Bytes(records).first(95), header), text.substr(0, 76));
  EXPECT_TRUE(Rendered({}, Header(32, fields, 5)).value().starts_with("Key: \nT "));
  EXPECT_EQ(Rendered(Bytes(records), Header(0, fields)), "Legend\n");
  EXPECT_EQ(Rendered(Bytes(records), Header(32, {{0, 30, 0, "%u"}})), "Legend\n");
  for (std::ptrdiff_t words = 1; words < std::ssize(header); ++words) {
    const auto cut = Rendered(Bytes(records), Words(header.begin(), header.begin() + words));
    EXPECT_TRUE(words < 7 ? !cut : cut && cut->size() <= text.size()) << words;
  }
}

// Whatever the device writes, only the conversions that the field has are filled.
TEST(Snapshot, FormatTextsAreData) {
  // clang-format off
  const struct {
    std::uint32_t kind, value;
    std::string format, expected;
  } cases[] = {
      {0, 42, "%%%u%%100%", "%42%100%"}, {0, 42, "%5u|%-5u|", "   42|%-5u|"},
      {0, 42, "%-05u|", "42   |"}, {0, 42, "%05.3u", "  042"}, {0, ~41U, "%06d", "-00042"},
      {0, 1U << 31, "%d", "-2147483648"}, {0, 42, "%+d", "+42"}, {0, 42, "% d", " 42"},
      {0, 42, "%+u", "42"}, {0, 0xBEEF, "%#08x", "0x00beef"}, {0, 0xBEEF, "%-+ #09x|", "0xbeef   |"},
      {0, 42, "%999u", std::string(997, ' ') + "42"}, {0, 42, "%1000u", "%1000u"},
      {0, 42, "%.999u", std::string(997, '0') + "42"}, {0, 42, "%.1000u", "%.1000u"},
      {0, 42, "%*u%1$u", "%*u%1$u"}, {0, 42, "%n%s%p%lq%u", "%n%s%p%lq42"},
      {0, 42, "no terminator %u", "no terminator 42"}, {2, 1999, "%s %u.%02u %u", "%s 1.99 %u"},
      {3, 1, "%u%-2s|%s=", "%uO |%s=   1%uL |%s=      2%uM |%s=    3"},
      {0, ~0U, "%i", "-1"}, {0, 0xBEEF, "%#X", "0XBEEF"}, {0, 0xBEEF, "%06X", "00BEEF"},
      {0, 8, "%o", "10"}, {0, 8, "%#o", "010"}, {0, 8, "%#.4o", "0010"},
      {0, ~0U, "%#o", "037777777777"}, {0, 7, "%hhu", "7"}, {0, 7, "%hx", "7"},
      {0, 7, "%3ld", "  7"}, {0, 7, "%.2llu", "07"}, {0, 7, "%zu", "7"}, {0, 7, "%ji", "7"},
      {0, 7, "%td", "7"}, {0, 7, "%Lu", "7"}, {0, 7, "%hlu", "%hlu"}, {0, 7, "%l", "%l"},
      {3, 1, "%.0s%%", "%   1%      2%    3"},
  };
  // clang-format on
  for (const auto& [kind, value, format, expected] : cases) {
    const Words record{value, 2, 3};
    const auto text = Rendered(Bytes(record), Header(12, {{kind, 0, 12, format}}));
    EXPECT_EQ(text, "Legend\n" + expected + "\n") << format;
  }
}

}  // namespace
}  // namespace quorlet
