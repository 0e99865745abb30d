#include "platform/linux/registry/report_hub.h"

#include <algorithm>
#include <cstring>
#include <map>
#include <optional>
#include <utility>

#include "platform/report_records.h"
#include "values/byte_reader.h"
#include "values/byte_writer.h"

namespace quorlet {
namespace {

constexpr std::size_t kMaxMemoryBytes = std::size_t{64} << 20;
constexpr std::size_t kMaxInterests = kMaxMemoryBytes / kRawElementSize;
constexpr std::size_t kMaxSubscriptions = 16;
// No driver and no channel has this ID.
constexpr std::uint64_t kInvalidValue = 0x8000'0000'0000'0000;
// The upper half of every token: a token that lost it is not mistaken for a whole one.
constexpr std::uint64_t kTokenMark = 0x5265'7074'0000'0000;

struct Interest {
  std::uint64_t driverID = 0;
  std::uint64_t channelID = 0;
  std::size_t records = 0;  // as the type word has it; 0 when that is not known yet
};

struct Subscription {
  std::uint64_t token = 0;
  std::vector<Interest> interests;
  std::vector<std::byte> memory;
  std::size_t runsStart = 0;  // where in `memory` the channels' runs start
};

std::optional<std::vector<Interest>> ReadInterests(std::span<const std::byte> list) {
  ByteReader reader(list);
  const auto count = reader.little<std::uint32_t>();
  reader.skip(kInterestListHeaderBytes - sizeof count);
  if (!reader.ok() || count == 0 || count > kMaxInterests ||
      reader.remaining() != count * kInterestBytes) {
    return std::nullopt;
  }
  std::vector<Interest> interests(count);
  for (Interest& interest : interests) {
    interest.driverID = reader.little<std::uint64_t>();
    interest.channelID = reader.little<std::uint64_t>();
    interest.records = elementCountOfType(reader.little<std::uint64_t>());
  }
  return interests;
}

// Makes runs of no channel; only their first records are ever looked at.
void Fill(std::span<std::byte> room) {
  while (!room.empty()) {
    const std::size_t records = std::min(room.size() / kRawElementSize, kMaxElementCount);
    WriteLittle(kInvalidValue, room.subspan(0, 8));
    WriteLittle(kInvalidValue, room.subspan(kRawElementChannelOffset, 8));
    WriteLittle(static_cast<std::uint64_t>(records) << 32, room.subspan(kRawElementTypeOffset, 8));
    room = room.subspan(records * kRawElementSize);
  }
}

class ReportHub : public EntryDriver {
 public:
  ReportHub(std::vector<EntrySource*> sources, std::shared_ptr<EntryDriver> described)
      : sources_(std::move(sources)), described_(std::move(described)) {}

  KernelReturn open(std::uint32_t type) override {
    return described_ ? described_->open(type) : kKernelSuccess;
  }
  KernelReturn close() override { return described_ ? described_->close() : kKernelSuccess; }

  bool hasMethod(std::uint32_t method) const override {
    return method == kDrvReportUserClientOpen || method == kDrvReportUserClientConfigureInterests ||
           method == kDrvReportUserClientUpdateKernelBuffer || isDescribed(method);
  }

  KernelReturn call(std::uint32_t method, DriverCall& call) override {
    if (!hasMethod(method)) return kKernelUnsupported;
    if (isDescribed(method)) {
      const KernelReturn status = described_->call(method, call);
      if (status != kKernelSuccess) return status;
    }
    if (method == kDrvReportUserClientConfigureInterests) return configure(call);
    if (method == kDrvReportUserClientUpdateKernelBuffer) return update(call);
    return kKernelSuccess;
  }

  KernelReturn map(std::uint32_t memoryType, std::span<const std::byte>& memory) override {
    const auto found = subscriptions_.find(memoryType);
    if (found == subscriptions_.end()) return kKernelNotFound;
    Subscription& subscription = found->second;
    if (subscription.memory.empty()) {
      // Type words say how much will come; where one is not known the channels must be asked.
      const bool allKnown = std::ranges::all_of(
          subscription.interests, [](const Interest& interest) { return interest.records != 0; });
      if (!allKnown) refresh();
      subscription.memory.resize(sizeNeeded(subscription.interests));
      subscription.runsStart = subscription.memory.size();
      layOut(subscription);
    }
    memory = subscription.memory;
    return kKernelSuccess;
  }

  void unmap(std::uint32_t memoryType) override {
    const auto found = subscriptions_.find(memoryType);
    if (found != subscriptions_.end()) found->second.memory = {};
  }

 private:
  bool isDescribed(std::uint32_t method) const {
    return described_ != nullptr && described_->hasMethod(method);
  }

  KernelReturn configure(DriverCall& call) {
    if (call.scalarOutput.empty()) return kKernelBadArgument;
    auto interests = ReadInterests(call.structInput);
    if (!interests) return kKernelBadArgument;
    if (subscriptions_.size() >= kMaxSubscriptions) return kKernelNoMemory;
    const bool tokenIsDescribed = call.scalarsWritten > 0;
    const std::uint64_t token =
        tokenIsDescribed ? call.scalarOutput[0] : kTokenMark | (subscriptions_.size() + 1);
    const auto [added, isNew] = subscriptions_.try_emplace(static_cast<std::uint32_t>(token));
    if (!isNew) return kKernelError;
    added->second.token = token;
    added->second.interests = std::move(*interests);
    call.scalarOutput[0] = token;
    call.scalarsWritten = 1;
    return kKernelSuccess;
  }

  KernelReturn update(const DriverCall& call) {
    if (call.scalarInput.size() != 1) return kKernelBadArgument;
    const auto found = subscriptions_.find(static_cast<std::uint32_t>(call.scalarInput[0]));
    if (found == subscriptions_.end() || found->second.token != call.scalarInput[0]) {
      return kKernelBadArgument;
    }
    refresh();
    layOut(found->second);
    return kKernelSuccess;
  }

  void refresh() {
    for (EntrySource* source : sources_) source->refreshElements();
  }

  // The channel's records, as many as the first one says. A run that says that there are none, or
  // more than there are, would cost whoever goes from run to run the others: it is not reported.
  std::span<const std::byte> run(const Interest& interest) const {
    for (EntrySource* source : sources_) {
      const auto bytes = source->elements(interest.driverID, interest.channelID);
      if (bytes.size() < kRawElementSize) continue;
      ByteReader reader(bytes);
      reader.skip(kRawElementTypeOffset);
      const std::size_t size = elementCountOfType(reader.little<std::uint64_t>()) * kRawElementSize;
      return size <= bytes.size() ? bytes.first(size) : std::span<const std::byte>();
    }
    return {};
  }

  std::size_t sizeNeeded(const std::vector<Interest>& interests) const {
    std::size_t now = 0;
    std::size_t later = 0;
    const auto add = [](std::size_t bytes, std::size_t& total) {
      if (bytes <= kMaxMemoryBytes - total) total += bytes;
    };
    for (const Interest& interest : interests) {
      const std::size_t bytes = run(interest).size();
      add(bytes, now);
      // A channel whose size nobody knows yet has room for one record.
      const std::size_t records = std::max<std::size_t>(interest.records, 1);
      add(std::max(bytes, records * kRawElementSize), later);
    }
    return std::max(now, later);
  }

  // A run that does not fit any more is left out.
  void layOut(Subscription& subscription) const {
    const std::span<std::byte> memory = subscription.memory;
    std::vector<std::span<const std::byte>> runs;
    std::size_t start = memory.size();
    for (const Interest& interest : subscription.interests) {
      const auto bytes = run(interest);
      if (bytes.empty() || bytes.size() > start) continue;
      runs.push_back(bytes);
      start -= bytes.size();
    }
    for (std::size_t i = subscription.runsStart; i < start; ++i) memory[i] = std::byte{0};
    subscription.runsStart = start;
    Fill(memory.first(start));
    for (const auto bytes : runs) {
      std::memcpy(memory.data() + start, bytes.data(), bytes.size());
      start += bytes.size();
    }
  }

  const std::vector<EntrySource*> sources_;
  const std::shared_ptr<EntryDriver> described_;
  std::map<std::uint32_t, Subscription> subscriptions_;  // by memory type
};

}  // namespace

std::shared_ptr<EntryDriver> MakeReportHub(std::vector<EntrySource*> sources,
                                           std::shared_ptr<EntryDriver> described) {
  return std::make_shared<ReportHub>(std::move(sources), std::move(described));
}

}  // namespace quorlet
