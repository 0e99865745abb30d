// Rendering 10,000 snapshot records, of the fixed layout and of one that a header describes, beside
// snprintf of the same line.
#include <benchmark/benchmark.h>

#include <array>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "storage/snapshot.h"

namespace quorlet::bench {
namespace {

constexpr std::uint32_t kRecords = 10'000;
constexpr std::size_t kWords = 63;
constexpr std::size_t kCapacity = std::size_t{16} << 20;

// Numbers of all lengths, mostly short ones, as counters of one interval are.
std::vector<std::uint32_t> Records() {
  std::vector<std::uint32_t> words(kRecords * kWords);
  std::uint32_t random = 1;
  for (std::uint32_t& word : words) {
    random = random * 1664525 + 1013904223;
    word = (random >> 8) >> (random >> 27) % 24;
  }
  for (std::uint32_t i = 0; i < kRecords; ++i) words[i * kWords] = i + 1;
  return words;
}

// The first fields of the fixed line and its two latency fields.
std::vector<std::uint32_t> Header() {
  struct Field {
    std::uint32_t kind, offset, size;
    const char* format;
  };
  constexpr std::array<Field, 22> kFields{{
      {0, 0, 4, "T=%04u"},         {0, 104, 4, " E=%02u"},
      {0, 108, 4, " HR=%4u"},      {0, 112, 4, " HW=%4u"},
      {0, 116, 4, " NR=%4u"},      {0, 120, 4, " NW=%4u"},
      {2, 156, 4, " TH=%8u.%02u"}, {0, 124, 4, " GC=%4u"},
      {0, 132, 4, " W=%2u"},       {0, 144, 4, " BI=%3u"},
      {0, 148, 4, " BU=%3u"},      {0, 180, 4, " V=%5u"},
      {0, 188, 4, " BF=%2u"},      {0, 192, 4, "/%2u"},
      {0, 4, 4, " P=%2u"},         {0, 164, 4, " H=%2u"},
      {0, 160, 4, "/%2u"},         {0, 168, 4, " S=%4u"},
      {0, 208, 4, " U=%8u"},       {3, 56, 48, " R%s="},
      {3, 8, 48, " W%s="},         {1, 0, 4, ""},
  }};
  std::vector<std::uint32_t> header{0, 5, kWords * 4, kRecords, 0, 0, 28, kFields.size(), 0};
  for (const Field& field : kFields) {
    std::array<std::uint32_t, 7> words{field.kind, field.offset, field.size};
    std::memcpy(&words[3], field.format, std::strlen(field.format));
    header.insert(header.end(), words.begin(), words.end());
  }
  return header;
}

void Report(benchmark::State& state, std::size_t length) {
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(length));
}

void FixedLayout(benchmark::State& state) {
  const auto records = Records();
  std::vector<char> out(kCapacity);
  std::size_t length = 0;
  for (auto _ : state) {
    const auto rendered = FSPParseSnapshotBuffer(std::as_bytes(std::span(records)), out);
    if (!rendered) std::abort();
    length = *rendered;
  }
  Report(state, length);
}
BENCHMARK(FixedLayout)->Unit(benchmark::kMillisecond);

void DescribedLayout(benchmark::State& state) {
  const auto records = Records();
  const auto header = Header();
  std::vector<char> out(kCapacity);
  std::size_t length = 0;
  for (auto _ : state) {
    const auto rendered = FSPParseSnapshotBufferWithInplaceParser(
        std::as_bytes(std::span(records)), out, std::as_bytes(std::span(header)));
    if (!rendered) std::abort();
    length = *rendered;
  }
  Report(state, length);
}
BENCHMARK(DescribedLayout)->Unit(benchmark::kMillisecond);

// The peer.
int PrintLine(char* out, std::size_t capacity, const std::uint32_t* w) {
  return std::snprintf(
      out, capacity,
      "T=%04u E=%02u HR=%4u HW=%4u NR=%4u NW=%4u TH=%8u.%02u GC=%4u W=%2u BI=%3u BU=%3u V=%5u "
      "BF=%2u/%2u P=%2u H=%2u/%2u X=%2u/%2u L=%3u/%3u C=%2u/%2u S=%4u U=%8u RO=%4u/%4u/%4u/%4u "
      "RL=%7u/%7u/%7u/%7u RM=%5u/%5u/%5u/%5u WO=%4u/%4u/%4u/%4u WL=%7u/%7u/%7u/%7u "
      "WM=%5u/%5u/%5u/%5u\n",
      w[0], w[26], w[27], w[28], w[29], w[30], w[39] / 1000, w[39] % 1000 / 10, w[31], w[33], w[36],
      w[37], w[45], w[47], w[48], w[1], w[41], w[40], w[50], w[51], w[43], w[44], w[53], w[54],
      w[42], w[52], w[14], w[17], w[20], w[23], w[15], w[18], w[21], w[24], w[16], w[19], w[22],
      w[25], w[2], w[5], w[8], w[11], w[3], w[6], w[9], w[12], w[4], w[7], w[10], w[13]);
}

void Snprintf(benchmark::State& state) {
  const auto records = Records();
  std::vector<char> out(kCapacity);
  std::vector<char> rendered(kCapacity);
  const auto length = FSPParseSnapshotBuffer(std::as_bytes(std::span(records)), rendered);
  std::size_t written = 0;
  for (auto _ : state) {
    written = 0;
    for (std::size_t i = 0; i < kRecords; ++i) {
      const int size = PrintLine(&out[written], out.size() - written, &records[i * kWords]);
      written += static_cast<std::size_t>(size);
    }
  }
  // Both must have printed the same lines, or the comparison says nothing.
  const std::string_view lines(out.data(), written);
  const std::string_view text(rendered.data(), length.value_or(0));
  if (!text.ends_with(std::string(lines) + "\n")) std::abort();
  Report(state, written);
}
BENCHMARK(Snprintf)->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace quorlet::bench

BENCHMARK_MAIN();
