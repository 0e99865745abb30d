// Asks the drives, and remembers for a moment what they said.
#ifndef QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_READER_H_
#define QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_READER_H_

#include <chrono>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "platform/drives.h"
#include "platform/linux/base/files.h"
#include "platform/linux/drives/drive_list.h"
#include "platform/linux/drives/nvme_pages.h"

namespace quorlet {

// What has one drive asked for is shared by everyone who asks here: the statistics export, the live
// channels, quorletctl. For one thread.
class DriveReader final : public Drives {
 public:
  explicit DriveReader(const LoggingRoot& root, NvmePagesReader reader = ReadNvmePages)
      : root_(root), reader_(std::move(reader)) {}

  std::vector<FoundDrive> find() const { return FindDrives(root_); }
  std::vector<Drive> read() override;
  Drive read(const FoundDrive& drive);
  const LoggingRoot& root() const { return root_; }
  // The pages of an NVMe drive, of which it is asked at most once a second; not while it sleeps.
  const NvmePages& pages(const FoundDrive& drive);

 private:
  struct Asked {
    std::chrono::steady_clock::time_point when;
    NvmePages pages;
  };
  void readNvme(const FoundDrive& found, Drive& drive);
  void readUfs(const FoundDrive& found, Drive& drive);

  const LoggingRoot root_;
  const NvmePagesReader reader_;
  std::map<std::string, Asked> asked_;  // by name
  std::set<std::string> late_;          // UFS hosts that did not answer in time
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_READER_H_
