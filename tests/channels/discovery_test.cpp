// The library's one public header comes first: it must need nothing before it.
#include <gtest/gtest.h>

#include "drvreport/drvreport.h"
#include "fakes/fake_driver_registry.h"

namespace quorlet {
namespace {

PropertyValue Legend(std::int64_t id, std::int64_t type = 1) {
  return Array{Int64(id), Int64(type)};
}
Dictionary Group(const char* group, const char* subgroup, PropertyValue channels) {
  Dictionary description;
  if (group != nullptr) description["DrvReportGroupName"] = group;
  if (subgroup != nullptr) description["DrvReportSubGroupName"] = subgroup;
  description["DrvReportChannels"] = std::move(channels);
  return description;
}

struct Discovery : testing::Test {
  ~Discovery() override { EXPECT_TRUE(registry.isBalanced()); }
  FakeEntry& addDriver(const char* name, std::optional<PropertyValue> legend) {
    FakeEntry entry;
    entry.id = 16 + registry.entries.size();
    entry.name = name;
    entry.properties["DrvReportLegendPublic"] = true;
    if (legend) entry.properties["DrvReportLegend"] = *legend;
    registry.entries.push_back(std::move(entry));
    return registry.entries.back();
  }
  // "driver:place:ID" of every channel; what went wrong, when nothing came back.
  std::string shown(const std::optional<Dictionary>& aggregate) {
    if (!aggregate) return error ? error->reason : "(nothing)";
    std::string text;
    show(*aggregate, "", text);
    return text;
  }
  static void show(const Dictionary& aggregate, const std::string& place, std::string& text) {
    if (const Array* channels = ArrayEntry(aggregate, "DrvReportChannels")) {
      for (const PropertyValue& channel : *channels) {
        text += place + std::to_string(DrvReportChannelGetChannelID(*channel.asDictionary())) + " ";
      }
    }
    for (const char* key : {"DrvReportDrivers", "DrvReportChannelGroups"}) {
      const Dictionary* level = DictionaryEntry(aggregate, key);
      if (level == nullptr) continue;
      for (const auto& [name, sub] : *level) show(*sub.asDictionary(), place + name + ":", text);
    }
  }
  std::string all(std::uint32_t opts = 0) {
    error.reset();
    return shown(DrvReportCopyAllChannels(registry, opts, &error));
  }

  FakeDriverRegistry registry;
  std::optional<ErrorValue> error;
};

TEST_F(Discovery, ChannelsAreFiledAsAsked) {
  addDriver("one",
            Array{Group("G", "S", Array{Legend(1)}), Group(nullptr, nullptr, Array{Legend(2)})});
  addDriver("two", Array{Group("G", nullptr, Array{Legend(3, 0x1000002)})});
  EXPECT_EQ(all(), "1 2 3 ");
  EXPECT_EQ(all(1), "one <id 0x10>:1 one <id 0x10>:2 two <id 0x11>:3 ");
  EXPECT_EQ(all(2), "2 G:3 G:S:1 ");
  EXPECT_EQ(all(3), "one <id 0x10>:2 one <id 0x10>:G:S:1 two <id 0x11>:G:3 ");
  const auto in = [&](std::uint64_t mask) {
    return shown(DrvReportCopyChannelsInCategories(registry, mask, 0));
  };
  EXPECT_EQ(in(0), "");
  EXPECT_EQ(in(0x10100), "3 ");
  EXPECT_EQ(shown(DrvReportCopyChannelsOfFormat(registry, 0x101, 0)), "1 2 ");
  EXPECT_EQ(shown(DrvReportCopyChannelsWithUnit(registry, 1ULL << 63, 0)), "1 2 3 ");
  EXPECT_EQ(shown(DrvReportCopyChannelsInGroup(registry, "G", std::nullopt, 0)), "1 3 ");
  EXPECT_EQ(shown(DrvReportCopyChannelsInGroup(registry, std::nullopt, "S", 0)), "1 ");
  EXPECT_EQ(shown(DrvReportCopyChannelsInGroup(registry, {}, {}, 0, &error)),
            "no group or subgroup!");
}

TEST_F(Discovery, ALegendCountsUpToItsFault) {
  const PropertyValue good = Group("G", nullptr, Array{Legend(1)});
  const PropertyValue next = Group("H", nullptr, Array{Legend(2)});
  const std::tuple<PropertyValue, std::string> cases[] = {
      {Array{good, "x", next}, "1 "},
      {Array{good, Group(nullptr, "S", Array{Legend(9)}), next}, "1 "},
      {Array{good, Group("G", nullptr, "x"), next}, "1 "},
      {Array{Group("G", nullptr, Array{Legend(1), "x", Legend(9)}), next}, "1 2 "},
      {Array{good, Group("G", nullptr, Array{PropertyValue(Array{Int64(1)})}), next}, ""},
      {Array{Group("G", nullptr, Array{Legend(INT64_MIN)})}, ""},
      {Array{Group("G", nullptr, Array{PropertyValue(Array{"x", Int64(1)})})}, ""},
      {"x", ""},
      {Array(), ""}};
  for (const auto& [legend, channels] : cases) {
    registry.entries.clear();
    addDriver("d", legend);
    EXPECT_EQ(all(), channels) << legend.description();
  }
  registry.entries.clear();
  addDriver("silent", std::nullopt);
  addDriver("private", Array{good}).properties["DrvReportLegendPublic"] = false;
  addDriver("ok\n", Array{next});
  testing::internal::CaptureStderr();
  EXPECT_EQ(all(0x80000000), "2 ");
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "silent <id 0x10>: no legend\n");
}

TEST_F(Discovery, FailuresOfOneDriverAndOfTheRegistry) {
  Dictionary everything;
  addDriver("d", Array{Group("G", nullptr, Array{Legend(1)})});
  EXPECT_EQ(shown(DrvReportCopyChannelsForDrivers(registry, &everything, 0)), "1 ");
  EXPECT_EQ(shown(DrvReportCopyChannelsWithID(registry, &everything, 77)), "77 ");
  EXPECT_EQ(shown(DrvReportCopyChannelsForDrivers(registry, nullptr, 0, &error)),
            "no matching dict");
  EXPECT_EQ(shown(DrvReportCopyChannelsForDriver(registry, 12345, 0, &error)), "invalid driver");
  EXPECT_EQ(error->code, static_cast<std::int32_t>(0xE00002C2));

  registry.entries[0].idStatus = 5;
  EXPECT_EQ(shown(DrvReportCopyChannelsForDrivers(registry, &everything, 0, &error)),
            "createErr() passed a NULL string!");
  EXPECT_EQ(shown(DrvReportCopyChannelsWithID(registry, &everything, 77, &error)),
            "error extracting driver info");
  EXPECT_EQ(error->code, 5);
  registry.entries[0].properties["DrvReportLegend"] = "x";
  EXPECT_EQ(shown(DrvReportCopyChannelsForDrivers(registry, &everything, 0, &error)), "bad legend");
  registry.changesAfter = 1;
  error.reset();
  EXPECT_EQ(all(), "(nothing)");
  registry.findStatus = 9;
  EXPECT_EQ(all(), "(nothing)");
}

TEST_F(Discovery, ChannelsThatTheCallerDescribesAndMerges) {
  Dictionary aggregate = DrvReportCreateAggregate(1);
  const Dictionary info = DrvReportCreateUnitInfo(0x0900820000000000);
  EXPECT_EQ(DrvReportAddChannelDescription(aggregate, 5, "drv", 6, 1, "name", "G", "S", &info), 0u);
  EXPECT_EQ(DrvReportAddChannelDescription(aggregate, 5, "drv", 1ULL << 63, 1, {}, {}, {}, nullptr,
                                           &error),
            0xE00002BC);
  EXPECT_EQ(error->reason, "couldn't create channel");
  EXPECT_EQ(shown(aggregate), "drv:6 ");
  Dictionary flat = DrvReportCreateAggregate(0);
  EXPECT_EQ(DrvReportMergeChannels(&flat, &aggregate), 0);
  EXPECT_EQ(shown(flat), "6 ");
  const Dictionary sharing = flat.shallowCopy();
  EXPECT_EQ(DrvReportMergeChannels(&flat, &sharing), 0);
  EXPECT_EQ(shown(flat), "6 6 ") << "what it adds is not merged again";
  EXPECT_EQ(DrvReportMergeChannels(&flat, &flat, &error), 0x111);
  EXPECT_EQ(error->reason, "bad argument");
  flat["DrvReportChannels"] = "x";
  EXPECT_EQ(DrvReportMergeChannels(&flat, &aggregate, &error), 1);
  EXPECT_EQ(error->reason, "_addChannel() failed");

  Dictionary channel =
      *(*ArrayEntry(*DictionaryEntry(*DictionaryEntry(aggregate, "DrvReportDrivers"), "drv"),
                    "DrvReportChannels"))[0]
           .asDictionary();
  EXPECT_EQ(*DrvReportChannelGetChannelName(channel), "name");
  EXPECT_EQ(DrvReportChannelGetUnit(channel), 0x0900820000000000u);
}

TEST(Channel, IDsThatPrintAreNames) {
  const std::tuple<std::uint64_t, const char*> cases[] = {
      {0x4142434445464748, "ABCDEFGH"}, {0x0000435055200000, "CPU "},
      {0x0000000041004200, "AB"},       {0, nullptr},
      {0x4100000700000042, nullptr},    {0x80, nullptr}};
  for (const auto& [id, name] : cases) {
    Dictionary channel{{"LegendChannel", Array{Int64(static_cast<std::int64_t>(id))}}};
    const std::string* found = DrvReportChannelGetChannelName(channel);
    EXPECT_EQ(found != nullptr ? *found : "", name != nullptr ? name : "") << id;
    EXPECT_EQ(DrvReportChannelGetFormat(channel), 0);
    EXPECT_EQ(DrvReportChannelGetCategories(channel), 0xFFFF);
  }
}

}  // namespace
}  // namespace quorlet
