#include <gtest/gtest.h>

#include "channels/sample_makers.h"
#include "collectors/platform_statistics.h"
#include "fakes/fake_platform.h"

namespace quorlet {
namespace {

constexpr std::uint64_t kDaily = 0x1000000;  // category 0x100 in a type word

Data Record(std::uint64_t channel, std::int64_t value) {
  ByteWriter record;
  record.u64(16).u64(channel).u64(kDaily | 1 | std::uint64_t{1} << 32);
  return record.u64(5).u64(static_cast<std::uint64_t>(value)).text("", 24).take();
}

// What a pass stores under "nuvex.drvreport.", for a driver with these channels and this hub.
std::map<std::string, std::int64_t> Stored(const Array& legends, const Data& memory, bool hasHub) {
  FakePlatform device;
  FakeEntry driver;
  driver.id = 16;
  driver.properties["DrvReportLegendPublic"] = true;
  driver.properties["DrvReportLegend"] = Array{Dictionary{{"DrvReportChannels", legends}}};
  device.driverRegistry.entries.push_back(driver);
  if (hasHub) {
    FakeEntry hub;
    hub.className = "DrvReportHub";
    hub.driver = [](std::uint32_t, DriverCall&) { return kKernelSuccess; };
    hub.memory = memory;
    device.driverRegistry.entries.push_back(hub);
  }
  collectPlatformStatistics(device.services);
  EXPECT_TRUE(device.driverRegistry.isBalanced());
  std::map<std::string, std::int64_t> stored;
  for (const auto& [row, value] : device.counterStore.scalars) {
    if (row.first.starts_with("nuvex.drvreport.")) stored[row.first.substr(16)] = value;
  }
  return stored;
}

TEST(ReportingChannels, SimpleChannelsOfTheDailyCategoryAreStored) {
  const auto legend = [](std::int64_t id, std::int64_t format, std::optional<const char*> name,
                         std::int64_t categories = std::int64_t{kDaily}) {
    Array entry{Int64(id), Int64(categories | format)};
    if (name) entry.push_back(*name);
    return entry;
  };
  const Array legends{legend(1, 1, "a"),
                      legend(2, 1, "twice"),
                      legend(3, 1, "twice"),
                      legend(4, 2, "state"),
                      legend(5, 1, "other category", 0x10000),
                      legend(6, 1, std::nullopt),
                      legend(7, 1, "missing"),
                      legend(8, 1, "unreadable")};
  Data memory;
  for (std::uint64_t id = 1; id <= 8; ++id) {
    if (id == 7) continue;
    Data record = Record(id, static_cast<std::int64_t>(id) * 10);
    if (id == 8) record[16] = std::byte{2};
    memory.insert(memory.end(), record.begin(), record.end());
  }
  const std::map<std::string, std::int64_t> expected{
      {"a", 10}, {"twice", 30}, {"(null)", 60}, {"unreadable", INT64_MIN}};
  EXPECT_EQ(Stored(legends, memory, true), expected);
  EXPECT_TRUE(Stored(legends, memory, false).empty());
  EXPECT_TRUE(Stored(legends, Data(), true).empty());
}

}  // namespace
}  // namespace quorlet
