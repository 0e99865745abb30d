// Subscribing to channels at the hub, and cutting the memory that the hub fills into samples.
#include <algorithm>
#include <new>
#include <utility>
#include <vector>

#include "channels/channel.h"
#include "channels/walk.h"
#include "values/byte_reader.h"
#include "values/byte_writer.h"

namespace quorlet {

class DrvReportSubscription {
 public:
  explicit DrvReportSubscription(DriverRegistry& registry) : registry_(registry) {}
  DrvReportSubscription(const DrvReportSubscription&) = delete;
  DrvReportSubscription& operator=(const DrvReportSubscription&) = delete;
  ~DrvReportSubscription() {
    if (isMapped_) registry_.UnmapDriverMemory(connection_, memoryType(), buffer_);
    if (connection_ != 0) registry_.CloseDriverConnection(connection_);
  }

  // Connects to the hub, hands it the interest list and maps its memory.
  bool open(const Data& interests, std::optional<ErrorValue>* error);
  // Has the hub fill the memory.
  KernelReturn update();
  std::span<const std::byte> buffer() const { return buffer_; }

 private:
  std::uint32_t memoryType() const { return static_cast<std::uint32_t>(token_); }
  KernelReturn connect(RegistryHandle hub, std::optional<ErrorValue>* error);
  KernelReturn configure(const Data& interests);

  DriverRegistry& registry_;
  RegistryHandle connection_ = 0;
  std::uint64_t token_ = 0;
  bool isMapped_ = false;
  std::span<const std::byte> buffer_;
};

namespace {

// So that the list stays below 2^31 bytes.
constexpr std::size_t kMostInterests = 89'478'477;

std::optional<Data> createInterestList(const Dictionary& desired, std::size_t count) {
  if (count > kMostInterests) return std::nullopt;
  ByteWriter list;
  list.reserve(kInterestListHeaderBytes + count * kInterestBytes);
  list.u64(count);
  const int result = DrvReportIterate(desired, [&list](Dictionary& channel) {
    const std::int64_t driverID = DrvReportChannelGetDriverID(channel);
    const std::int64_t channelID = DrvReportChannelGetChannelID(channel);
    std::uint64_t type = 0;
    if (driverID == kDrvReportInvalidValue || channelID == kDrvReportInvalidValue ||
        getChannelType(channel, type) != kKernelSuccess) {
      return 1;
    }
    list.u64(static_cast<std::uint64_t>(driverID))
        .u64(static_cast<std::uint64_t>(channelID))
        .u64(type);
    return 0;
  });
  const bool isFilled = list.size() == kInterestListHeaderBytes + count * kInterestBytes;
  return result == 0 && isFilled ? std::optional(list.take()) : std::nullopt;
}

// The runs of a buffer, found by their IDs. What it finds is what a search from the start would:
// the first run of the IDs that comes before any run without elements.
class RunIndex {
 public:
  // How a search for IDs that no run has would end.
  enum class End { kAtEnd, kBeyondEnd, kAtEmptyRun };

  explicit RunIndex(std::span<const std::byte> buffer) : buffer_(buffer) {
    std::size_t at = 0;
    while (at < buffer.size()) {
      ByteReader reader(buffer.subspan(at, kRawElementSize));
      Run run{reader.little<std::uint64_t>(), reader.little<std::uint64_t>(), at, 0};
      run.length = elementCountOfType(reader.little<std::uint64_t>()) * kRawElementSize;
      if (run.length == 0) {
        end_ = End::kAtEmptyRun;
        break;
      }
      runs_.push_back(run);
      at += run.length;
    }
    if (at > buffer.size()) end_ = End::kBeyondEnd;
    // Mostly they are in order: channels are, and the hub keeps theirs.
    if (!std::ranges::is_sorted(runs_, {}, KeyOf)) std::ranges::stable_sort(runs_, {}, KeyOf);
  }

  End end() const { return end_; }

  struct Found {
    bool isThere = false;
    std::span<const std::byte> records;  // empty when the run reaches beyond the buffer
  };
  Found find(std::uint64_t driverID, std::uint64_t channelID) {
    const std::pair key(driverID, channelID);
    // The one after the last that was found, if it is the first of its IDs.
    const bool isNext = next_ < runs_.size() && KeyOf(runs_[next_]) == key &&
                        (next_ == 0 || KeyOf(runs_[next_ - 1]) != key);
    const auto found = isNext ? runs_.begin() + static_cast<std::ptrdiff_t>(next_)
                              : std::ranges::lower_bound(runs_, key, {}, KeyOf);
    if (found == runs_.end() || KeyOf(*found) != key) return {};
    next_ = static_cast<std::size_t>(found - runs_.begin()) + 1;
    const bool fits = found->length <= buffer_.size() - found->offset;
    return {true,
            fits ? buffer_.subspan(found->offset, found->length) : std::span<const std::byte>()};
  }

 private:
  struct Run {
    std::uint64_t driverID = 0;
    std::uint64_t channelID = 0;
    std::size_t offset = 0;
    std::size_t length = 0;
  };
  static std::pair<std::uint64_t, std::uint64_t> KeyOf(const Run& run) {
    return {run.driverID, run.channelID};
  }

  std::span<const std::byte> buffer_;
  std::vector<Run> runs_;
  End end_ = End::kAtEnd;
  std::size_t next_ = 0;
};

// Gives the new channel its run; `status` becomes kKernelNotFound when there is none.
int _fillSampleFromBuffer(RunIndex& runs, const Dictionary& channel, Dictionary& newChannel,
                          KernelReturn& status) {
  newChannel.remove(kRawElementsKey);
  const auto [isThere, records] =
      runs.find(static_cast<std::uint64_t>(DrvReportChannelGetDriverID(channel)),
                static_cast<std::uint64_t>(DrvReportChannelGetChannelID(channel)));
  if (!isThere) {
    switch (runs.end()) {
      case RunIndex::End::kAtEmptyRun:
        return 1;
      case RunIndex::End::kAtEnd:
        status = kKernelNotFound;
        return kDrvReportLeaveOut;
      case RunIndex::End::kBeyondEnd:
        return 0;  // the channel stays, without records
    }
  }
  if (records.empty()) return 0;
  if (DrvReportChannelGetFormat(channel) == kDrvReportFormatUnknown) {
    ByteReader reader(records);
    reader.skip(kRawElementTypeOffset);
    setChannelType(newChannel, reader.little<std::uint64_t>());
  }
  newChannel[kRawElementsKey] = Data(records.begin(), records.end());
  return 0;
}

}  // namespace

bool DrvReportSubscription::open(const Data& interests, std::optional<ErrorValue>* error) {
  const RegistryHandle hub = registry_.FindServiceByClass("DrvReportHub");
  if (hub == 0) {
    storeErr(error, kKernelNotFound);
    return false;
  }
  KernelReturn status = connect(hub, error);
  registry_.ReleaseHandle(hub);
  if (status != kKernelSuccess) return false;
  status = configure(interests);
  if (status != kKernelSuccess) {
    storeErr(error, status, "kDrvReportUserClientConfigureInterests failed");
    return false;
  }
  status = registry_.MapDriverMemory(connection_, memoryType(), buffer_);
  isMapped_ = status == kKernelSuccess;
  if (!isMapped_) storeErr(error, status, "MapDriverMemory() failed");
  return isMapped_;
}

KernelReturn DrvReportSubscription::connect(RegistryHandle hub, std::optional<ErrorValue>* error) {
  RegistryHandle connection = 0;
  KernelReturn status = registry_.OpenDriverConnection(hub, 0, connection);
  if (status != kKernelSuccess) {
    storeErr(error, status, "Could not open DrvReportHub");
    return status;
  }
  std::size_t written = 0;
  status = registry_.CallDriverScalar(connection, kDrvReportUserClientOpen, {}, {}, written);
  if (status != kKernelSuccess) {
    storeErr(error, status, "kDrvReportUserClientOpen failed");
    registry_.CloseDriverConnection(connection);
    return status;
  }
  connection_ = connection;
  return kKernelSuccess;
}

KernelReturn DrvReportSubscription::configure(const Data& interests) {
  DriverCall call;
  call.structInput = interests;
  call.scalarOutput = {&token_, 1};
  return registry_.CallDriverMethod(connection_, kDrvReportUserClientConfigureInterests, call);
}

KernelReturn DrvReportSubscription::update() {
  DriverCall call;
  call.scalarInput = {&token_, 1};
  return registry_.CallDriverMethod(connection_, kDrvReportUserClientUpdateKernelBuffer, call);
}

std::shared_ptr<DrvReportSubscription> DrvReportCreateSubscription(
    DriverRegistry& registry, std::pmr::memory_resource* allocator, const Dictionary* desired,
    Dictionary* subscribed, std::uint64_t, std::optional<ErrorValue>* error) {
  const auto fail = [error](KernelReturn code, const char* reason) {
    storeErr(error, code, reason);
    return nullptr;
  };
  if (desired == nullptr || subscribed == nullptr) {
    return fail(kKernelBadArgument, "bad arguments");
  }
  const int count = DrvReportGetChannelCount(*desired);
  if (count < 0) return fail(kKernelBadArgument, "iteration error");
  if (count == 0) return fail(kKernelBadArgument, "no channels");
  const auto interests = createInterestList(*desired, static_cast<std::size_t>(count));
  if (!interests) return fail(kKernelNoMemory, "createInterestList() failed");
  const std::pmr::polymorphic_allocator<DrvReportSubscription> memory(
      allocator != nullptr ? allocator : std::pmr::new_delete_resource());
  std::shared_ptr<DrvReportSubscription> subscription;
  try {
    subscription = std::allocate_shared<DrvReportSubscription>(memory, registry);
  } catch (const std::bad_alloc&) {
    storeErr(error, kKernelNoMemory);
    return nullptr;
  }
  if (!subscription->open(*interests, error)) return nullptr;
  *subscribed = cloneAggregate(*desired, [](const Dictionary&, Dictionary&) {
                  return 0;
                }).value_or(Dictionary());
  return subscription;
}

std::optional<Dictionary> DrvReportCreateSamples(DrvReportSubscription* subscription,
                                                 const Dictionary* subscribed,
                                                 std::optional<ErrorValue>* error) {
  const KernelReturn status = subscription == nullptr || subscribed == nullptr
                                  ? kKernelBadArgument
                                  : subscription->update();
  if (status != kKernelSuccess) {
    storeErr(error, status);
    return std::nullopt;
  }
  return DrvReportCreateSamplesRaw(subscribed, subscription->buffer(), error);
}

std::optional<Dictionary> DrvReportCreateSamplesRaw(
    const Dictionary* subscribed, std::optional<std::span<const std::byte>> buffer,
    std::optional<ErrorValue>* error) {
  constexpr char kReason[] = "couldn't create samples";
  if (subscribed == nullptr || !buffer || buffer->size() < kRawElementSize) {
    storeErr(error, kKernelBadArgument, kReason);
    return std::nullopt;
  }
  RunIndex runs(buffer->first(buffer->size() - buffer->size() % kRawElementSize));
  KernelReturn status = kKernelError;
  auto samples = cloneAggregate(*subscribed, [&](const Dictionary& channel, Dictionary& made) {
    return _fillSampleFromBuffer(runs, channel, made, status);
  });
  if (!samples) storeErr(error, status, kReason);
  return samples;
}

}  // namespace quorlet
