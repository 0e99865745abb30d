#include "channels/walk.h"

#include <gtest/gtest.h>

#include "channels/sample_makers.h"

namespace quorlet {
namespace {

using Names = std::vector<std::string>;

Dictionary Channel(std::string_view name, std::int64_t id = 1, std::int64_t type = 1) {
  return {{"DriverID", Int64(7)}, {"LegendChannel", Array{Int64(id), Int64(type), name}}};
}
Dictionary Level(std::initializer_list<PropertyValue> channels) {
  return {{"DrvReportChannels", Array(channels)}};
}
// Two channels at the top, one driver with one, one group with a subgroup.
Dictionary Tree() {
  Dictionary tree = Level({Channel("a"), Channel("b", 2)});
  tree["QueryOpts"] = Int32(3);
  tree["DrvReportDrivers"] = Dictionary{{"d", Level({Channel("c")})}};
  Dictionary group = Level({Channel("e", 5)});
  group["DrvReportChannelGroups"] = Dictionary{{"s", Level({Channel("f", 6)})}};
  tree["DrvReportChannelGroups"] = Dictionary{{"g", group}};
  return tree;
}

// The names in walk order, and the walk's result.
Names Visited(const Dictionary& aggregate, int* result = nullptr, const char* failAt = "") {
  Names names;
  const int walked = DrvReportIterate(aggregate, [&](Dictionary& channel) {
    names.push_back(*DrvReportChannelGetChannelName(channel));
    return names.back() == failAt ? 3 : 0;
  });
  if (result != nullptr) *result = walked;
  return names;
}

TEST(Walk, VisitsLevelsInOrderUntilACallbackFails) {
  EXPECT_EQ(Visited(Tree()), (Names{"a", "b", "c", "e", "f"}));
  EXPECT_EQ(DrvReportGetChannelCount(Tree()), 5);
  EXPECT_EQ(DrvReportGetChannelCount(Dictionary()), 0);
  for (const char* name : {"a", "c", "f"}) {
    int result = 0;
    EXPECT_EQ(Visited(Tree(), &result, name).back(), name);
    EXPECT_EQ(result, 3);
  }
}

TEST(Walk, MalformedAggregatesFail) {
  Dictionary endless = Level({Channel("a")});
  endless["DrvReportDrivers"] = Dictionary{{"d", endless}};
  const PropertyValue cases[] = {
      Dictionary{{"DrvReportChannels", "x"}},
      Level({"x"}),
      Dictionary{{"DrvReportDrivers", Array()}},
      Dictionary{{"DrvReportDrivers", Dictionary()}},
      Dictionary{{"DrvReportDrivers", Dictionary{{"d", "x"}}}},
      Dictionary{{"DrvReportChannelGroups", Dictionary{{"g", Level({Int64(1)})}}}},
      endless};
  for (const PropertyValue& tree : cases) {
    EXPECT_EQ(DrvReportGetChannelCount(*tree.asDictionary()), -1);
    EXPECT_FALSE(cloneAggregate(*tree.asDictionary(), [](auto&&...) { return 0; }));
  }
  endless.remove("DrvReportDrivers");  // a tree that holds itself would never be freed
}

TEST(Walk, PruningRemovesChannelsAndWhatTheyLeaveEmpty) {
  const std::tuple<std::string, Names, Names, int> cases[] = {
      {"",
       {"a", "b", "c", "e", "f"},
       {"DrvReportChannelGroups", "DrvReportChannels", "DrvReportDrivers", "QueryOpts"},
       0},
      {"ac", {"b", "e", "f"}, {"DrvReportChannelGroups", "DrvReportChannels", "QueryOpts"}, 16},
      {"abf", {"c", "e"}, {"DrvReportChannelGroups", "DrvReportDrivers", "QueryOpts"}, 16},
      {"abcef", {}, {"QueryOpts"}, 16}};
  for (const auto& [removed, left, keys, result] : cases) {
    const std::string& unwanted = removed;  // clang 14 cannot capture parts of a tuple
    Dictionary tree = Tree();
    EXPECT_EQ(DrvReportPrune(tree,
                             [&](Dictionary& channel) {
                               const auto& name = *DrvReportChannelGetChannelName(channel);
                               return unwanted.find(name) != unwanted.npos ? 16 : 0;
                             }),
              result);
    EXPECT_EQ(Visited(tree), left) << removed;
    Names found;
    for (const auto& [key, value] : tree) found.push_back(key);
    EXPECT_EQ(found, keys) << removed;
  }
  // A callback may look at what it narrows, and may throw.
  Dictionary watched = Tree();
  DrvReportPrune(watched,
                 [&](Dictionary&) { return DrvReportGetChannelCount(watched) > 0 ? 16 : 0; });
  EXPECT_EQ(DrvReportGetChannelCount(watched), 0);
  Dictionary failing = Level({Channel("a"), Channel("b"), Channel("c")});
  int calls = 0;
  EXPECT_EQ(DrvReportPrune(failing, [&](Dictionary&) { return ++calls == 1 ? 16 : 5; }), 5);
  EXPECT_EQ(Visited(failing), (Names{"b", "c"})) << "what was not visited stays";
}

TEST(Walk, ClonesLeaveTheOriginalAndItsOptions) {
  const auto copy = cloneAggregate(Tree(), [](const Dictionary& channel, Dictionary& made) {
    made["New"] = true;
    return DrvReportChannelGetChannelID(channel) == 2 ? 16 : 0;
  });
  ASSERT_TRUE(copy);
  EXPECT_EQ(Visited(*copy), (Names{"a", "c", "e", "f"}));
  EXPECT_FALSE(copy->contains("QueryOpts"));
  EXPECT_FALSE(cloneAggregate(Tree(), [](auto&&...) { return 1; }));
}

// A sample aggregate of channels with these IDs, each with one simple record.
Dictionary Samples(const std::vector<std::int64_t>& ids) {
  Array channels;
  for (const std::int64_t id : ids) {
    Dictionary sample = Sample(1, {{id * 10, 1, 2, 3, 0}});
    sample["LegendChannel"] = Array{Int64(id), Int64(1)};
    channels.push_back(sample);
  }
  return {{"DrvReportChannels", channels}};
}

// The pairs "later/earlier" that a comparison is called for, and the IDs of its result.
std::optional<std::string> Compared(const Dictionary& first, const Dictionary& second) {
  std::string text;
  const auto id = [](const Dictionary& channel) {
    return std::to_string(DrvReportChannelGetChannelID(channel));
  };
  const auto result = compareAggregates(
      first, second, [&](const Dictionary& partner, const Dictionary& channel, Dictionary& made) {
        text += id(channel) + "/" + id(partner) + " ";
        const Data& records = *DataEntry(made, "RawElements");
        EXPECT_EQ(records.size(), 64u);
        EXPECT_EQ(records[39], std::byte{0x80});
        EXPECT_EQ(records[32], std::byte{0});
        return 0;
      });
  if (!result) return std::nullopt;
  text += "=";
  for (const PropertyValue& channel : *ArrayEntry(*result, "DrvReportChannels")) {
    text += " " + id(*channel.asDictionary());
  }
  return text;
}

TEST(Walk, ComparingPairsChannelsByTheirIDs) {
  EXPECT_EQ(Compared(Samples({1, 2, 3}), Samples({1, 2, 3})), "1/1 2/2 3/3 = 1 2 3");
  EXPECT_EQ(Compared(Samples({1, 9, 2, 3}), Samples({1, 2, 3})), "1/1 2/2 3/3 = 1 2 3");
  EXPECT_EQ(Compared(Samples({1, 3}), Samples({1, 2, 3})), "1/1 3/3 = 1 2 3") << "one is new";
  EXPECT_EQ(Compared(Samples({1, 3, 5}), Samples({1, 2, 3, 5})), "1/1 3/3 5/5 = 1 2 3 5");
  EXPECT_EQ(Compared(Samples({2, 1, 4}), Samples({1, 2})), "1/1 2/2 = 1 2") << "another order";
  EXPECT_EQ(Compared(Samples({9, 8, 1, 1, 3}), Samples({1, 1, 3})), "1/1 1/1 3/3 = 1 1 3");
  EXPECT_EQ(Compared(Samples({}), Samples({1})), "= 1");
  EXPECT_EQ(Compared(Dictionary(), Samples({1})), std::nullopt);
  EXPECT_EQ(Compared(Samples({1}), Level({Channel("a")})), "= 1") << "another driver";
  Dictionary broken = Samples({1});
  (*broken.find("DrvReportChannels")->asArray())[0].asDictionary()->remove("RawElements");
  EXPECT_EQ(Compared(broken, Samples({1})), std::nullopt);
  EXPECT_EQ(Compared(Samples({1}), Tree()), std::nullopt) << "no partner levels";
}

}  // namespace
}  // namespace quorlet
