#include "ctl/storage_health.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <vector>

#include "ctl/json_value.h"
#include "ctl/terminal.h"
#include "storage/flash_life.h"

namespace quorlet {
namespace {

constexpr char kUnknown[] = "unknown";

std::string_view KindName(DriveKind kind) {
  switch (kind) {
    case DriveKind::kNvme:
      return "nvme";
    case DriveKind::kEmmc:
      return "emmc";
    case DriveKind::kSd:
      return "sd";
    case DriveKind::kUfs:
      return "ufs";
    case DriveKind::kSata:
      return "sata";
  }
  return "";
}

std::string_view StateName(DriveAnswer answer) {
  switch (answer) {
    case DriveAnswer::kTold:
      return "told";
    case DriveAnswer::kNothingToTell:
      return "nothing to tell";
    case DriveAnswer::kAsleep:
      return "asleep";
    case DriveAnswer::kDenied:
      return "denied";
    case DriveAnswer::kSilent:
      return "silent";
  }
  return "";
}

std::string Rounded(double number, int digits) {
  char text[64];
  std::snprintf(text, sizeof text, "%.*f", digits, number);
  return text;
}

// With three digits or more: "5.29 TB"; a thousand bytes are a kilobyte, as drives are sold.
std::string Bytes(double bytes) {
  constexpr std::array<const char*, 6> kUnits = {" kB", " MB", " GB", " TB", " PB", " EB"};
  if (bytes < 1000) return Rounded(bytes, 0) + " B";
  std::size_t unit = 0;
  for (bytes /= 1000; bytes >= 999.95 && unit + 1 < kUnits.size(); ++unit) bytes /= 1000;
  return Rounded(bytes, bytes < 9.995 ? 2 : bytes < 99.95 ? 1 : 0) + kUnits[unit];
}

struct Row {
  Drive drive;
  FlashLife life;
};

std::string Used(const Drive& drive) {
  const auto used = drive.figures[DriveFigure::kUsed];
  if (!used) return kUnknown;
  const std::string upper = std::to_string(*used);
  if (drive.usedStep == 1) return *used == 255 ? "over 254 %" : upper + " %";
  const std::string lower = std::to_string(*used - drive.usedStep);
  return *used > 100 ? "over " + lower + " %" : lower + "-" + upper + " %";
}

std::string PerDay(const FlashLife& life) {
  if (life.bytesPerDay) return Bytes(*life.bytesPerDay);
  return life.percentPerDay ? Rounded(*life.percentPerDay, 3) + " %" : kUnknown;
}

std::string DaysLeft(const FlashLife& life) {
  if (life.daysLeft) return std::to_string(*life.daysLeft);
  // Days that say no more than that are not worth a figure.
  constexpr std::int64_t kSaysSomething = 30;
  const bool isTold = life.daysLeftAtLeast && *life.daysLeftAtLeast >= kSaysSomething;
  return isTold ? "over " + std::to_string(*life.daysLeftAtLeast) : kUnknown;
}

using Cells = std::array<std::string, 6>;

Cells CellsOf(const Row& row) {
  const DriveFigures& figures = row.drive.figures;
  const auto written = figures[DriveFigure::kBytesWritten];
  const auto errors = figures[DriveFigure::kMediaErrors];
  return {row.drive.place + (row.drive.place == row.drive.name ? "" : " " + row.drive.name),
          Used(row.drive),
          written ? Bytes(static_cast<double>(*written)) : kUnknown,
          PerDay(row.life),
          DaysLeft(row.life),
          errors ? std::to_string(*errors) : kUnknown};
}

void PrintTable(Session& session, const std::vector<Row>& rows) {
  std::vector<Cells> lines{{"drive", "used", "written", "per day", "days left", "errors"}};
  for (const Row& row : rows) lines.push_back(CellsOf(row));
  std::array<std::size_t, std::tuple_size_v<Cells>> widths{};
  for (const Cells& cells : lines) {
    for (std::size_t i = 0; i < cells.size(); ++i) widths[i] = std::max(widths[i], cells[i].size());
  }
  for (const Cells& cells : lines) {
    std::string line = LeftAligned(Escape(cells[0]), widths[0]);
    for (std::size_t i = 1; i < cells.size(); ++i) {
      line += "  " + RightAligned(cells[i], widths[i]);
    }
    session.out.line(line);
  }
}

// What is not known is left out.
Dictionary Described(const Row& row) {
  const Drive& drive = row.drive;
  Dictionary entry{{"drive", drive.place},
                   {"name", drive.name},
                   {"kind", KindName(drive.kind)},
                   {"state", StateName(drive.answer)},
                   {"root", drive.holdsRoot},
                   {"recordedDays", Int64(static_cast<std::int64_t>(row.life.recordedDays))}};
  if (!drive.model.empty()) entry["model"] = drive.model;
  if (!drive.firmware.empty()) entry["firmware"] = drive.firmware;
  if (const auto used = drive.figures[DriveFigure::kUsed]) {
    entry["usedPercent"] = Int64(*used);
    if (drive.usedStep > 1) entry["usedPercentAtLeast"] = Int64(*used - drive.usedStep);
  }
  if (const auto written = drive.figures[DriveFigure::kBytesWritten]) {
    entry["bytesWritten"] = Int64(*written);
  }
  if (const auto errors = drive.figures[DriveFigure::kMediaErrors]) {
    entry["errors"] = Int64(*errors);
  }
  if (row.life.bytesPerDay) entry["bytesPerDay"] = Double(*row.life.bytesPerDay);
  if (row.life.percentPerDay) entry["percentPerDay"] = Double(*row.life.percentPerDay);
  if (row.life.writeAmplification) {
    entry["writeAmplification"] = Double(*row.life.writeAmplification);
  }
  if (row.life.daysLeftAtLeast) entry["daysLeftAtLeast"] = Int64(*row.life.daysLeftAtLeast);
  if (row.life.daysLeft) entry["daysLeft"] = Int64(*row.life.daysLeft);
  Dictionary figures;
  for (const DriveFigureInfo& info : kDriveFigures) {
    if (const auto value = drive.figures[info.figure]) figures[info.name] = Int64(*value);
  }
  entry["figures"] = figures;
  return entry;
}

// The days before another drive was at the place are not the drive's.
FlashLife LifeOf(CounterStore& store, const FlashMemories& memories, const Drive& drive) {
  const std::int32_t today = store.TLDaysSince1970();
  const auto memory = memories.find(drive.place);
  const bool isKnown = memory != memories.end() && memory->second.identity == drive.identity;
  FlashDays days;
  if (isKnown && !ReadFlashDays(store, drive.place, memory->second, today, days)) {
    throw Failure("the recorded days cannot be read");
  }
  return EstimateFlashLife(drive, isKnown ? memory->second : FlashMemory(), days, today);
}

bool WasAsked(const Drive& drive) {
  return drive.answer == DriveAnswer::kTold || drive.answer == DriveAnswer::kNothingToTell;
}

}  // namespace

std::string DriveTrouble(const Drive& drive) {
  const std::string name = "the storage drive " + drive.name;
  switch (drive.answer) {
    case DriveAnswer::kTold:
    case DriveAnswer::kNothingToTell:
      return "";
    case DriveAnswer::kAsleep:
      return name + " is asleep, and is not woken for this";
    case DriveAnswer::kDenied:
      return "cannot ask " + name +
             (::geteuid() == 0 ? ": " + ErrnoText(drive.error) : ": this needs root");
    case DriveAnswer::kSilent:
      return drive.error != 0 ? "cannot ask " + name + ": " + ErrnoText(drive.error)
                              : name + " does not answer";
  }
  return "";
}

void PrintStorageHealth(Session& session, bool json) {
  const auto platform = session.open(Access::kReadOnly);
  Platform& services = platform->services();
  const std::vector<Drive> drives = services.drives.read();
  if (drives.empty()) throw Failure("there is no drive");
  if (std::ranges::none_of(drives, WasAsked)) throw Failure(DriveTrouble(drives.front()));
  std::optional<Dictionary> note;
  if (!services.counterStore.readNote(kFlashNote, note)) {
    throw Failure(session.messages.lastErrorOr("the recorded days cannot be read"));
  }
  const FlashMemories memories = ReadFlashMemories(note);
  std::vector<Row> rows;
  std::string failures;
  for (const Drive& drive : drives) {
    rows.push_back({drive, LifeOf(services.counterStore, memories, drive)});
    const std::string trouble = DriveTrouble(drive);
    // One that sleeps is as it should be.
    if (drive.answer == DriveAnswer::kAsleep) {
      session.messages.add(LogLevel::kError, trouble);
    } else if (!trouble.empty()) {
      failures += (failures.empty() ? "" : "; ") + trouble;
    }
  }
  if (json) {
    Array described;
    for (const Row& row : rows) described.push_back(Described(row));
    session.out.line(JsonText(Dictionary{{"drives", described}}, JsonForm::kPlain));
  } else {
    PrintTable(session, rows);
  }
  if (!failures.empty()) throw Failure(failures);
}

}  // namespace quorlet
