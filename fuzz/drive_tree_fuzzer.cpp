// Any texts of /sys and /proc about an eMMC and a UFS drive: figures that are in range, names
// that are clean.

#include "fakes/fake_system_log.h"
#include "fuzz_support.h"
#include "platform/linux/base/kernel_text.h"
#include "platform/linux/drives/drive_figures.h"
#include "platform/linux/drives/drive_reader.h"

namespace quorlet {
namespace {

#define CARD "/sys/block/mmcblk0/"
#define UFS "/sys/bus/platform/drivers/ufshcd-x/1d84000.ufs/"

constexpr const char* kPaths[] = {
    "/proc/self/mountinfo",
    CARD "device/type",
    CARD "device/life_time",
    CARD "device/pre_eol_info",
    CARD "device/enhanced_area_size",
    CARD "device/name",
    CARD "device/cid",
    CARD "dev",
    CARD "mmcblk0p1/dev",
    UFS "power/runtime_status",
    // Only there, so that it is found: what would be read of it takes a process for each text.
    UFS "health_descriptor/none",
};

void CheckFigures(const Drive& drive) {
  for (const DriveFigureInfo& info : kDriveFigures) {
    Expect(drive.figures[info.figure].value_or(0) >= 0, "a figure that is negative", info.name);
  }
  for (const DriveFigure used : {DriveFigure::kUsed, DriveFigure::kUsedA, DriveFigure::kUsedB}) {
    const auto percent = drive.figures[used].value_or(10);
    Expect(percent % 10 == 0 && percent >= 10 && percent <= 110, "no tenth of a life");
  }
  Expect(drive.figures.empty() == (drive.answer != DriveAnswer::kTold), "it told nothing");
  Expect(CleanName(drive.model) == drive.model, "a name is not clean", drive.model);
  Expect(!drive.place.empty() && drive.identity >= 0, "no place");
}

}  // namespace
}  // namespace quorlet

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  static FuzzFiles files;
  const auto parts = Parts(AsText(data, size), std::size(kPaths));
  for (std::size_t i = 0; i < std::size(kPaths); ++i) files.set(kPaths[i], parts[i]);
  FakeSystemLog log;
  const auto reader = std::make_shared<DriveReader>(LoggingRoot(files.device().root(), log),
                                                    [](auto&&...) { return NvmePages(); });
  // The UFS device's own texts are asked for by a process: here they are decoded at once.
  for (const FoundDrive& found : reader->find()) {
    if (found.kind == DriveKind::kUfs) {
      static_cast<void>(IsAsleep(LoggingRoot(files.device().root(), log), found));
    } else {
      CheckFigures(reader->read(found));
    }
  }
  Drive ufs;
  ufs.place = "ufs";
  AddLifeTime(parts[2], parts[3], parts[4], ufs.figures);
  if (!ufs.figures.empty()) ufs.answer = DriveAnswer::kTold;
  CheckFigures(ufs);
  return 0;
}
