// The drive whose statistics are the device's, as a storage driver, where no driver file serves
// one.
#ifndef QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_EXPORTS_H_
#define QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_EXPORTS_H_

#include <memory>

#include "platform/linux/drives/drive_reader.h"
#include "platform/linux/registry/registry_entry.h"

namespace quorlet {

// Publishes one drive: the one that holds the root's file system, else the first by its place. An
// NVMe drive is of class "NuvexEmbeddedNVMeController", any other of "FSPStorage". A drive is asked
// once, when its statistics export is wanted, for at most 2 seconds in all, and not at all while it
// sleeps; the other exports are empty. The export holds only what the drive tells, and the entry
// has the property kTellsOnlyWhatItHas.
std::unique_ptr<EntrySource> MakeDriveExports(std::shared_ptr<DriveReader> reader);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_EXPORTS_H_
