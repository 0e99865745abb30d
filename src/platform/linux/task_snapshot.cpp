// The snapshot is a sequence of items, little-endian: a 16-byte header, then the payload.
//   0  u32  type
//   4  u32  size of the payload
//   8  u64  flags; a container's identifier, at its begin and at its end
#include "platform/task_snapshot.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <concepts>
#include <span>
#include <string>
#include <string_view>
#include <system_error>

#include "platform/linux/services.h"

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

template <std::unsigned_integral T>
void Append(T number, Data& bytes) {
  for (std::size_t i = 0; i < sizeof number; ++i) {
    bytes.push_back(static_cast<std::byte>((number >> (8 * i)) & 0xFF));
  }
}

void AppendItem(ItemType type, std::uint64_t flags, std::span<const std::byte> payload,
                Data& items) {
  Append(std::uint32_t{type}, items);
  Append(static_cast<std::uint32_t>(payload.size()), items);
  Append(flags, items);
  items.insert(items.end(), payload.begin(), payload.end());
}

void AppendContainer(ContainerKind kind, std::uint64_t identifier, const Data& content,
                     Data& items) {
  Data payload;
  Append(std::uint32_t{kind}, payload);
  AppendItem(kContainerBegin, identifier, payload, items);
  items.insert(items.end(), content.begin(), content.end());
  AppendItem(kContainerEnd, identifier, {}, items);
}

std::optional<std::uint64_t> Number(std::string_view text) {
  std::uint64_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

std::optional<std::string> ReadProcessFile(const std::string& path) {
  auto bytes = ReadWholeFile(path, kMaxProcessFileBytes);
  auto* text = std::get_if<std::string>(&bytes);
  return text != nullptr ? std::optional(std::move(*text)) : std::nullopt;
}

// The number after `label` at the start of a line.
std::optional<std::uint64_t> Counter(std::string_view text, std::string_view label) {
  while (!text.empty()) {
    const std::string_view line = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(text.size(), line.size() + 1));
    if (line.starts_with(label)) return Number(line.substr(label.size()));
  }
  return std::nullopt;
}

// A thread whose counters cannot be read, or are not all there, has no item of them: 0 would claim
// that it has done nothing.
std::optional<Data> IOCounters(const std::string& path) {
  const auto text = ReadProcessFile(path);
  if (!text) return std::nullopt;
  Data counters;
  for (const std::string_view label : kCounters) {
    const auto counter = Counter(*text, label);
    if (!counter) return std::nullopt;
    Append(*counter, counters);
  }
  return counters;
}

Data ThreadItems(const std::string& directory) {
  Data items;
  if (auto name = ReadProcessFile(directory + "/comm")) {
    if (name->ends_with('\n')) name->pop_back();
    name->push_back('\0');  // so that it does not match as a prefix of another name
    const auto bytes = std::as_bytes(std::span(*name));
    AppendItem(kThreadName, 0, bytes.first(std::min(bytes.size(), kLongestThreadName)), items);
  }
  if (const auto counters = IOCounters(directory + "/io")) {
    AppendItem(kIOStatistics, 0, *counters, items);
  }
  return items;
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
    Data items;
    for (const std::string& name : root_.names(processes)) {
      const auto process = Number(name);
      if (!process) continue;
      const std::string directory = JoinPath(processes, name) + "/task";
      Data threads;
      for (const std::string& threadName : root_.names(directory)) {
        if (const auto thread = Number(threadName)) {
          AppendContainer(kThread, kThreadMark | *thread,
                          ThreadItems(JoinPath(directory, threadName)), threads);
        }
      }
      // Room for the begin, its kind and the end of the container, and the end of the buffer.
      constexpr std::size_t kFrameBytes = 3 * kItemHeaderBytes + sizeof(std::uint32_t);
      if (items.size() + threads.size() + kFrameBytes > kMaxSnapshotBytes) break;
      AppendContainer(kProcess, *process, threads, items);
    }
    if (items.empty()) return std::nullopt;
    AppendItem(kBufferEnd, 0, {}, items);
    return items;
  }

  const LoggingRoot root_;
  SystemLog& log_;
};

}  // namespace

std::unique_ptr<TaskSnapshot> MakeLinuxTaskSnapshot(const Root& root, SystemLog& log) {
  return std::make_unique<LinuxTaskSnapshot>(root, log);
}

}  // namespace quorlet
