#include "collectors/nand_scalars.h"

#include <new>

#include "collectors/run_step.h"
#include "storage/nand_info.h"
#include "storage/structured_log.h"

namespace quorlet {
namespace {

std::optional<Dictionary> NANDInfo(Platform& platform) try {
  return CopyNANDInfo(platform);
} catch (const std::bad_alloc&) {
  return std::nullopt;
}

}  // namespace

void PushNANDInfoScalars(Platform& platform, CounterBatch& counters, bool logsStorage) {
  if (logsStorage) {
    RunStep(platform.log, "storage structured log", [&] {
      StorageLogState state;
      DumpStorageStructuredLog(platform, state, false);
    });
  }
  const auto info = NANDInfo(platform);
  if (!info) {
    platform.log.log("failed to get NAND info dict");
    return;
  }
  if (const PropertyValue* error = info->find(kNANDInfoErrorKey)) {
    const PropertyValue* message = info->find(kNANDInfoErrorMessageKey);
    platform.log.log("error reading nand info, error %@ with message %@", *error,
                     message != nullptr ? *message : PropertyValue("(null)"));
    return;
  }
  for (const auto& [key, value] : *info) {
    const Number* number = value.asNumber();
    if (number != nullptr) counters.TLClientSetValueForScalarKey(key, number->toInt64());
  }
}

}  // namespace quorlet
