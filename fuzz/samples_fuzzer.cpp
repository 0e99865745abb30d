// Any buffer of the hub gives the samples that a search from its start gives, and any legend gives
// channels that can be described.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <span>
#include <string_view>
#include <variant>

#include "drvreport/drvreport.h"
#include "fakes/fake_driver_registry.h"
#include "values/byte_reader.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

// What a sample's records are to be; nothing when the channel is left out or the whole fails.
enum class Outcome { kFound, kWithoutRecords, kLeftOut, kFailed };

Outcome Search(std::span<const std::byte> buffer, std::int64_t driver, std::int64_t channel,
               std::span<const std::byte>& records) {
  while (!buffer.empty()) {
    ByteReader reader(buffer);
    const auto runDriver = static_cast<std::int64_t>(reader.little<std::uint64_t>());
    const auto runChannel = static_cast<std::int64_t>(reader.little<std::uint64_t>());
    const std::size_t size = (reader.little<std::uint64_t>() >> 32 & 0xFFFF) * 64;
    if (size == 0) return Outcome::kFailed;
    const bool fits = size <= buffer.size();
    if (runDriver == driver && runChannel == channel) {
      if (fits) records = buffer.first(size);
      return fits ? Outcome::kFound : Outcome::kWithoutRecords;
    }
    if (!fits) return Outcome::kWithoutRecords;
    buffer = buffer.subspan(size);
  }
  return Outcome::kLeftOut;
}

void CheckSamples(std::span<const std::byte> buffer) {
  Dictionary channels = DrvReportCreateAggregate(0);
  for (std::uint64_t id = 0; id < 4; ++id) {
    DrvReportAddChannelDescription(channels, id % 2, "d", id, id, {}, {}, {}, nullptr);
  }
  const auto samples = DrvReportCreateSamplesRaw(&channels, buffer);
  if (buffer.size() < 64) {
    if (samples) std::abort();
    return;
  }
  const auto whole = buffer.first(buffer.size() - buffer.size() % 64);
  std::size_t next = 0;
  for (std::int64_t id = 0; id < 4; ++id) {
    std::span<const std::byte> records;
    const Outcome outcome = Search(whole, id % 2, id, records);
    if (outcome == Outcome::kFailed) {
      if (samples) std::abort();
      return;
    }
    if (outcome == Outcome::kLeftOut) continue;
    if (!samples) continue;  // a later channel fails
    Dictionary sample = *(*ArrayEntry(*samples, "DrvReportChannels"))[next++].asDictionary();
    const Data* found = DataEntry(sample, "RawElements");
    if ((found != nullptr) != (outcome == Outcome::kFound)) std::abort();
    if (found != nullptr &&
        !std::equal(records.begin(), records.end(), found->begin(), found->end())) {
      std::abort();
    }
    (void)DrvReportSampleCopyDescription(sample);
    (void)DrvReportSampleCreateDelta(sample, sample);
  }
}

void CheckLegend(const PropertyValue& legend) {
  FakeDriverRegistry registry;
  FakeEntry entry;
  entry.name = "d";
  entry.properties["DrvReportLegendPublic"] = true;
  entry.properties["DrvReportLegend"] = legend;
  registry.entries.push_back(entry);
  for (const std::uint32_t opts : {0u, 3u}) {
    const auto channels = DrvReportCopyAllChannels(registry, opts);
    if (!channels || DrvReportGetChannelCount(*channels) < 0) {
      if (channels && DrvReportGetChannelCount(*channels) < 0 && opts == 0) std::abort();
      continue;
    }
    DrvReportIterate(*channels, [](Dictionary& channel) {
      (void)DrvReportChannelCopyDescription(channel);
      std::int64_t bound = 0;
      (void)DrvReportHistogramGetBucketBounds(channel, 0, nullptr, &bound);
      return 0;
    });
  }
}

}  // namespace
}  // namespace quorlet

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  quorlet::CheckSamples(std::as_bytes(std::span(data, size)));
  const auto document = quorlet::ReadPropertyList(text);
  if (const auto* legend = std::get_if<quorlet::PropertyValue>(&document)) {
    quorlet::CheckLegend(*legend);
  }
  return 0;
}
