// The drives that the device's data lies on, and what each tells about its health.
#ifndef QUORLET_PLATFORM_DRIVES_H_
#define QUORLET_PLATFORM_DRIVES_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace quorlet {

enum class DriveKind : std::uint8_t { kNvme, kEmmc, kSd, kUfs, kSata };

enum class DriveAnswer : std::uint8_t {
  kTold,
  kNothingToTell,  // there is no way in which it could tell its health
  kAsleep,         // it was left asleep
  kDenied,         // the system does not let this user ask
  kSilent,         // it did not answer, or not in time
};

enum class DriveFigure : std::uint8_t {
  kUsed,
  kUsedA,
  kUsedB,
  kReserve,
  kEnhancedArea,
  kSpare,
  kSpareThreshold,
  kWarnings,
  kTemperature,
  kBytesRead,
  kBytesWritten,
  kReads,
  kWrites,
  kBusy,
  kPowerCycles,
  kPowerOn,
  kUnsafeShutdowns,
  kMediaErrors,
  kErrorLog,
  kWarm,
  kCritical,
  kThrottled1,
  kThrottled2,
  kThrottledTime1,
  kThrottledTime2,
  kMediaBytesWritten,
  kMediaBytesRead,
  kBadBlocks,
  kBadSystemBlocks,
  kUncorrectableReads,
  kCorrectedReads,
  kErasesMax,
  kErasesMin,
  kIncompleteShutdowns,
  kFreeBlocks,
  kCapacitor,
};

enum class DriveUnit : std::uint8_t { kNone, kPercent, kBytes, kSeconds, kMillidegrees, kEvents };

struct DriveFigureInfo {
  DriveFigure figure;
  std::string_view name;
  DriveUnit unit;
};
// By figure.
// clang-format off
inline constexpr auto kDriveFigures = std::to_array<DriveFigureInfo>({
    {DriveFigure::kUsed,                "used",                 DriveUnit::kPercent},
    {DriveFigure::kUsedA,               "used.a",               DriveUnit::kPercent},
    {DriveFigure::kUsedB,               "used.b",               DriveUnit::kPercent},
    {DriveFigure::kReserve,             "reserve",              DriveUnit::kNone},
    {DriveFigure::kEnhancedArea,        "enhanced.bytes",       DriveUnit::kBytes},
    {DriveFigure::kSpare,               "spare",                DriveUnit::kPercent},
    {DriveFigure::kSpareThreshold,      "spare.threshold",      DriveUnit::kPercent},
    {DriveFigure::kWarnings,            "warnings",             DriveUnit::kNone},
    {DriveFigure::kTemperature,         "temperature",          DriveUnit::kMillidegrees},
    {DriveFigure::kBytesRead,           "bytes.read",           DriveUnit::kBytes},
    {DriveFigure::kBytesWritten,        "bytes.written",        DriveUnit::kBytes},
    {DriveFigure::kReads,               "reads",                DriveUnit::kEvents},
    {DriveFigure::kWrites,              "writes",               DriveUnit::kEvents},
    {DriveFigure::kBusy,                "busy",                 DriveUnit::kSeconds},
    {DriveFigure::kPowerCycles,         "power.cycles",         DriveUnit::kEvents},
    {DriveFigure::kPowerOn,             "power.on",             DriveUnit::kSeconds},
    {DriveFigure::kUnsafeShutdowns,     "unsafe.shutdowns",     DriveUnit::kEvents},
    {DriveFigure::kMediaErrors,         "media.errors",         DriveUnit::kEvents},
    {DriveFigure::kErrorLog,            "error.log.entries",    DriveUnit::kEvents},
    {DriveFigure::kWarm,                "warm",                 DriveUnit::kSeconds},
    {DriveFigure::kCritical,            "critical",             DriveUnit::kSeconds},
    {DriveFigure::kThrottled1,          "throttled.1",          DriveUnit::kEvents},
    {DriveFigure::kThrottled2,          "throttled.2",          DriveUnit::kEvents},
    {DriveFigure::kThrottledTime1,      "throttled.1.time",     DriveUnit::kSeconds},
    {DriveFigure::kThrottledTime2,      "throttled.2.time",     DriveUnit::kSeconds},
    {DriveFigure::kMediaBytesWritten,   "media.bytes.written",  DriveUnit::kBytes},
    {DriveFigure::kMediaBytesRead,      "media.bytes.read",     DriveUnit::kBytes},
    {DriveFigure::kBadBlocks,           "bad.blocks",           DriveUnit::kEvents},
    {DriveFigure::kBadSystemBlocks,     "bad.system.blocks",    DriveUnit::kEvents},
    {DriveFigure::kUncorrectableReads,  "uncorrectable.reads",  DriveUnit::kEvents},
    {DriveFigure::kCorrectedReads,      "corrected.reads",      DriveUnit::kEvents},
    {DriveFigure::kErasesMax,           "erases.max",           DriveUnit::kEvents},
    {DriveFigure::kErasesMin,           "erases.min",           DriveUnit::kEvents},
    {DriveFigure::kIncompleteShutdowns, "incomplete.shutdowns", DriveUnit::kEvents},
    {DriveFigure::kFreeBlocks,          "free.blocks",          DriveUnit::kPercent},
    {DriveFigure::kCapacitor,           "capacitor",            DriveUnit::kPercent},
});
// clang-format on
static_assert([] {
  for (std::size_t i = 0; i < kDriveFigures.size(); ++i) {
    if (static_cast<std::size_t>(kDriveFigures[i].figure) != i) return false;
  }
  return true;
}());

// What a drive tells; a figure that it does not tell is missing. docs/drives.md says what each
// means. None is negative.
class DriveFigures {
 public:
  // Numbers beyond a signed 64-bit one become the largest.
  void set(DriveFigure figure, std::uint64_t value) {
    values_[static_cast<std::size_t>(figure)] =
        static_cast<std::int64_t>(value > INT64_MAX ? INT64_MAX : value);
  }
  std::optional<std::int64_t> operator[](DriveFigure figure) const {
    return values_[static_cast<std::size_t>(figure)];
  }
  bool empty() const {
    for (const auto& value : values_) {
      if (value) return false;
    }
    return true;
  }
  bool operator==(const DriveFigures&) const = default;

 private:
  std::array<std::optional<std::int64_t>, kDriveFigures.size()> values_{};
};

struct Drive {
  // Where it is plugged in ("0000:3d:00.0"), which stays; the kernel's name may change hands.
  std::string place;
  std::string name;
  DriveKind kind = DriveKind::kNvme;
  std::string model;     // may be empty, as may be:
  std::string firmware;  // its version
  bool holdsRoot = false;
  DriveAnswer answer = DriveAnswer::kSilent;
  int error = 0;  // of the system, when that is why there is no answer
  // Of the model and the serial number, which cannot be told from it; 0 while they are not known.
  std::int64_t identity = 0;
  DriveFigures figures;
  // How many percent lie between two values of kUsed, which is the upper end of them.
  std::int64_t usedStep = 1;
};

class Drives {
 public:
  virtual ~Drives() = default;
  // Every drive by its place, asked now, or at most a second ago. One that has not answered in time
  // once is not asked again.
  virtual std::vector<Drive> read() = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_DRIVES_H_
