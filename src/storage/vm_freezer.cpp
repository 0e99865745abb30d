// A snapshot is a sequence of items, little-endian: a 16-byte header, then the payload.
//   0  u32  type
//   4  u32  size of the payload
//   8  u64  flags; a container's identifier, at its begin and at its end
#include "storage/vm_freezer.h"

#include <algorithm>
#include <cstdint>
#include <vector>

#include "storage/nand_info.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

enum ItemType : std::uint32_t {
  kContainerBegin = 0x13,
  kContainerEnd = 0x14,
  kIOStatistics = 0x901,
  kThreadName = 0x909,
  kBufferEnd = 0xF19158ED,
};

constexpr char kFreezerThread[] = "VM_swapout";
constexpr std::size_t kLongestThreadName = 64;
constexpr std::size_t kBytesWrittenCounter = 3;

struct SnapshotItem {
  std::uint32_t type = 0;
  std::uint64_t flags = 0;
  std::span<const std::byte> payload;

  bool isContainer() const { return type == kContainerBegin && payload.size() >= 4; }
};

// Visits the items of a snapshot up to the end of the buffer, or to an item that claims more than
// the buffer holds.
class ItemWalk {
 public:
  explicit ItemWalk(std::span<const std::byte> items) : reader_(items) {}

  std::optional<SnapshotItem> next() {
    SnapshotItem item;
    item.type = reader_.little<std::uint32_t>();
    const auto size = reader_.little<std::uint32_t>();
    item.flags = reader_.little<std::uint64_t>();
    item.payload = reader_.take(size);
    if (!reader_.ok() || item.type == kBufferEnd) isAtEnd_ = true;
    return isAtEnd_ ? std::nullopt : std::optional(item);
  }

 private:
  ByteReader reader_;
  bool isAtEnd_ = false;
};

// What has been seen of a container whose end has not come.
struct OpenContainer {
  explicit OpenContainer(const SnapshotItem& begin) : id(begin.flags) {}
  std::uint64_t id;
  std::optional<std::span<const std::byte>> name;
  std::optional<IOStats> ioStats;
};

// As far as the text in the item goes, which need not be terminated.
bool IsNamed(std::span<const std::byte> text, std::string_view name) {
  const std::string_view stored(reinterpret_cast<const char*>(text.data()), text.size());
  const std::string_view shown = stored.substr(0, kLongestThreadName);
  const std::size_t end = shown.find('\0');
  return end != std::string_view::npos ? shown.substr(0, end) == name : name.starts_with(shown);
}

// Searches one container, whose begin the walk has just passed, and all that are in it; the walk
// ends up behind it.
bool getIOStatsWithThreadnameFromSnapItemsHelper(ItemWalk& walk, const SnapshotItem& container,
                                                 std::string_view threadName,
                                                 std::optional<IOStats>& ioStats) {
  // From the outermost to the innermost. A list rather than a recursion: how deep containers lie in
  // each other is up to whoever wrote the snapshot.
  std::vector<OpenContainer> open{OpenContainer(container)};
  while (!open.empty()) {
    const auto item = walk.next();
    OpenContainer& innermost = open.back();
    if (!item || (item->type == kContainerEnd && item->flags == innermost.id)) {
      if (innermost.name && IsNamed(*innermost.name, threadName)) {
        ioStats = innermost.ioStats;
        return true;
      }
      open.pop_back();
    } else if (item->isContainer()) {
      open.emplace_back(*item);
    } else if (item->type == kThreadName) {
      innermost.name = item->payload;
    } else if (item->type == kIOStatistics) {
      innermost.ioStats = item->payload;
    }
  }
  return false;
}

std::uint64_t BytesWritten(IOStats ioStats) {
  ByteReader reader(ioStats);
  reader.skip(kBytesWrittenCounter * sizeof(std::uint64_t));
  return reader.little<std::uint64_t>();
}

}  // namespace

bool getIOStatsWithThreadnameFromSnapItems(std::span<const std::byte> items,
                                           std::string_view threadName,
                                           std::optional<IOStats>& ioStats) {
  if (threadName.empty()) return false;
  ItemWalk walk(items);
  while (const auto item = walk.next()) {
    if (item->isContainer() &&
        getIOStatsWithThreadnameFromSnapItemsHelper(walk, *item, threadName, ioStats)) {
      return true;
    }
  }
  return false;
}

Dictionary CopyVMFreezerNANDInfo(TaskSnapshot& taskSnapshot, StandardError& errors) {
  Dictionary info;
  const auto snapshot = taskSnapshot.CaptureTaskSnapshot(kTaskSnapshotTaggedItems);
  std::optional<IOStats> ioStats;
  if (snapshot && getIOStatsWithThreadnameFromSnapItems(*snapshot, kFreezerThread, ioStats)) {
    const std::uint64_t written = ioStats ? BytesWritten(*ioStats) : 0;
    SetNumberValue(errors, info, kNANDInfoVMFreezerNumPhysicalWritesKey,
                   static_cast<std::int64_t>(written));
  } else {
    info[kNANDInfoVMFreezerErrorKey] = "1";
    info[kNANDInfoVMFreezerErrorMessageKey] = "Unable parse snapshot for VMFreezer NAND writes.";
  }
  return info;
}

}  // namespace quorlet
