// Driver registry entries that files describe: /var/db/drivers/*.plist, one dictionary each.
//
//   EntryID              integer, required; of two files with one ID the first in byte order counts
//   EntryName, ClassName strings
//   ParentID             integer
//   Properties           dictionary
//   ExportMethods        array of integers: the methods that answer export requests
//   Exports              array of {Selector, ListIndex, Data, Size, SizeStatus, FetchStatus}
//   Methods              dictionary: decimal method number -> {Status, Output}
//   OpenStatus, CloseStatus
//   Channels             array of {ChannelID, Elements}: runs of 64-byte raw element records
//
// What is of a wrong type counts as missing.
#ifndef QUORLET_PLATFORM_LINUX_REGISTRY_DRIVER_FILES_H_
#define QUORLET_PLATFORM_LINUX_REGISTRY_DRIVER_FILES_H_

#include <memory>

#include "platform/linux/base/files.h"
#include "platform/linux/registry/registry_entry.h"
#include "platform/system_log.h"

namespace quorlet {

// Reads the files on every question for entries and on every refresh. A driver answers from the
// file as it was when the entry was handed out. A file that cannot be used is left out, with one
// error line until something else is wrong with it; so are files beyond 64 MiB of text or of
// memory. While the directory cannot be read, which has an error line, the entries stay as they
// were. `log` must outlive the source.
std::unique_ptr<EntrySource> MakeDriverFiles(const Root& root, SystemLog& log);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_REGISTRY_DRIVER_FILES_H_
