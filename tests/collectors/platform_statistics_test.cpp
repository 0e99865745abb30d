#include "collectors/platform_statistics.h"

#include <gtest/gtest.h>

#include "fakes/fake_platform.h"

namespace quorlet {
namespace {

constexpr char kEvents[] = "kern.next_ecc_event";
// Of the step before.
constexpr char kNoStorage[] =
    "error reading nand info, error 1 with message Unable to parse buffer";

// Every byte of register i is 0xF0 + i.
std::string Event(int count, std::size_t size = 72) {
  std::string bytes = {'\xFF', static_cast<char>(count), 7, 7, 7, 7, 7, 7};
  for (int i = 0; i < 9; ++i) bytes.append(8, static_cast<char>(0xF0 + i));
  return bytes.substr(0, size);
}

PropertyValue Entry(int count, std::uint64_t lastRegister = 0xF7F7F7F7F7F7F7F7) {
  Dictionary entry{{"id", Int32(255)}, {"count", Int32(count)}};
  for (unsigned i = 0; i < std::min(8U, static_cast<unsigned>(count)); ++i) {
    const std::uint64_t bits = i == 7 ? lastRegister : 0x0101010101010101U * (0xF0 + i);
    entry["reg" + std::to_string(i)] = Int64(static_cast<std::int64_t>(bits));
  }
  return entry;
}

TEST(EccEventsTest, PendingEventsBecomeStructuredEntries) {
  using Events = std::deque<std::string>;
  Array ten;
  while (ten.size() < 10) ten.push_back(Entry(2));
  const struct {
    Events pending;
    int endsWith;
    Array entries;
    int logged;  // an error number, or 0 for no line
    std::size_t left;
  } cases[] = {
      {{Event(1)}, EBUSY, {Entry(1)}, 0, 0},
      {{Event(0), Event(8)}, EIO, {Entry(0), Entry(8)}, EIO, 0},
      {{Event(9), Event(255)}, ENOENT, {Entry(9), Entry(255)}, 0, 0},
      {Events(12, Event(2)), ENOENT, ten, 0, 2},
      {{Event(1, 73)}, ENOENT, {}, ENOMEM, 1},
      {{Event(8, 71), Event(8)}, ENOENT, {Entry(8, 0x00F7F7F7F7F7F7F7)}, ENOMEM, 1},
      {{""}, ENOENT, {Dictionary{{"id", Int32(0)}, {"count", Int32(0)}}}, 0, 0},
  };
  for (const auto& [pending, endsWith, entries, logged, left] : cases) {
    FakePlatform device;
    device.kernelParameters.queues[kEvents] = pending;
    device.kernelParameters.missing = endsWith;
    collectPlatformStatistics(device.services);
    Array written;
    for (const auto& [type, entry] : device.crashSupport.entries) {
      written.push_back(type == 172 ? PropertyValue(entry) : Int32(type));
    }
    const auto line = FormatText("Unexpected errno (%d) reading ECC events from kernel", logged);
    std::vector<std::string> lines{kNoStorage};
    if (logged != 0) lines.push_back(line);
    EXPECT_EQ(written, entries) << PropertyValue(entries).description();
    EXPECT_EQ(device.log.at(LogLevel::kDefault), lines);
    EXPECT_EQ(device.kernelParameters.queues[kEvents].size(), left);
  }
}

TEST(EccEventsTest, StayQueuedUntilTheyAreLogged) {
  FakePlatform device;
  device.kernelParameters.queues[kEvents] = {Event(1), Event(2)};
  for (const bool isFull : {true, false}) {
    device.crashSupport.isFull = isFull;
    collectPlatformStatistics(device.services);
    EXPECT_EQ(device.kernelParameters.queues[kEvents].size(), isFull ? 2u : 0u);
  }
  ASSERT_EQ(device.crashSupport.entries.size(), 2u);
  EXPECT_EQ(PropertyValue(device.crashSupport.entries[0].second), Entry(1));
}

}  // namespace
}  // namespace quorlet
