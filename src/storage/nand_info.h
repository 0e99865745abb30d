// The NAND information dictionary: what the flash-storage controller's statistics export says, as
// numbers under "nuvex.NANDInfo." keys.
#ifndef QUORLET_STORAGE_NAND_INFO_H_
#define QUORLET_STORAGE_NAND_INFO_H_

#include <array>
#include <concepts>
#include <cstdint>
#include <new>
#include <optional>
#include <string_view>

#include "drvreport/property_value.h"
#include "platform/platform.h"
#include "storage/statistics_parser.h"

namespace quorlet {

// clang-format off
// Only in a dictionary that tells of an error: the string "1", and what is wrong.
inline constexpr std::string_view kNANDInfoErrorKey = "nuvex.NANDInfo.Error";
inline constexpr std::string_view kNANDInfoErrorMessageKey = "nuvex.NANDInfo.ErrorMessage";

inline constexpr std::string_view kNANDInfoExportVersionKey = "nuvex.NANDInfo.ExportVersion";
inline constexpr std::string_view kNANDInfoDriverVersionKey = "nuvex.NANDInfo.DriverVersion";
inline constexpr std::string_view kNANDInfoDemoModeKey = "nuvex.NANDInfo.DemoMode";
inline constexpr std::string_view kNANDInfoNumVirtualBlocksKey = "nuvex.NANDInfo.NumVirtualBlocks";
inline constexpr std::string_view kNANDInfoPagesPerVirtualBlockKey = "nuvex.NANDInfo.PagesPerVirtualBlock";
inline constexpr std::string_view kNANDInfoBytesPerPageKey = "nuvex.NANDInfo.BytesPerPage";
inline constexpr std::string_view kNANDInfoNumLogicalReadsKey = "nuvex.NANDInfo.NumLogicalReads";
inline constexpr std::string_view kNANDInfoNumLogicalWritesKey = "nuvex.NANDInfo.NumLogicalWrites";
inline constexpr std::string_view kNANDInfoNumFreeVirtualBlocksKey = "nuvex.NANDInfo.NumFreeVirtualBlocks";
inline constexpr std::string_view kNANDInfoNumWearLevelOpsKey = "nuvex.NANDInfo.NumWearLevelOps";
inline constexpr std::string_view kNANDInfoNumPhysicalReadsKey = "nuvex.NANDInfo.NumPhysicalReads";
inline constexpr std::string_view kNANDInfoNumPhysicalWritesKey = "nuvex.NANDInfo.NumPhysicalWrites";
inline constexpr std::string_view kNANDInfoNumPhysicalErasesKey = "nuvex.NANDInfo.NumPhysicalErases";
inline constexpr std::string_view kNANDInfoNumNodesFreeKey = "nuvex.NANDInfo.NodesFree";
inline constexpr std::string_view kNANDInfoNumNodesTotalKey = "nuvex.NANDInfo.NodesTotal";
inline constexpr std::string_view kNANDInfoFormatWeeksSince2000Key = "nuvex.NANDInfo.formatDaysSince2000";
inline constexpr std::string_view kNANDInfoNumSleepOpsKey = "nuvex.NANDInfo.NumSleepOps";
inline constexpr std::string_view kNANDInfoHighEnduranceBlockEraseCountKey = "nuvex.NANDInfo.HighEnduranceBlockEraseCount";
inline constexpr std::string_view kNANDInfoBlocksPerVirtualBlock = "nuvex.NANDInfo.BlocksPerVirtualBlock";
inline constexpr std::array<std::string_view, 5> kNANDInfoReadsBeforeErasureKeys{
    "nuvex.NANDInfo.ReadsBeforeErasure0",
    "nuvex.NANDInfo.ReadsBeforeErasure50000",
    "nuvex.NANDInfo.ReadsBeforeErasure100000",
    "nuvex.NANDInfo.ReadsBeforeErasure150000",
    "nuvex.NANDInfo.ReadsBeforeErasure200000",
};
inline constexpr std::string_view kNANDInfoIntermediatePartitionSizeKey = "nuvex.NANDInfo.IntermediatePartitionSize";
inline constexpr std::string_view kNANDInfoNumMaintenanceRequestsKey = "nuvex.NANDInfo.NumMaintenanceRequests";
inline constexpr std::string_view kNANDInfoMaintenanceFailedReadKey = "nuvex.NANDInfo.MaintenanceRequestsFailedRead";
inline constexpr std::string_view kNANDInfoMaintenanceFailedProgKey = "nuvex.NANDInfo.MaintenanceRequestsFailedProg";
inline constexpr std::string_view kNANDInfoMaintenanceFailedEraseKey = "nuvex.NANDInfo.MaintenanceRequestsFailedErase";

// Of the dictionary that CopyVMFreezerNANDInfo makes.
inline constexpr std::string_view kNANDInfoVMFreezerNumPhysicalWritesKey = "nuvex.NANDInfo.VMFreezer.NumPhysicalWrites";
inline constexpr std::string_view kNANDInfoVMFreezerErrorKey = "nuvex.NANDInfo.VMFreezer.Error";
inline constexpr std::string_view kNANDInfoVMFreezerErrorMessageKey = "nuvex.NANDInfo.VMFreezer.ErrorMessage";
// clang-format on

// A new dictionary of numbers, or one with the two error keys when the export cannot be read or
// its version is 0. Messages go to standard error.
Dictionary CopyNANDInfo(Platform& platform);

// Sets the entries of the dictionary in `target`, except the versions and the demo mode; nothing
// when the export cannot be read or its version is 0.
void DumpNANDInfo(Platform& platform, Dictionary& target);

// The dictionary of a parsed export. With `forMerge`, as DumpNANDInfo needs it: nothing when the
// version is 0.
std::optional<Dictionary> BuildNANDInfoDictionary(Platform& platform,
                                                  const FSPParseContext& context, bool forMerge);

namespace internal {
void ReportNumberFailure(StandardError& standardError, const void* value);
}

// Stores a number under the key: Int8, Int32, Int64 or Double, as the value's type says. When
// memory runs out, one message on standard error, and nothing is stored.
template <typename T>
requires(std::same_as<T, std::int8_t> || std::same_as<T, std::int32_t> ||
         std::same_as<T, std::int64_t> ||
         std::same_as<T, double>) void SetNumberValue(StandardError& standardError,
                                                      Dictionary& dictionary, std::string_view key,
                                                      const T& value) try {
  if constexpr (std::same_as<T, std::int8_t>) {
    dictionary[key] = Int8(value);
  } else if constexpr (std::same_as<T, std::int32_t>) {
    dictionary[key] = Int32(value);
  } else if constexpr (std::same_as<T, std::int64_t>) {
    dictionary[key] = Int64(value);
  } else {
    dictionary[key] = Double(value);
  }
} catch (const std::bad_alloc&) {
  internal::ReportNumberFailure(standardError, &value);
}

}  // namespace quorlet

#endif  // QUORLET_STORAGE_NAND_INFO_H_
