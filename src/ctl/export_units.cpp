#include "ctl/export_units.h"

#include <algorithm>
#include <array>

namespace quorlet {
namespace {

struct KeyUnit {
  std::string_view key;
  std::string_view unit;
};

// clang-format off
constexpr auto kKeyUnits = std::to_array<KeyUnit>({
    {"IntermediateWamp",                                         "1"},
    {"UserWamp",                                                 "1"},
    {"nuvex.NANDInfo.AgeInducedWriteSectors",                    "1"},
    {"nuvex.NANDInfo.BlocksPerVirtualBlock",                     "1"},
    {"nuvex.NANDInfo.BytesPerPage",                              "By"},
    {"nuvex.NANDInfo.ColdestCycle",                              "1"},
    {"nuvex.NANDInfo.HighEnduranceBlockEraseCount",              "1"},
    {"nuvex.NANDInfo.HottestCycle",                              "1"},
    {"nuvex.NANDInfo.IntermediateColdestCycle",                  "1"},
    {"nuvex.NANDInfo.IntermediateHottestCycle",                  "1"},
    {"nuvex.NANDInfo.MaintenanceRequestsFailedErase",            "1"},
    {"nuvex.NANDInfo.MaintenanceRequestsFailedProg",             "1"},
    {"nuvex.NANDInfo.MaintenanceRequestsFailedRead",             "1"},
    {"nuvex.NANDInfo.NodesFree",                                 "1"},
    {"nuvex.NANDInfo.NodesTotal",                                "1"},
    {"nuvex.NANDInfo.NumFlushes",                                "1"},
    {"nuvex.NANDInfo.NumFreeVirtualBlocks",                      "1"},
    {"nuvex.NANDInfo.NumLogicalReads",                           "1"},
    {"nuvex.NANDInfo.NumLogicalWrites",                          "1"},
    {"nuvex.NANDInfo.NumMaintenanceRequests",                    "1"},
    {"nuvex.NANDInfo.NumPhysicalErases",                         "1"},
    {"nuvex.NANDInfo.NumPhysicalReads",                          "1"},
    {"nuvex.NANDInfo.NumPhysicalWrites",                         "1"},
    {"nuvex.NANDInfo.NumSleepOps",                               "1"},
    {"nuvex.NANDInfo.NumVirtualBlocks",                          "1"},
    {"nuvex.NANDInfo.NumWearLevelOps",                           "1"},
    {"nuvex.NANDInfo.PagesPerVirtualBlock",                      "1"},
    {"nuvex.NANDInfo.ReadsBeforeErasure0",                       "1"},
    {"nuvex.NANDInfo.ReadsBeforeErasure100000",                  "1"},
    {"nuvex.NANDInfo.ReadsBeforeErasure150000",                  "1"},
    {"nuvex.NANDInfo.ReadsBeforeErasure200000",                  "1"},
    {"nuvex.NANDInfo.ReadsBeforeErasure50000",                   "1"},
    {"nuvex.NANDInfo.formatDaysSince2000",                       "wk"},
    {"nuvex.diagwell.tallyd.database.corruptions",               "1"},
    {"nuvex.diagwell.tallyd.database.size",                      "MiBy"},
    {"nuvex.kernel.memorystatus_freeze_budget_pages_remaining",  "1"},
    {"nuvex.kernel.memorystatus_freeze_count",                   "1"},
    {"nuvex.kernel.memorystatus_freeze_pageouts",                "1"},
    {"nuvex.kernel.memorystatus_thaw_count",                     "1"},
    {"nuvex.kernel.swapusage",                                   "By"},
    {"nuvex.tilehall.DiskUsageUserBlocksFree",                   "MiBy"},
    {"nuvex.tilehall.DiskUsageUserTotalBlocks",                  "MiBy"},
    {"nuvex.tilehall.numAllInstalledApps",                       "1"},
    {"nuvex.tilehall.numThirdPartyApps",                         "1"},
    {"nuvex.usage.cur_boot_session_cpu_uptime",                  "min"},
});
// clang-format on
static_assert(std::ranges::is_sorted(kKeyUnits, {}, &KeyUnit::key));

constexpr std::string_view kNetworkUsage = "datausage.";

// "datausage.<what>.<process>"
std::string_view NetworkUsageUnit(std::string_view what) {
  what = what.substr(0, what.find('.'));
  if (what.ends_with("KB")) return "KiBy";
  return what == "baddata" || what == "olddata" ? "1" : "";
}

}  // namespace

std::string_view UnitOfKey(std::string_view key) {
  if (key.starts_with(kNetworkUsage)) return NetworkUsageUnit(key.substr(kNetworkUsage.size()));
  const auto* const found = std::ranges::lower_bound(kKeyUnits, key, {}, &KeyUnit::key);
  return found != kKeyUnits.end() && found->key == key ? found->unit : std::string_view();
}

}  // namespace quorlet
