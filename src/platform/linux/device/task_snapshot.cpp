// The snapshot is a sequence of items, little-endian: a 16-byte header, then the payload.
//   0  u32  type
//   4  u32  size of the payload
//   8  u64  flags; a container's identifier, at its begin and at its end
#include "platform/task_snapshot.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <span>
#include <string>
#include <string_view>

#include "platform/linux/base/kernel_text.h"
#include "platform/linux/device/services.h"
#include "values/byte_writer.h"

namespace quorlet {
namespace {

constexpr char kSnapshotPath[] = "/var/db/kernel/task-snapshot";
constexpr char kProcesses[] = "/proc";
constexpr std::size_t kMaxSnapshotBytes = std::size_t{64} << 20;
constexpr std::size_t kMaxProcessFileBytes = 4096;

enum ItemType : std::uint32_t {
  kContainerBegin = 0x13,
  kContainerEnd = 0x14,
  kIOStatistics = 0x901,
  kThreadName = 0x909,
  kBufferEnd = 0xF19158ED,
};
// The payload of a container's begin.
enum ContainerKind : std::uint32_t { kProcess = 1, kThread = 2 };

constexpr std::size_t kItemHeaderBytes = 16;
constexpr std::size_t kLongestThreadName = 64;
// The first thread of a process has its number; their containers have different identifiers.
constexpr std::uint64_t kThreadMark = std::uint64_t{1} << 32;

// In the order of the item's counters.
constexpr std::array<std::string_view, 4> kCounters = {
    "syscr: ", "read_bytes: ", "syscw: ", "write_bytes: "};

void AppendItem(ItemType type, std::uint64_t flags, std::span<const std::byte> payload,
                ByteWriter& items) {
  items.u32(type).u32(payload.size()).u64(flags).bytes(payload);
}

void AppendContainer(ContainerKind kind, std::uint64_t identifier, const Data& content,
                     ByteWriter& items) {
  AppendItem(kContainerBegin, identifier, ByteWriter().u32(kind).data(), items);
  items.bytes(content);
  AppendItem(kContainerEnd, identifier, {}, items);
}

std::optional<std::string> ReadProcessFile(const std::string& path) {
  auto bytes = ReadWholeFile(path, kMaxProcessFileBytes);
  auto* text = std::get_if<std::string>(&bytes);
  return text != nullptr ? std::optional(std::move(*text)) : std::nullopt;
}

// The number after `label` at the start of a line.
std::optional<std::uint64_t> Counter(std::string_view text, std::string_view label) {
  while (!text.empty()) {
    const std::string_view line = TakeLine(text);
    if (line.starts_with(label)) return ParseCounter(line.substr(label.size()));
  }
  return std::nullopt;
}

// A thread whose counters cannot be read, or are not all there, has no item of them: 0 would claim
// that it has done nothing.
std::optional<Data> IOCounters(const std::string& path) {
  const auto text = ReadKernelText(path);
  if (!text) return std::nullopt;
  ByteWriter counters;
  for (const std::string_view label : kCounters) {
    const auto counter = Counter(*text, label);
    if (!counter) return std::nullopt;
    counters.u64(*counter);
  }
  return counters.take();
}

Data ThreadItems(const std::string& directory) {
  ByteWriter items;
  if (auto name = ReadProcessFile(directory + "/comm")) {
    if (name->ends_with('\n')) name->pop_back();
    name->push_back('\0');  // so that it does not match as a prefix of another name
    const auto bytes = std::as_bytes(std::span(*name));
    AppendItem(kThreadName, 0, bytes.first(std::min(bytes.size(), kLongestThreadName)), items);
  }
  if (const auto counters = IOCounters(directory + "/io")) {
    AppendItem(kIOStatistics, 0, *counters, items);
  }
  return items.take();
}

class LinuxTaskSnapshot : public TaskSnapshot {
 public:
  LinuxTaskSnapshot(const Root& root, SystemLog& log) : root_(root, log), log_(log) {}

  std::optional<Data> CaptureTaskSnapshot(std::uint32_t flags) override {
    if (flags != kTaskSnapshotTaggedItems) return std::nullopt;
    const std::string path = root_.path(kSnapshotPath);
    const auto bytes = ReadWholeFile(path, kMaxSnapshotBytes);
    if (const auto* text = std::get_if<std::string>(&bytes)) {
      const auto recorded = std::as_bytes(std::span(*text));
      return Data(recorded.begin(), recorded.end());
    }
    const int error = std::get<int>(bytes);
    if (error == ENOENT) return takeSnapshot();
    log_.error("Cannot read %@: %@", path, ErrnoText(error));
    return std::nullopt;
  }

 private:
  // Processes come and go meanwhile: one that has gone has an empty container.
  std::optional<Data> takeSnapshot() const {
    const std::string processes = root_.kernelPath(kProcesses);
    ByteWriter items;
    for (const std::string& name : root_.names(processes)) {
      const auto process = ParseCounter(name);
      if (!process) continue;
      const std::string directory = JoinPath(processes, name) + "/task";
      ByteWriter threads;
      for (const std::string& threadName : root_.names(directory)) {
        if (const auto thread = ParseCounter(threadName)) {
          AppendContainer(kThread, kThreadMark | *thread,
                          ThreadItems(JoinPath(directory, threadName)), threads);
        }
      }
      // Room for the begin, its kind and the end of the container, and the end of the buffer.
      constexpr std::size_t kFrameBytes = 3 * kItemHeaderBytes + sizeof(std::uint32_t);
      if (items.size() + threads.size() + kFrameBytes > kMaxSnapshotBytes) break;
      AppendContainer(kProcess, *process, threads.data(), items);
    }
    if (items.size() == 0) return std::nullopt;
    AppendItem(kBufferEnd, 0, {}, items);
    return items.take();
  }

  const LoggingRoot root_;
  SystemLog& log_;
};

}  // namespace

std::unique_ptr<TaskSnapshot> MakeLinuxTaskSnapshot(const Root& root, SystemLog& log) {
  return std::make_unique<LinuxTaskSnapshot>(root, log);
}

}  // namespace quorlet
