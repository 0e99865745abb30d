// Which counters of the statistics export appear in the NAND information dictionary, and as what.
#ifndef QUORLET_STORAGE_NAND_KEY_MAP_H_
#define QUORLET_STORAGE_NAND_KEY_MAP_H_

#include <string_view>

#include "storage/statistics_keys.h"

namespace quorlet {

// The dictionary key of the counter, or an empty text when the counter is dropped.
std::string_view NANDInfoKeyOf(StatisticsSlot slot);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_NAND_KEY_MAP_H_
