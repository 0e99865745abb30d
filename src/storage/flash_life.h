// From days to life: how fast a drive wears, out of what it told on the days that were recorded.
#ifndef QUORLET_STORAGE_FLASH_LIFE_H_
#define QUORLET_STORAGE_FLASH_LIFE_H_

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "drvreport/property_value.h"
#include "platform/counter_store.h"
#include "platform/drives.h"

namespace quorlet {

// One scalar of a day: "nuvex.flash.<place>.used" (percent), ".written" and ".media.written"
// (bytes since the drive was made).
std::string FlashKey(std::string_view place, std::string_view figure);
inline constexpr std::string_view kFlashUsed = "used";
inline constexpr std::string_view kFlashWritten = "written";
inline constexpr std::string_view kFlashMediaWritten = "media.written";

// What is remembered of a drive beyond the days that the store keeps. A value of kUsed that is
// larger than the day before is a step; the first reading is none.
struct FlashMemory {
  std::int64_t identity = 0;
  std::int32_t since = 0;  // the first day
  std::int64_t firstUsed = 0;
  std::int64_t used = 0;  // the last reading; 0 before the first one that tells it
  std::int32_t firstStepDay = 0;
  std::int64_t firstStep = 0;  // percent; 0 while there was none
  std::int32_t lastStepDay = 0;
  std::int64_t lastStep = 0;

  bool operator==(const FlashMemory&) const = default;
};

// By place. The note is the counter store's; entries that make no sense are left out.
using FlashMemories = std::map<std::string, FlashMemory>;
inline constexpr char kFlashNote[] = "flash";
FlashMemories ReadFlashMemories(const std::optional<Dictionary>& note);
Dictionary WriteFlashMemories(const FlashMemories& memories);

struct FlashDay {
  std::optional<std::int64_t> used;
  std::optional<std::int64_t> written;
  std::optional<std::int64_t> mediaWritten;
};
using FlashDays = std::map<std::int32_t, FlashDay>;

// The recorded days of the drive, from `memory.since` to `today`. False when they cannot be read.
[[nodiscard]] bool ReadFlashDays(CounterStore& store, std::string_view place,
                                 const FlashMemory& memory, std::int32_t today, FlashDays& days);

struct FlashLife {
  std::size_t recordedDays = 0;
  std::optional<double> bytesPerDay;
  std::optional<double> percentPerDay;
  std::optional<double> writeAmplification;  // of the recorded days
  std::optional<std::int64_t> daysLeft;      // until 100 % is used
  // Where the wear is not known: as many at least, since more wear would have been seen.
  std::optional<std::int64_t> daysLeftAtLeast;
};

// What cannot be told from so few days is missing. The wear comes from the first and last steps,
// otherwise from the bytes that all of the use so far has written, and those of the recorded days.
FlashLife EstimateFlashLife(const Drive& drive, const FlashMemory& memory, const FlashDays& days,
                            std::int32_t today);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_FLASH_LIFE_H_
