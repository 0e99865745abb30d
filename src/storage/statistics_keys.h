// The counters that the statistics export of the storage controller may hold.
//
// A counter name is a key's name, or for an element of a record with several values, the name with
// the element's index: "padSizes2". Each has a slot, a small number that stands for the name.
#ifndef QUORLET_STORAGE_STATISTICS_KEYS_H_
#define QUORLET_STORAGE_STATISTICS_KEYS_H_

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace quorlet {

struct StatisticsKey {
  std::uint16_t id;
  std::string_view name;
  std::uint16_t cap = 1;  // at most this many values of a record are kept
};

// clang-format off
inline constexpr auto kStatisticsKeys = std::to_array<StatisticsKey>({
    {1, "version"},
    {2, "hostWriteXacts"},
    {3, "hostReadXacts"},
    {4, "hostWrites"},
    {5, "hostWritesDyn"},
    {6, "hostWritesStatic"},
    {7, "hostReads"},
    {8, "validLbas"},
    {9, "shutdowns"},
    {10, "boots"},
    {11, "uncleanBoots"},
    {12, "IND_pool_free"},
    {13, "IND_pool_count"},
    {14, "hostWriteLogHisto", 10},
    {15, "hostReadLogHisto", 10},
    {16, "gcWrites"},
    {17, "wearLevMoves"},
    {18, "nandWrites"},
    {19, "nandReads"},
    {20, "bandErases"},
    {22, "numPfail"},
    {23, "numEfail"},
    {24, "numRefreshes"},
    {27, "hostWritesMeta"},
    {28, "numSleepOps"},
    {30, "cntTimeWentBackWardOnBoot"},
    {31, "cntTimeWentBackWard"},
    {34, "powerOnHours"},
    {36, "smartCritWarnings"},
    {37, "numFlushes"},
    {38, "numUnmap"},
    {39, "numUnmapSec"},
    {41, "clogProgram"},
    {42, "clogPFail"},
    {43, "clogRead"},
    {44, "clogRFail"},
    {45, "maxHighEnduranceBlockErases"},
    {46, "numFactoryBad"},
    {47, "numGrownBad"},
    {48, "numFreeVirtualBlocks"},
    {49, "bytesPerPage"},
    {50, "pagesPerVirtualBlock"},
    {51, "blocksPerVirtualBlock"},
    {52, "numVirtualBlocks"},
    {53, "exportVersion"},
    {54, "ECBins", 100},
    {55, "RCBins", 100},
    {56, "utilFormatTime"},
    {57, "calendarTime"},
    {58, "wallTime"},
    {59, "cmdq_flush_us"},
    {60, "cmdq_unmap_us"},
    {61, "cmdq_pri0_r_us"},
    {62, "cmdq_pri0_w_us"},
    {63, "cmdq_pri1_r_us"},
    {64, "cmdq_pri1_w_us"},
    {65, "cmdq_pri2_r_us"},
    {66, "cmdq_pri2_w_us"},
    {67, "cmdq_pri3_r_us"},
    {68, "cmdq_pri3_w_us"},
    {69, "host_idle_ms"},
    {70, "cmd_hysteresis_window_us"},
    {71, "cmd_lowPriHoldoffDelay_us"},
    {72, "cmd_lowPriHoldoffEnabled"},
    {73, "cmd_expedite_num_success"},
    {75, "cmd_expedite_num_failures"},
    {76, "num_trimerase"},
    {77, "staticSizeInMB"},
    {80, "slcInvalidations"},
    {81, "slcGCInvalidations"},
    {82, "hostSectorsDuringGCon"},
    {83, "highWaterMarkSLCUsed"},
    {84, "intermediateBandErases"},
    {85, "intermediatePartitionStart"},
    {86, "userPartitionStart"},
    {87, "iolog_lbas"},
    {88, "bandsAgeBins", 10},
    {89, "intermediateBandsAgeBins", 10},
    {90, "qosPerCmdQ", 160},
    {91, "maxQosPerCmdQ", 10},
    {92, "shutdownDuringGC"},
    {93, "numBandsRefreshedForAgePerTier", 3},
    {94, "bdrDeltaHot", 20},
    {95, "numRefreshOnClockLoss"},
    {96, "numRefreshOnErrNandRefreshRel"},
    {97, "numBGRefreshMoves"},
    {98, "numBGPaddingMoves"},
    {99, "hostWritesPhoto"},
    {107, "pushSyncWrites"},
    {109, "cmd_rw_hysteresis_us"},
    {110, "photoFlowMode"},
    {112, "numBandsPaddedForAge"},
    {113, "bandsPerHostFlow", 4},
    {114, "bandsPerSpecialFlow", 5},
    {115, "secsPerHostFlow", 4},
    {116, "secsPerSpecialFlow", 5},
    {118, "overWritesPerHostFlow", 4},
    {119, "overWritesPerSpecialFlow", 5},
    {120, "padSectorsPerFlow", 10},
    {121, "padSizes", 4},
    {122, "unmapsPerHostFlow", 4},
    {123, "unmapsPerSpecialFlow", 5},
    {124, "coldestCycle", 2},
    {125, "hottestCycle", 2},
    {126, "gcLonlyWrites"},
    {127, "gcPLWrites"},
    {129, "pagesPerVirtualBlockSlc"},
    {130, "bdrPadding"},
    {131, "errInjCounters", 8},
    {132, "raidSuccessfulReconstructionInternal"},
    {133, "raidSuccessfulReconstructionHost"},
    {134, "raidFailedReconstructionInternal"},
    {135, "raidFailedReconstructionHost"},
    {136, "raidBandsPerHostFlow"},
    {137, "raidSecsPerHostFlow"},
    {138, "gcFreeL"},
    {139, "gcDestinations"},
    {140, "gcFragments"},
    {141, "numMemChoke"},
    {142, "maxMemChokeDuration"},
    {143, "memChokeDuration"},
    {144, "numMemExtreme"},
    {145, "maxMemExtremeDuration"},
    {146, "memExtremeDuration"},
    {147, "bandGetsExtreme"},
    {148, "bandGetsLow"},
    {149, "numHostChoke"},
    {150, "AbortSkip_AbandonFlowAfterPowerUp"},
    {151, "AbortSkip_RebuildDuringProgram"},
    {152, "AbortSkip_ProgramError"},
    {153, "AbortSkip_ReadErrorOpenBand"},
    {154, "AbortSkip_FailedRebuildingParity"},
    {155, "AbortPad_OpenRefreshBand"},
    {156, "AbortPad_CloseBands"},
    {157, "AbortPad_SetPhoto"},
    {158, "AbortPad_GcNoSource"},
    {159, "AbortPad_Format"},
    {160, "nandDiscoveryDuration"},
    {161, "coreCCEnableDuration"},
    {163, "coreOpenDuration"},
    {164, "coreWritableDuration"},
    {165, "coreClogLoadDuration"},
    {166, "bulkProgram"},
    {167, "bulkPFail"},
    {168, "bulkRead"},
    {169, "bulkRFail"},
    {170, "bulkSkipRead"},
    {171, "bulkPartial"},
    {172, "ueccReads"},
    {182, "internalUeccs"},
    {183, "e2eFail"},
    {184, "TempSensorMax"},
    {185, "TempSensorMin"},
    {186, "powerUpFromDDR"},
    {187, "numMemLow"},
    {188, "maxMemLowDuration"},
    {189, "memLowDuration"},
    {190, "numFences"},
    {191, "hostPassiveIO"},
    {192, "odtsMax"},
    {193, "defragMFromOrphans"},
    {194, "defragMFromFragments"},
    {195, "defragMTime"},
    {196, "defragMMaxTime"},
    {197, "raidFailedLbaMismatch"},
    {198, "numSyscfgWrites"},
    {199, "indmbUnitsXfer"},
    {200, "indmbUnitsCache"},
    {201, "indmbUnitsInd"},
    {202, "wcacheFS_Mbytes"},
    {203, "wcacheDS_Mbytes"},
    {204, "powerOnSeconds"},
    {205, "numUnknownTokenHostRead"},
    {206, "numUnmmapedTokenHostRead"},
    {207, "numOfThrottlingEntriesPerLevel", 16},
    {208, "wcacheFS_MbytesMin"},
    {209, "wcacheFS_MbytesMax"},
    {210, "prepareForShutdownFailCounter"},
    {211, "lpsrEntry"},
    {212, "lpsrExit"},
    {213, "crcInternalReadFail", 8},
    {214, "wcacheFSEvictCnt"},
    {215, "wcacheFSEvictSize"},
    {216, "wcacheFSWr"},
    {217, "wcacheDSWr"},
    {218, "wcacheFSEvictSizeLogDist", 10},
    {219, "prepareForShutdownTimeoutCounter"},
    {220, "prepareForShutdownCancelCounter"},
    {221, "RD_openBandCount"},
    {222, "RD_openBandNops"},
    {223, "RD_closedBandEvictCount"},
    {224, "RD_closedBandEvictSectors"},
    {227, "wcacheFSOverWrLogSizeCnts", 10},
    {228, "wcacheFSOverWrSizeByFlow", 4},
    {229, "indmbXferCountTo", 2},
    {230, "indmbAccumulatedTimeBetweenXfers", 2},
    {231, "maxGracefulBootTimeMs"},
    {232, "maxUngracefulBootTimeMs"},
    {233, "averageGracefulBootTimeMs"},
    {234, "averageUngracefulBootTimeMs"},
    {235, "gracefulBootTimeLogMs", 8},
    {236, "ungracefulBootTimeLogMs", 8},
    {237, "CalibrationCount", 4},
    {238, "CalibrationLastTmp"},
    {239, "CalibrationMaxTmp"},
    {240, "CalibrationMinTmp"},
    {241, "ungracefulBootWorstIndicator"},
    {242, "metaMismatchReread"},
    {243, "numS3SleepOps"},
    {244, "odtsCurrent"},
    {245, "prefetchReads"},
    {246, "prefetchHits"},
    {247, "prefetchWritesInvalidation"},
    {248, "indmbUnitsTotal"},
    {249, "selfThrottlingEngage"},
    {250, "selfThrottlingDisengage"},
    {252, "AbortSkip_WlpMode"},
    {253, "hostWritesWlpMode"},
    {254, "numClogDoubleUnc"},
    {256, "AbortPad_WlpMode"},
    {257, "bonfireIntermediateBandErases"},
    {258, "bonfireUserBandErases"},
    {259, "bonfireIntermediateBandProgs"},
    {260, "bonfireUserBandProgs"},
    {261, "bonfireIntermediatePageReads"},
    {262, "bonfireUserPageReads"},
    {263, "refreshUtil00"},
    {264, "failToReadUtil00"},
    {265, "readCountHisto", 5},
    {266, "readAmpHisto", 16},
    {267, "totalReadAmp"},
    {268, "nvmeModeSelect", 4},
    {269, "numBootBlockRefreshSuccess", 8},
    {270, "numBootBlockRefreshFail", 8},
    {271, "numUnsupportedAsi"},
    {272, "NumTerminatedProgramSegs"},
    {273, "indParityPagesDrops"},
    {274, "indFlowPrograms"},
    {277, "powerBudgetSelect", 4},
    {278, "RxBurnBandsProgrammed"},
    {279, "RxBurnNandWrites"},
    {280, "E2EDPErrorCounters", 12},
    {281, "wcacheSectorsMax"},
    {282, "wcacheSectorsMin"},
    {283, "wcacheSectorsCur"},
    {284, "wcacheDS_SectorsMax"},
    {285, "wcacheDS_SectorsMin"},
    {286, "wcacheDS_SectorsCur"},
    {287, "wcacheFS_Reads"},
    {288, "wcacheDS_Reads"},
    {289, "mspBootBlockReadFail", 32},
    {290, "mspBootBlockProgFail", 32},
    {291, "mspBootBlockEraseFail", 32},
    {292, "bandsRefreshedOnError"},
    {298, "perHostReads", 2},
    {299, "perHostReadXacts", 2},
    {300, "perHostWrites", 2},
    {301, "perHostWriteXacts", 2},
    {302, "perHostNumFlushes", 2},
    {303, "perHostNumFences", 2},
    {304, "commitPadSectorsPerFlow", 10},
    {305, "wcacheDSOverWrLogSizeCnts", 10},
    {306, "wcacheDSOverWrSizeByFlow", 4},
    {307, "CmdRaisePrioiryEvents", 10},
    {308, "utilNumVerification"},
    {309, "utilRefreshes"},
    {310, "utilBDRErrors"},
    {311, "indBandsPerFlow"},
    {312, "secsPerIndFlow"},
    {313, "indDecodedECC"},
    {314, "numBootBlockValidateSuccess", 8},
    {315, "numBootBlockValidateFail", 8},
    {316, "clogPagesFillingPercentage", 4},
    {317, "bdrCalTimeAccFactor"},
    {318, "bootChainRdError"},
    {319, "bootChainBlankError"},
    {320, "bootChainRefreshError"},
    {321, "bootChainVersionError"},
    {322, "mspBootBlockMismatch"},
    {323, "mspBootBlockMismatchErr"},
    {324, "bitflipAddr", 5},
    {325, "bitflipCount", 5},
    {326, "bitflipDupes", 5},
    {327, "bandsMaxTempHisto", 22},
    {328, "bandsMinTempHisto", 22},
    {329, "bandsLifeTimeTempHisto", 22},
    {330, "bandsDeltaTempHisto", 22},
    {331, "bandsCrossTempHisto", 45},
    {332, "wcacheWaitLogMs", 10},
    {333, "wcacheDS_segsSortedLogSize", 10},
    {334, "numFirmwareWrites"},
    {335, "numBisWrites"},
    {336, "numBootChainUpdates"},
    {337, "cntCalTimeWentBackWard"},
    {338, "indBoRecoveries"},
    {340, "numCrossTempUecc"},
    {341, "latencyMonitorError"},
    {343, "utilUeccReads"},
    {344, "numOfAvoidedGCDueToTemp"},
    {345, "forceShutdowns"},
    {346, "gcSlcDestinations"},
    {347, "indReplayExtUsed"},
    {348, "defectsPerPackageOverflow"},
    {349, "RxBurnIntBandsProgrammed"},
    {350, "RxBurnUsrBandsProgrammed"},
    {351, "RxBurnIntNandWrites"},
    {352, "RxBurnUsrNandWrites"},
    {353, "clogLastStripeUeccs"},
    {354, "GC_MidDestSrcSwitchSLC2TLC"},
    {355, "GC_MidDestSrcSwitchTLC2SLC"},
    {356, "nvme_stats_shutdown_count_host0_normal"},
    {357, "nvme_stats_shutdown_count_host1_normal"},
    {358, "nvme_stats_shutdown_count_host0_s2r"},
    {359, "nvme_stats_shutdown_count_host1_s2r"},
    {360, "gcPDusterIntrSrcValidityHisto", 16},
    {361, "gcPDusterUserSrcValidityHisto", 16},
    {362, "raidFailedReadParityHost"},
    {363, "raidFailedReadParityInternal"},
    {364, "lhotNumSkipes"},
    {365, "lhotNumIsHotCalls"},
    {366, "lhotFullLap"},
    {367, "lhotSkipPrecent"},
    {368, "eraseSuspendEvents"},
    {369, "eraseSuspendedStatuses"},
    {370, "eraseSuspendedBands"},
    {371, "eraseSuspendSituationsBelowThreshold"},
    {372, "eraseSuspendSituationsAboveThreshold"},
    {374, "bdrLastDoneHr"},
    {375, "bdrBackupThreshHrs"},
    {376, "clogPortableProgBufs"},
    {377, "clogPortableDropBufs"},
    {378, "clogPortablePadSectors"},
    {379, "numRetiredBlocks"},
    {380, "raidFailedReadQParity"},
    {381, "numRefreshOnErrNandRefreshPerf"},
    {382, "raidReconstructReads"},
    {383, "gcReadsNoBlog"},
    {384, "AbortSkip_MPBXReadVerifyClosedBand"},
    {385, "openBandReadFail"},
    {386, "AbortSkip_MPBXReadVerifyOpenBand"},
    {387, "AbortSkip_MBPXFailedRebuildingParity"},
    {388, "raidSuccessfulPMXReconstructionInternal"},
    {389, "raidSuccessfulPMXReconstructionHost"},
    {390, "raidFailedPMXReconstructionInternal"},
    {391, "raidFailedPMXReconstructionHost"},
    {392, "raidSuccessfulRMXReconstructionInternal"},
    {393, "raidSuccessfulRMXReconstructionHost"},
    {394, "raidFailedRMXReconstructionInternal"},
    {395, "raidFailedRMXReconstructionHost"},
});
// clang-format on

static_assert(kStatisticsKeys.size() == 349);
static_assert(std::ranges::adjacent_find(kStatisticsKeys, std::ranges::greater_equal(),
                                         &StatisticsKey::id) == kStatisticsKeys.end());

// Of all names, those of records with one value included.
using StatisticsSlot = std::uint16_t;

namespace internal {

inline constexpr auto kStatisticsKeyById = [] {
  std::array<std::uint16_t, kStatisticsKeys.back().id + 1> indexes{};  // one too high; 0: no key
  for (std::size_t i = 0; i < kStatisticsKeys.size(); ++i) {
    indexes[kStatisticsKeys[i].id] = static_cast<std::uint16_t>(i + 1);
  }
  return indexes;
}();

// The slot of each key's plain name; those of its elements follow. One more for the end.
inline constexpr auto kFirstSlot = [] {
  std::array<StatisticsSlot, kStatisticsKeys.size() + 1> slots{};
  for (std::size_t i = 0; i < kStatisticsKeys.size(); ++i) {
    const std::uint16_t cap = kStatisticsKeys[i].cap;
    slots[i + 1] = static_cast<StatisticsSlot>(slots[i] + 1 + (cap > 1 ? cap : 0));
  }
  return slots;
}();

inline constexpr auto kStatisticsKeysByName = [] {
  std::array<std::uint16_t, kStatisticsKeys.size()> indexes{};
  for (std::size_t i = 0; i < indexes.size(); ++i) indexes[i] = static_cast<std::uint16_t>(i);
  std::ranges::sort(indexes, {}, [](std::uint16_t i) { return kStatisticsKeys[i].name; });
  return indexes;
}();

// The row, not a pointer to it: g++ with UBSan takes no null test of a pointer for a constant.
constexpr std::optional<std::size_t> FindStatisticsRowByName(std::string_view name) {
  const auto nameOf = [](std::uint16_t i) { return kStatisticsKeys[i].name; };
  const auto found = std::ranges::lower_bound(kStatisticsKeysByName, name, {}, nameOf);
  if (found == kStatisticsKeysByName.end() || nameOf(*found) != name) return std::nullopt;
  return *found;
}

}  // namespace internal

inline constexpr std::size_t kStatisticsSlots = internal::kFirstSlot.back();

// The key of that id, or nullptr.
constexpr const StatisticsKey* FindStatisticsKey(std::uint32_t id) {
  if (id >= internal::kStatisticsKeyById.size()) return nullptr;
  const std::uint16_t index = internal::kStatisticsKeyById[id];
  return index != 0 ? &kStatisticsKeys[index - 1U] : nullptr;
}

// The slot of the key's plain name; with `index`, below the key's cap, that of the element.
constexpr StatisticsSlot SlotOf(const StatisticsKey& key) {
  return internal::kFirstSlot[static_cast<std::size_t>(&key - kStatisticsKeys.data())];
}
constexpr StatisticsSlot SlotOf(const StatisticsKey& key, std::size_t index) {
  return static_cast<StatisticsSlot>(SlotOf(key) + 1 + index);
}

// The slot of a counter name, or nothing when no key gives that name.
constexpr std::optional<StatisticsSlot> FindStatisticsSlot(std::string_view name) {
  if (const auto row = internal::FindStatisticsRowByName(name)) return internal::kFirstSlot[*row];
  const std::size_t digits = name.size() - (name.find_last_not_of("0123456789") + 1);
  const std::string_view number = name.substr(name.size() - digits);
  if (digits == 0 || digits > 3 || (digits > 1 && number[0] == '0')) return std::nullopt;
  std::size_t index = 0;
  for (const char digit : number) index = index * 10 + static_cast<std::size_t>(digit - '0');
  name.remove_suffix(digits);
  const auto row = internal::FindStatisticsRowByName(name);
  if (!row) return std::nullopt;
  const StatisticsKey& key = kStatisticsKeys[*row];
  return key.cap != 1 && index < key.cap ? std::optional(SlotOf(key, index)) : std::nullopt;
}

// The slot of a counter name that is known to exist.
consteval StatisticsSlot StatisticsSlotOf(std::string_view name) {
  return FindStatisticsSlot(name).value();
}

// The counter name of a slot.
std::string StatisticsName(StatisticsSlot slot);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_STATISTICS_KEYS_H_
