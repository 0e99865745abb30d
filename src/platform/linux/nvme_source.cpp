#include "platform/linux/nvme_source.h"

#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <map>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/nvme_health_page.h"
#include "platform/linux/nvme_statistics.h"
#include "values/byte_reader.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr char kControllers[] = "/sys/class/nvme";
constexpr char kBlockDevices[] = "/sys/block";
constexpr std::string_view kClass = "NuvexEmbeddedNVMeController";
constexpr std::uint64_t kFirstEntryID = 0x4E00'0000'0000'0000;
constexpr std::uint32_t kExportMethod = 9;
constexpr std::uint32_t kStatisticsSelector = 13;
constexpr unsigned kSizeOnly = 1;
constexpr std::chrono::seconds kLimit{2};
using Deadline = std::chrono::steady_clock::time_point;
constexpr std::size_t kMaxAttributeBytes = 4096;
constexpr std::size_t kMaxControllers = 256;

// The number behind `prefix`, when `text` is nothing else.
std::optional<std::uint64_t> NumberBehind(std::string_view prefix, std::string_view text) {
  if (!text.starts_with(prefix)) return std::nullopt;
  text.remove_prefix(prefix.size());
  std::uint64_t number = 0;
  const char* const end = text.data() + text.size();
  const auto [stopped, error] = std::from_chars(text.data(), end, number);
  if (error != std::errc() || stopped != end) return std::nullopt;
  return number;
}

// An attribute of a device, without the blanks around it; nothing when it cannot be read.
std::optional<std::string> Attribute(const std::string& directory, std::string_view name) {
  const auto bytes = ReadWholeFile(JoinPath(directory, name), kMaxAttributeBytes);
  const auto* text = std::get_if<std::string>(&bytes);
  if (text == nullptr) return std::nullopt;
  const std::size_t first = text->find_first_not_of(" \n");
  if (first == std::string::npos) return std::string();
  return RepairUtf8(text->substr(first, text->find_last_not_of(" \n") - first + 1));
}

class NvmeDriver : public EntryDriver {
 public:
  NvmeDriver(const Root& root, std::string name, const HealthPageReader& reader)
      : root_(root), name_(std::move(name)), reader_(reader) {}

  KernelReturn open(std::uint32_t) override { return kKernelSuccess; }
  KernelReturn close() override { return kKernelSuccess; }
  bool hasMethod(std::uint32_t method) const override { return method == kExportMethod; }

  KernelReturn call(std::uint32_t method, DriverCall& call) override {
    if (method != kExportMethod) return kKernelUnsupported;
    ByteReader request(call.structInput);
    const auto selector = request.little<std::uint32_t>();
    const auto flags = request.little<std::uint16_t>();
    if (!request.ok()) return kKernelBadArgument;
    if (selector == kStatisticsSelector && !isRead_) {
      isRead_ = true;
      statistics_ = readStatistics();
    }
    static const Data kNothing;
    const Data& data = selector == kStatisticsSelector ? statistics_ : kNothing;
    if (selector == kStatisticsSelector && data.empty()) return kKernelError;
    if ((flags & kSizeOnly) == 0) return answer(data, call);
    std::array<std::byte, 4> size{};
    for (std::size_t i = 0; i < size.size(); ++i) {
      size[i] = static_cast<std::byte>((data.size() >> (8 * i)) & 0xFF);
    }
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
    const std::string power =
        root_.kernelPath(std::string(kControllers) + "/" + name_ + "/device/power");
    if (const auto status = Attribute(power, "runtime_status");
        status && *status != "active" && *status != "unsupported") {
      return {};
    }
    const Deadline deadline = std::chrono::steady_clock::now() + kLimit;
    const auto page = reader_(root_.path("/dev/" + name_), kLimit);
    if (!page) return {};
    NvmeFacts facts;
    facts.healthPage = *page;
    addNamespaces(facts, deadline);
    return EncodeNvmeStatistics(facts).value_or(Data());
  }

  // What the kernel says about the drive's namespaces; a total needs all of them.
  void addNamespaces(NvmeFacts& facts, Deadline deadline) const {
    facts.counters.emplace();
    facts.usedBytes = 0;
    std::size_t count = 0;
    const std::string blocks = root_.kernelPath(kBlockDevices);
    for (const std::string& device : ListDirectory(blocks)) {
      if (!NumberBehind(name_ + "n", device)) continue;
      ++count;
      const std::string directory = JoinPath(blocks, device);
      const auto line = Attribute(directory, "stat");
      if (!line || (facts.counters && !AddBlockCounters(*line, *facts.counters))) {
        facts.counters.reset();
      }
      const auto used = usedBlocks(directory, deadline);
      const auto blockBytes =
          NumberBehind("", Attribute(directory, "queue/logical_block_size").value_or(""));
      std::uint64_t bytes = 0;
      if (!facts.usedBytes || !used || !blockBytes ||
          __builtin_mul_overflow(*used, *blockBytes, &bytes) ||
          __builtin_add_overflow(*facts.usedBytes, bytes, &*facts.usedBytes)) {
        facts.usedBytes.reset();
      }
    }
    if (count != 0) return;
    facts.counters.reset();
    facts.usedBytes.reset();
  }

  // The kernel asks the drive for it.
  static std::optional<std::uint64_t> usedBlocks(const std::string& directory, Deadline deadline) {
    const auto left =
        std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
    if (left.count() <= 0) return std::nullopt;
    std::string text = ReadNvmeAttribute(JoinPath(directory, "nuse"), left);
    if (text.ends_with('\n')) text.pop_back();
    return NumberBehind("", text);
  }

  const Root root_;
  const std::string name_;
  const HealthPageReader reader_;
  bool isRead_ = false;
  Data statistics_;
};

class NvmeSource : public EntrySource {
 public:
  NvmeSource(const Root& root, HealthPageReader reader) : root_(root), reader_(std::move(reader)) {}

  std::vector<RegistryEntry> entries() override {
    std::vector<RegistryEntry> entries;
    for (const auto& [number, name] : controllers()) {
      // One driver for each controller and all its connections: it asks the drive once.
      auto& driver = drivers_[name];
      if (driver == nullptr) driver = std::make_shared<NvmeDriver>(root_, name, reader_);
      RegistryEntry entry;
      entry.id = kFirstEntryID + number;
      entry.name = name;
      entry.className = kClass;
      entry.properties["Controller Characteristics"] = characteristics(name);
      entry.driver = driver;
      entry.standsInFor = {"FSPStorage", std::string(kClass)};
      entries.push_back(std::move(entry));
    }
    return entries;
  }

  std::string entrySet() override {
    std::string set;
    for (const auto& [number, name] : controllers()) set.append(name).append("/");
    return set;
  }

 private:
  // By number: nvme2 comes before nvme10.
  std::map<std::uint64_t, std::string> controllers() const {
    std::map<std::uint64_t, std::string> found;
    for (const std::string& name : ListDirectory(root_.kernelPath(kControllers))) {
      const auto number = NumberBehind("nvme", name);
      if (!number || *number >= kMaxControllers || name != "nvme" + std::to_string(*number)) {
        continue;
      }
      struct stat status = {};
      if (stat(root_.path("/dev/" + name).c_str(), &status) == 0) found.emplace(*number, name);
    }
    return found;
  }

  // Without the serial number, which would tell one device from all others.
  Dictionary characteristics(const std::string& name) const {
    const std::string directory = root_.kernelPath(kControllers) + "/" + name;
    Dictionary characteristics{{"num-bus", Int32(0)}};
    const std::pair<const char*, const char*> attributes[] = {
        {"model", "model"}, {"firmware-revision", "firmware_rev"}, {"transport", "transport"}};
    for (const auto& [key, attribute] : attributes) {
      if (const auto text = Attribute(directory, attribute)) characteristics[key] = *text;
    }
    return characteristics;
  }

  const Root root_;
  const HealthPageReader reader_;
  std::map<std::string, std::shared_ptr<EntryDriver>> drivers_;
};

}  // namespace

std::unique_ptr<EntrySource> MakeNvmeSource(const Root& root, HealthPageReader reader) {
  return std::make_unique<NvmeSource>(root, std::move(reader));
}

}  // namespace quorlet
