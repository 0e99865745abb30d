#include "collectors/flash_wear.h"

#include <utility>

#include "storage/flash_life.h"

namespace quorlet {
namespace {

// Of places where drives come and go, those that are not there now make way.
constexpr std::size_t kMostMemories = 64;

constexpr std::pair<DriveFigure, std::string_view> kScalars[] = {
    {DriveFigure::kUsed, kFlashUsed},
    {DriveFigure::kBytesWritten, kFlashWritten},
    {DriveFigure::kMediaBytesWritten, kFlashMediaWritten}};

void Remember(const Drive& drive, std::int32_t today, FlashMemory& memory) {
  const std::int64_t used = drive.figures[DriveFigure::kUsed].value_or(memory.used);
  // Wear does not fall; the clock may.
  if (memory.since == 0 || memory.since > today || memory.lastStepDay > today ||
      memory.identity != drive.identity || used < memory.used) {
    memory = {.identity = drive.identity, .since = today, .firstUsed = used, .used = used};
    return;
  }
  if (memory.since == today) memory.firstUsed = used;
  if (memory.used != 0 && used > memory.used && memory.since != today) {
    memory.lastStepDay = today;
    memory.lastStep = used;
    if (memory.firstStep == 0) {
      memory.firstStepDay = today;
      memory.firstStep = used;
    }
  }
  memory.used = used;
}

}  // namespace

void RecordFlash(Drives& presentDrives, CounterStore& store, CounterBatch& counters) {
  const std::vector<Drive> drives = presentDrives.read();
  if (drives.empty()) return;
  std::optional<Dictionary> note;
  if (!store.readNote(kFlashNote, note)) return;
  const FlashMemories before = ReadFlashMemories(note);
  const std::int32_t today = store.TLDaysSince1970();
  FlashMemories memories = before;
  if (memories.size() + drives.size() > kMostMemories) memories.clear();
  for (const Drive& drive : drives) {
    const auto known = before.find(drive.place);
    if (known != before.end()) memories[drive.place] = known->second;
    bool isRecorded = false;
    for (const auto& [figure, name] : kScalars) {
      const auto value = drive.figures[figure];
      if (!value || memories.size() > kMostMemories) continue;
      counters.TLClientSetValueForScalarKey(FlashKey(drive.place, name), *value);
      isRecorded = true;
    }
    if (isRecorded) Remember(drive, today, memories[drive.place]);
  }
  if (memories != before) counters.add(StoreNote{kFlashNote, WriteFlashMemories(memories)});
}

}  // namespace quorlet
