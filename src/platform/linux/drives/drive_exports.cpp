#include "platform/linux/drives/drive_exports.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <map>
#include <utility>
#include <vector>

#include "platform/linux/base/kernel_text.h"
#include "platform/linux/drives/bounded_answer.h"
#include "platform/linux/drives/drive_statistics.h"
#include "platform/storage_exports.h"

namespace quorlet {
namespace {

constexpr char kBlockDevices[] = "/sys/block";
constexpr std::uint64_t kFirstEntryID = 0x4E00'0000'0000'0000;
constexpr std::chrono::seconds kLimit{2};
using Deadline = std::chrono::steady_clock::time_point;

const StorageClass& ClassOf(const FoundDrive& drive) {
  return drive.kind == DriveKind::kNvme ? kNvmeStorageClass : kFlashStorageClass;
}

class ExportDriver : public EntryDriver {
 public:
  ExportDriver(FoundDrive drive, std::shared_ptr<DriveReader> reader)
      : drive_(std::move(drive)), reader_(std::move(reader)) {}

  KernelReturn open(std::uint32_t) override { return kKernelSuccess; }
  KernelReturn close() override { return kKernelSuccess; }
  bool hasMethod(std::uint32_t method) const override {
    return method == ClassOf(drive_).exportMethod;
  }

  KernelReturn call(std::uint32_t method, DriverCall& call) override {
    if (!hasMethod(method)) return kKernelUnsupported;
    const auto request = ReadExportRequest(call.structInput);
    if (!request) return kKernelBadArgument;
    const auto& [selector, flags] = *request;
    if (selector == kStatisticsSelector && !isRead_) {
      isRead_ = true;
      statistics_ = readStatistics();
    }
    static const Data kNothing;
    const Data& data = selector == kStatisticsSelector ? statistics_ : kNothing;
    if (selector == kStatisticsSelector && data.empty()) return kKernelError;
    if ((flags & kSizeOnlyFlag) == 0) return answer(data, call);
    std::array<std::byte, 4> size{};
    WriteLittle(data.size(), size);
    return call.structOutput.size() < size.size() ? kKernelBadArgument : answer(size, call);
  }

 private:
  static KernelReturn answer(std::span<const std::byte> bytes, DriverCall& call) {
    call.bytesWritten = std::min(bytes.size(), call.structOutput.size());
    std::copy_n(bytes.begin(), call.bytesWritten, call.structOutput.begin());
    return kKernelSuccess;
  }

  // Empty when the drive sleeps or does not answer.
  Data readStatistics() const {
    const Deadline deadline = std::chrono::steady_clock::now() + kLimit;
    DriveFacts facts;
    if (drive_.kind == DriveKind::kNvme) {
      facts.figures = reader_->read(drive_).figures;
      facts.healthPage = reader_->pages(drive_).health;
      if (facts.healthPage.empty()) return {};
    }
    addDisks(facts, deadline);
    return EncodeDriveStatistics(facts);
  }

  // What the kernel says about the drive's block devices; a total needs all of them.
  void addDisks(DriveFacts& facts, Deadline deadline) const {
    if (drive_.disks.empty()) return;
    facts.counters.emplace();
    facts.usedBytes = 0;
    const std::string blocks = reader_->root().kernelPath(kBlockDevices);
    for (const std::string& disk : drive_.disks) {
      const std::string directory = JoinPath(blocks, disk);
      const auto line = ReadKernelText(directory + "/stat");
      if (!line || (facts.counters && !AddBlockCounters(*line, *facts.counters))) {
        facts.counters.reset();
      }
      const auto used = usedBlocks(directory, deadline);
      const auto blockBytes = ReadCounter(directory + "/queue/logical_block_size");
      std::uint64_t bytes = 0;
      if (!facts.usedBytes || !used || !blockBytes ||
          __builtin_mul_overflow(*used, *blockBytes, &bytes) ||
          __builtin_add_overflow(*facts.usedBytes, bytes, &*facts.usedBytes)) {
        facts.usedBytes.reset();
      }
    }
  }

  // The kernel asks the drive for it; only NVMe drives have it.
  std::optional<std::uint64_t> usedBlocks(const std::string& directory, Deadline deadline) const {
    const auto left =
        std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
    if (drive_.kind != DriveKind::kNvme || left.count() <= 0) return std::nullopt;
    std::string text = ReadAttributeWithin(JoinPath(directory, "nuse"), left);
    if (text.ends_with('\n')) text.pop_back();
    return ParseCounter(text);
  }

  const FoundDrive drive_;
  const std::shared_ptr<DriveReader> reader_;
  bool isRead_ = false;
  Data statistics_;
};

std::uint64_t EntryID(const FoundDrive& drive) {
  if (const auto number = NumberBehind("nvme", drive.name)) return kFirstEntryID + *number;
  return kFirstEntryID + (std::uint64_t{1} << 32) + (HashedID(drive.place) & 0xFFFF'FFFF);
}

class DriveExports : public EntrySource {
 public:
  explicit DriveExports(std::shared_ptr<DriveReader> reader) : reader_(std::move(reader)) {}

  std::vector<RegistryEntry> entries() override {
    const auto drive = chosen();
    if (!drive) return {};
    // One driver for each drive and all its connections: it asks the drive once.
    auto& driver = drivers_[drive->place + "\n" + drive->name];
    if (driver == nullptr) driver = std::make_shared<ExportDriver>(*drive, reader_);
    const StorageClass& exportClass = ClassOf(*drive);
    RegistryEntry entry;
    entry.id = EntryID(*drive);
    entry.name = drive->name;
    entry.className = exportClass.name;
    entry.properties[exportClass.characteristicsKey] = characteristics(*drive);
    entry.properties[kTellsOnlyWhatItHas] = true;
    entry.driver = driver;
    entry.standsInFor = {std::string(kFlashStorageClass.name), std::string(kNvmeStorageClass.name)};
    return {std::move(entry)};
  }

  std::string entrySet() override {
    const auto drive = chosen();
    return drive ? drive->place + "\n" + drive->name : std::string();
  }

 private:
  std::optional<FoundDrive> chosen() const {
    const std::vector<FoundDrive> drives = reader_->find();
    if (drives.empty()) return std::nullopt;
    const auto root = std::ranges::find(drives, true, &FoundDrive::holdsRoot);
    return root != drives.end() ? *root : drives.front();
  }

  // Without the serial number, which would tell one device from all others.
  static Dictionary characteristics(const FoundDrive& drive) {
    Dictionary characteristics{{"num-bus", Int32(0)}};
    const bool isNvme = drive.kind == DriveKind::kNvme;
    const std::string directory = drive.directory + (isNvme ? "" : "/device");
    const std::pair<const char*, const char*> attributes[] = {{"model", "model"},
                                                              {"model", "name"},
                                                              {"firmware-revision", "firmware_rev"},
                                                              {"firmware-revision", "fwrev"},
                                                              {"transport", "transport"}};
    for (const auto& [key, attribute] : attributes) {
      if (const auto text = ReadKernelText(JoinPath(directory, attribute))) {
        characteristics[key] = CleanName(*text);
      }
    }
    return characteristics;
  }

  const std::shared_ptr<DriveReader> reader_;
  std::map<std::string, std::shared_ptr<EntryDriver>> drivers_;
};

}  // namespace

std::unique_ptr<EntrySource> MakeDriveExports(std::shared_ptr<DriveReader> reader) {
  return std::make_unique<DriveExports>(std::move(reader));
}

}  // namespace quorlet
