#include "storage/flash_life.h"

#include <algorithm>
#include <cmath>
#include <limits>

namespace quorlet {
namespace {

// Beyond it a figure says nothing; some ten thousand years.
constexpr double kMostDays = 3'650'000;

struct Growth {
  std::int32_t days = 0;
  std::int64_t amount = 0;
};

// Between the first and the last day that tell the figure. Nothing when there is one such day, or
// when the figure has fallen, which no counter of a drive does.
template <typename Member>
std::optional<Growth> GrowthOf(const FlashDays& days, Member member) {
  std::optional<std::pair<std::int32_t, std::int64_t>> first;
  std::optional<std::pair<std::int32_t, std::int64_t>> last;
  for (const auto& [number, day] : days) {
    const auto& value = day.*member;
    if (!value) continue;
    if (last && *value < last->second) return std::nullopt;
    last = {number, *value};
    if (!first) first = last;
  }
  if (!first || first->first == last->first) return std::nullopt;
  return Growth{last->first - first->first, last->second - first->second};
}

std::optional<double> PercentPerDay(const Drive& drive, const FlashMemory& memory,
                                    const std::optional<double>& bytesPerDay) {
  if (memory.lastStep > memory.firstStep && memory.firstStep > 0 &&
      memory.lastStepDay > memory.firstStepDay) {
    return static_cast<double>(memory.lastStep - memory.firstStep) /
           static_cast<double>(memory.lastStepDay - memory.firstStepDay);
  }
  const auto used = drive.figures[DriveFigure::kUsed];
  const auto written = drive.figures[DriveFigure::kBytesWritten];
  if (!used || *used == 0 || drive.usedStep != 1 || !written || *written == 0 || !bytesPerDay) {
    return std::nullopt;
  }
  return static_cast<double>(*used) / static_cast<double>(*written) * *bytesPerDay;
}

std::optional<std::int64_t> DaysLeft(const Drive& drive, const FlashMemory& memory,
                                     const std::optional<double>& percentPerDay,
                                     std::int32_t today) {
  const auto used = drive.figures[DriveFigure::kUsed];
  if (!used) return std::nullopt;
  // The lower end of what the figure may stand for.
  const std::int64_t atLeast = drive.usedStep > 1 ? *used - drive.usedStep : *used;
  if (atLeast >= 100) return 0;
  if (!percentPerDay || !(*percentPerDay > 0)) return std::nullopt;
  double days = static_cast<double>(100 - atLeast) / *percentPerDay;
  // The lower end was true on the day of the step.
  if (memory.lastStep == *used && memory.lastStepDay <= today) days -= today - memory.lastStepDay;
  return static_cast<std::int64_t>(std::round(std::clamp(days, 0.0, kMostDays)));
}

// The most that may have been used since the first day: from the lower end of what was told then to
// the upper end of what is told now.
std::optional<std::int64_t> DaysLeftAtLeast(const Drive& drive, const FlashMemory& memory,
                                            std::int32_t today) {
  const auto used = drive.figures[DriveFigure::kUsed];
  if (!used || *used >= 100 || today <= memory.since || memory.since == 0) return std::nullopt;
  const std::int64_t most = *used - memory.firstUsed + drive.usedStep;
  if (most <= 0) return std::nullopt;
  const double percentPerDay = static_cast<double>(most) / (today - memory.since);
  const double days = static_cast<double>(100 - *used) / percentPerDay;
  return static_cast<std::int64_t>(std::floor(std::clamp(days, 0.0, kMostDays)));
}

std::int32_t DayEntry(const Dictionary& entry, std::string_view name) {
  const auto day = IntegerEntry(entry, name).value_or(0);
  const bool fits = day >= 0 && day <= std::numeric_limits<std::int32_t>::max();
  return fits ? static_cast<std::int32_t>(day) : 0;
}

}  // namespace

std::string FlashKey(std::string_view place, std::string_view figure) {
  return "nuvex.flash." + std::string(place) + "." + std::string(figure);
}

FlashMemories ReadFlashMemories(const std::optional<Dictionary>& note) {
  FlashMemories memories;
  if (!note) return memories;
  for (const auto& [place, value] : *note) {
    const Dictionary* entry = value.asDictionary();
    if (entry == nullptr) continue;
    const auto number = [&](std::string_view name) {
      return std::max<std::int64_t>(IntegerEntry(*entry, name).value_or(0), 0);
    };
    memories[place] = {.identity = number("identity"),
                       .since = DayEntry(*entry, "since"),
                       .firstUsed = number("firstUsed"),
                       .used = number("used"),
                       .firstStepDay = DayEntry(*entry, "firstStepDay"),
                       .firstStep = number("firstStep"),
                       .lastStepDay = DayEntry(*entry, "lastStepDay"),
                       .lastStep = number("lastStep")};
  }
  return memories;
}

Dictionary WriteFlashMemories(const FlashMemories& memories) {
  Dictionary note;
  for (const auto& [place, memory] : memories) {
    note[place] = Dictionary{
        {"identity", Int64(memory.identity)},         {"since", Int32(memory.since)},
        {"firstUsed", Int64(memory.firstUsed)},       {"used", Int64(memory.used)},
        {"firstStepDay", Int32(memory.firstStepDay)}, {"firstStep", Int64(memory.firstStep)},
        {"lastStepDay", Int32(memory.lastStepDay)},   {"lastStep", Int64(memory.lastStep)}};
  }
  return note;
}

bool ReadFlashDays(CounterStore& store, std::string_view place, const FlashMemory& memory,
                   std::int32_t today, FlashDays& days) {
  const auto history = store.initWithDefaultPath();
  if (history == nullptr) return true;  // nothing has been recorded
  const std::string prefix = FlashKey(place, "");
  history->scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      prefix, memory.since - 1, today,
      [&](std::string_view key, std::int32_t day, std::int64_t value, bool&) {
        const std::string_view figure = key.substr(prefix.size());
        if (value < 0) return;
        if (figure == kFlashUsed) days[day].used = value;
        if (figure == kFlashWritten) days[day].written = value;
        if (figure == kFlashMediaWritten) days[day].mediaWritten = value;
      });
  return !history->failed();
}

FlashLife EstimateFlashLife(const Drive& drive, const FlashMemory& memory, const FlashDays& days,
                            std::int32_t today) {
  FlashLife life;
  life.recordedDays = days.size();
  const auto written = GrowthOf(days, &FlashDay::written);
  if (written) {
    life.bytesPerDay = static_cast<double>(written->amount) / static_cast<double>(written->days);
  }
  const auto media = GrowthOf(days, &FlashDay::mediaWritten);
  if (media && written && media->days == written->days && written->amount > 0) {
    life.writeAmplification =
        static_cast<double>(media->amount) / static_cast<double>(written->amount);
  }
  life.percentPerDay = PercentPerDay(drive, memory, life.bytesPerDay);
  life.daysLeft = DaysLeft(drive, memory, life.percentPerDay, today);
  if (!life.daysLeft) life.daysLeftAtLeast = DaysLeftAtLeast(drive, memory, today);
  return life;
}

}  // namespace quorlet
