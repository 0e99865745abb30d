// Where each word of a counters record comes from, for each layout of the controllers' raw
// counters.
#ifndef QUORLET_STORAGE_TELEMETRY_WORD_MAPS_H_
#define QUORLET_STORAGE_TELEMETRY_WORD_MAPS_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>

#include "storage/telemetry.h"

namespace quorlet {

// `count` words of the record from `record` on are the raw words from `raw` on.
struct WordRun {
  std::uint16_t record;
  std::uint16_t raw;
  std::uint16_t count;
};

// clang-format off

// Controllers "K4A".
inline constexpr auto kAlgoGenericK4WordMap = std::to_array<WordRun>({
    {0, 0, 8},
    {9, 9, 10},
    {19, 27, 1},
    {20, 105, 2},
    {22, 79, 1},
    {25, 115, 4},
    {29, 8, 1},
    {30, 120, 2},
    {32, 110, 1},
    {41, 19, 1},
    {42, 104, 1},
    {43, 78, 1},
    {44, 108, 1},
    {45, 107, 1},
    {46, 122, 1},
    {56, 20, 3},
    {60, 23, 3},
    {65, 92, 1},
    {66, 28, 2},
    {74, 93, 1},
    {75, 102, 2},
    {78, 30, 3},
    {81, 77, 1},
    {82, 112, 3},
    {85, 126, 1},
    {86, 123, 1},
    {87, 94, 5},
    {93, 99, 3},
    {96, 109, 1},
    {97, 111, 1},
    {98, 45, 4},
    {102, 26, 1},
    {103, 33, 12},
    {125, 55, 20},
    {145, 80, 12},
    {167, 75, 2},
});
// Controllers "K3A".
inline constexpr auto kAlgoGenericWordMap = std::to_array<WordRun>({
    {0, 0, 19},
    {19, 37, 1},
    {20, 117, 2},
    {22, 91, 1},
    {33, 20, 8},
    {41, 19, 1},
    {42, 116, 1},
    {43, 90, 1},
    {44, 120, 1},
    {45, 119, 1},
    {56, 28, 8},
    {65, 104, 1},
    {66, 38, 7},
    {73, 89, 1},
    {74, 105, 1},
    {75, 114, 2},
    {103, 45, 20},
    {125, 67, 20},
    {145, 92, 12},
    {157, 106, 8},
});
// Older controllers, by the NAND's maker.
inline constexpr auto k1xSandiskWordMap = std::to_array<WordRun>({
    {0, 256, 6},
    {8, 265, 1},
    {9, 267, 7},
    {17, 275, 2},
    {19, 301, 1},
    {33, 278, 6},
    {41, 277, 1},
    {42, 288, 1},
    {56, 290, 8},
    {65, 16, 1},
    {66, 303, 2},
    {68, 311, 5},
    {74, 10, 1},
});
inline constexpr auto k1xHynixWordMap = std::to_array<WordRun>({
    {0, 256, 4},
    {8, 263, 1},
    {9, 265, 7},
    {17, 273, 2},
    {19, 297, 1},
    {33, 276, 4},
    {41, 275, 1},
    {42, 284, 1},
    {56, 286, 8},
    {65, 16, 1},
    {66, 299, 2},
    {68, 307, 5},
    {74, 10, 1},
});
// Every other device.
inline constexpr auto k1yWordMap = std::to_array<WordRun>({
    {0, 256, 8},
    {8, 265, 1},
    {9, 267, 10},
    {19, 303, 1},
    {20, 390, 2},
    {22, 372, 1},
    {33, 278, 8},
    {41, 277, 1},
    {42, 290, 1},
    {43, 371, 1},
    {44, 393, 1},
    {45, 392, 1},
    {56, 292, 8},
    {65, 21, 1},
    {66, 305, 2},
    {68, 313, 5},
    {73, 370, 1},
    {74, 15, 1},
    {75, 531, 2},
    {103, 318, 20},
    {125, 338, 20},
    {145, 373, 12},
});

// clang-format on

// Whether the runs fill the record from the front, each word at most once, out of words that exist.
constexpr bool IsWordMap(std::span<const WordRun> runs) {
  std::size_t next = 0;
  for (const WordRun& run : runs) {
    if (run.count == 0 || run.record < next || run.raw + run.count > kRawCounterWords) return false;
    next = std::size_t{run.record} + run.count;
  }
  return next <= kCountersRecordWords;
}

constexpr std::size_t CopiedWords(std::span<const WordRun> runs) {
  std::size_t words = 0;
  for (const WordRun& run : runs) words += run.count;
  return words;
}

static_assert(IsWordMap(kAlgoGenericK4WordMap));
static_assert(IsWordMap(kAlgoGenericWordMap));
static_assert(IsWordMap(k1xSandiskWordMap));
static_assert(IsWordMap(k1xHynixWordMap));
static_assert(IsWordMap(k1yWordMap));
static_assert(kAlgoGenericK4WordMap.size() == 36 && CopiedWords(kAlgoGenericK4WordMap) == 118);
static_assert(kAlgoGenericWordMap.size() == 20 && CopiedWords(kAlgoGenericWordMap) == 116);
static_assert(k1xSandiskWordMap.size() == 13 && CopiedWords(k1xSandiskWordMap) == 42);
static_assert(k1xHynixWordMap.size() == 13 && CopiedWords(k1xHynixWordMap) == 38);
static_assert(k1yWordMap.size() == 22 && CopiedWords(k1yWordMap) == 108);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_TELEMETRY_WORD_MAPS_H_
