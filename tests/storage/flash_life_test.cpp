#include "storage/flash_life.h"

#include <gtest/gtest.h>

#include "collectors/flash_wear.h"
#include "fakes/fake_platform.h"

namespace quorlet {
namespace {

// One day's reading of a drive: -1 for what it does not tell.
struct Reading {
  std::int32_t day;
  std::int64_t used;
  std::int64_t written = -1;
  std::int64_t mediaWritten = -1;
  std::int64_t identity = 7;
};

// A device whose passes record a drive that steps by 10 % (eMMC) or 1 % (NVMe).
struct Recorder {
  Recorder() { drive.place = "0000:03:00.0"; }
  void record(const Reading& reading) {
    drive.identity = reading.identity;
    drive.figures = {};
    const auto set = [&](DriveFigure figure, std::int64_t value) {
      if (value >= 0) drive.figures.set(figure, static_cast<std::uint64_t>(value));
    };
    set(DriveFigure::kUsed, reading.used);
    set(DriveFigure::kBytesWritten, reading.written);
    set(DriveFigure::kMediaBytesWritten, reading.mediaWritten);
    device.drives.drives = {drive};
    device.clock.seconds = reading.day * 86400.0 + 60;
    device.counterStore.TLClientCheckpoint();
    CounterBatch counters(device.counterStore);
    RecordFlash(device.drives, device.counterStore, counters);
    EXPECT_TRUE(counters.commit());
  }
  // "days, bytes a day, percent a day, amplification, days left", "?" for what is not known.
  std::string life() {
    std::optional<Dictionary> note;
    EXPECT_TRUE(device.counterStore.readNote(kFlashNote, note));
    const FlashMemory memory = ReadFlashMemories(note)[drive.place];
    const std::int32_t today = device.counterStore.TLDaysSince1970();
    FlashDays days;
    EXPECT_TRUE(ReadFlashDays(device.counterStore, drive.place, memory, today, days));
    const FlashLife life = EstimateFlashLife(drive, memory, days, today);
    const auto text = [](const auto& value) {
      return value ? PropertyValue(Double(static_cast<double>(*value))).description() : "?";
    };
    return std::to_string(life.recordedDays) + " " + text(life.bytesPerDay) + " " +
           text(life.percentPerDay) + " " + text(life.writeAmplification) + " " +
           text(life.daysLeft) + (life.daysLeftAtLeast ? ">" + text(life.daysLeftAtLeast) : "");
  }

  FakePlatform device;
  Drive drive;
};

TEST(FlashLifeTest, DaysBecomeLife) {
  const struct {
    const char* what;
    std::int64_t step;
    std::vector<Reading> readings;
    std::string expected;
  } cases[] = {
      {"one day says nothing", 1, {{20000, 5, 1000}}, "1 ? ? ? ?"},
      // 5 % with 6000 bytes: 100 bytes a day are 0.0833... %, and 95 % last 1140 days.
      {"bytes", 1, {{20000, 5, 5000}, {20010, 5, 6000}}, "2 100 0.08333333333333334 ? 1140"},
      {"nothing written", 1, {{20000, 5, 5000}, {20010, 5, 5000}}, "2 0 0 ? ?>950"},
      {"nothing used", 1, {{20000, 0, 5000}, {20010, 0, 6000}}, "2 100 ? ? ?>1000"},
      {"worn out", 1, {{20000, 100, 5000}, {20010, 104, 6000}}, "2 100 1.733333333333333 ? 0"},
      {"write amplification",
       1,
       {{20000, 0, 5000, 9000}, {20010, 0, 6000, 11500}},
       "2 100 ? 2.5 ?>1000"},
      {"bytes that fall", 1, {{20000, 5, 5000}, {20010, 5, 4000}}, "2 ? ? ? ?>950"},
      // From 10 to 20 % in 400 days; on day 20500 there are 20 % used, 60 days later 21.5.
      {"steps of a tenth",
       10,
       {{20000, 10}, {20100, 20}, {20500, 30}, {20560, 30}},
       "1 ? 0.025 ? 3140"},
      {"one step", 10, {{20000, 10}, {20100, 20}}, "1 ? ? ? ?>400"},
      {"beyond its life", 10, {{20000, 10}, {20100, 110}}, "1 ? ? ? 0"},
      {"it tells nothing", 1, {{20000, -1}}, "0 ? ? ? ?"},
      {"another drive", 1, {{20000, 5, 5000}, {20010, 5, 6000, -1, 8}}, "1 ? ? ? ?"},
      {"wear that falls",
       10,
       {{20000, 20}, {20100, 30}, {20200, 10}, {20300, 20}},
       "1 ? ? ? ?>400"},
      {"a clock that was wrong",
       1,
       {{30000, 5, 5000}, {20000, 5, 5000}, {20010, 5, 6000}},
       "2 100 0.08333333333333334 ? 1140"},
      {"the largest", 1, {{20000, 255, INT64_MAX}, {20001, 255, INT64_MAX}}, "2 0 0 ? 0"},
  };
  for (const auto& [what, step, readings, expected] : cases) {
    Recorder recorder;
    recorder.drive.usedStep = step;
    for (const Reading& reading : readings) recorder.record(reading);
    EXPECT_EQ(recorder.life(), expected) << what;
  }
}

TEST(FlashLifeTest, WhatIsRememberedOutlivesTheStoresDaysAndItsDamage) {
  Recorder recorder;
  recorder.record({20000, 5, 5000});
  const FlashMemories before = ReadFlashMemories(recorder.device.counterStore.notes[kFlashNote]);
  EXPECT_EQ(before, (FlashMemories{{"0000:03:00.0", {7, 20000, 5, 5, 0, 0, 0, 0}}}));
  EXPECT_EQ(ReadFlashMemories(
                Dictionary{{"a", "text"}, {"b", Dictionary{{"since", Int64(-1)}, {"used", "x"}}}}),
            (FlashMemories{{"b", {}}}));
  recorder.device.counterStore.isUnreadable = true;
  FlashDays days;
  EXPECT_FALSE(ReadFlashDays(recorder.device.counterStore, "x", {}, 20000, days));
  // More places than are remembered: those of today stay.
  std::vector<Drive> drives;
  for (int i = 0; i < 64; ++i) {
    recorder.drive.place = std::to_string(i);
    drives.push_back(recorder.drive);
  }
  recorder.device.drives.drives = drives;
  CounterBatch counters(recorder.device.counterStore);
  RecordFlash(recorder.device.drives, recorder.device.counterStore, counters);
  EXPECT_TRUE(counters.commit());
  EXPECT_EQ(recorder.device.counterStore.notes[kFlashNote].size(), 64u);
}

}  // namespace
}  // namespace quorlet
