#include "platform/linux/drives/drives_publisher.h"

#include <utility>

#include "platform/linux/base/kernel_text.h"

namespace quorlet {
namespace {

constexpr char kGroup[] = "Drives";
constexpr std::uint64_t kPlainNumbers = 0;
constexpr std::uint64_t kSeconds = 0x0100'0000'0000'0000;
constexpr std::string_view kPower = "power";

std::uint64_t UnitCode(DriveUnit unit) {
  switch (unit) {
    case DriveUnit::kBytes:
      return kBytes;
    case DriveUnit::kSeconds:
      return kSeconds;
    case DriveUnit::kMillidegrees:
      return kMillidegrees;
    case DriveUnit::kEvents:
      return kEvents;
    case DriveUnit::kNone:
    case DriveUnit::kPercent:
      break;
  }
  return kPlainNumbers;
}

// What the pass stores under keys of their own, or what a day's last value says nothing about.
bool IsDaily(DriveFigure figure) {
  return figure != DriveFigure::kUsed && figure != DriveFigure::kBytesWritten &&
         figure != DriveFigure::kMediaBytesWritten && figure != DriveFigure::kTemperature;
}

// Not for a drive that tells nothing at all: it would be a group of nothing.
bool HasPower(const FoundDrive& drive) {
  return drive.kind == DriveKind::kNvme || drive.kind == DriveKind::kUfs;
}

class DrivesPublisher : public LivePublisher {
 public:
  explicit DrivesPublisher(std::shared_ptr<DriveReader> reader) : reader_(std::move(reader)) {}

  LiveLegend describe() override {
    LiveLegend legend;
    for (const FoundDrive& found : reader_->find()) {
      const Drive drive = reader_->read(found);
      for (const DriveFigureInfo& info : kDriveFigures) {
        if (!drive.figures[info.figure]) continue;
        legend.add({.group = kGroup, .subgroup = found.place, .unit = UnitCode(info.unit)},
                   {.id = channelID(found, info.name),
                    .name = channelName(found, info.name),
                    .isDaily = IsDaily(info.figure)});
      }
      if (!HasPower(found)) continue;
      legend.add({.group = kGroup, .subgroup = found.place, .unit = kMilliseconds},
                 {.id = channelID(found, kPower),
                  .name = channelName(found, kPower),
                  .format = ReportFormat::kState,
                  .elements = 2});
    }
    return legend;
  }

  void read(LiveRuns& runs) override {
    for (const FoundDrive& found : reader_->find()) {
      const Drive drive = reader_->read(found);
      for (const DriveFigureInfo& info : kDriveFigures) {
        if (const auto value = drive.figures[info.figure]) {
          runs.addSimple(channelID(found, info.name), *value);
        }
      }
      if (HasPower(found)) addPower(found, runs);
    }
  }

 private:
  static std::string channelName(const FoundDrive& drive, std::string_view figure) {
    return "flash." + drive.place + "." + std::string(figure);
  }
  static std::uint64_t channelID(const FoundDrive& drive, std::string_view figure) {
    return HashedID(channelName(drive, figure));
  }

  // How often it went from one to the other is not told.
  static void addPower(const FoundDrive& drive, LiveRuns& runs) {
    const std::string power =
        drive.directory + (drive.kind == DriveKind::kNvme ? "/device/power/" : "/power/");
    const auto active = ReadCounter(power + "runtime_active_time");
    const auto asleep = ReadCounter(power + "runtime_suspended_time");
    if (!active || !asleep) return;
    const auto state = [](std::string_view id, std::uint64_t residency) {
      return LiveValues{static_cast<std::int64_t>(PackedID(id)), 0,
                        static_cast<std::int64_t>(residency)};
    };
    const LiveValues states[] = {state("ACTIVE", *active), state("ASLEEP", *asleep)};
    runs.add(channelID(drive, kPower), states);
  }

  const std::shared_ptr<DriveReader> reader_;
};

}  // namespace

std::unique_ptr<LivePublisher> MakeDrivesPublisher(std::shared_ptr<DriveReader> reader) {
  return std::make_unique<DrivesPublisher>(std::move(reader));
}

}  // namespace quorlet
