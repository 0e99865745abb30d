// The storage structured log: what the flash-storage driver's lists say, as structured log records,
// and the write amplification that decides whether the block validity list is wanted.
#ifndef QUORLET_STORAGE_STRUCTURED_LOG_H_
#define QUORLET_STORAGE_STRUCTURED_LOG_H_

#include <cstddef>
#include <span>

#include "platform/platform.h"

namespace quorlet {

// What one run finds out and its validity list handler needs.
struct StorageLogState {
  // The validity list is collected whatever the ratios are.
  bool gForceCollectionSet = false;
  // Decided on every run.
  bool gNeedValidityList = false;
  // Write amplification of the user area and of the intermediate (SLC) area: single-precision
  // numbers, widened. Not finite when the host has written nothing.
  double gCurrentUserWamp = 0;
  double gCurrentSysWamp = 0;
};

// Sets the ratios and the decision in `state`, then fetches the validity list, the three telemetry
// lists and the defects list and hands each to its handler. `requestFlag` is passed on to the
// driver with every list. False when the driver or its characteristics cannot be reached, the
// exporter lacks a selector table, a list's buffer cannot be allocated or a handler fails; a list
// that the driver does not give is reported, and the others go on. Messages go to standard error.
bool DumpStorageStructuredLog(Platform& platform, StorageLogState& state, bool requestFlag);

// The band statistics export: writes the storage status log with the ratios, the NAND information
// and the values of the lists 0 to 15; does nothing unless `state` says that the list is needed.
// False, with a message on standard error, when the buffer does not hold what it claims.
bool LogValidityList(Platform& platform, const StorageLogState& state,
                     std::span<const std::byte> buffer);

// The defects list: one record with the factory count, then one for each defect that lies within
// the first `written` bytes of the buffer, which are those that the driver filled, logged in one
// go; an error line tells of defects beyond the first 16,384. False, with a message, when the
// buffer is too short for its header.
bool LogDefectsList(Platform& platform, std::span<const std::byte> buffer, std::size_t written);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_STRUCTURED_LOG_H_
