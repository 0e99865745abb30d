#include <gtest/gtest.h>

#include "channels/sample_makers.h"
#include "drvreport/drvreport.h"
#include "fakes/fake_driver_registry.h"

namespace quorlet {
namespace {

// A run of `count` records that claims `claimed` elements.
Data RunOf(std::uint64_t driver, std::uint64_t channel, std::size_t count, std::size_t claimed) {
  ByteWriter run;
  for (std::size_t i = 0; i < count; ++i) {
    run.u64(driver).u64(channel).u64(claimed << 32 | 1).u64(9).u64(100).u64(0).u64(0).u64(0);
  }
  return run.take();
}
Data Joined(std::initializer_list<Data> parts) {
  Data all;
  for (const Data& part : parts) all.insert(all.end(), part.begin(), part.end());
  return all;
}

Dictionary Channels(std::initializer_list<std::int64_t> ids, std::int64_t type = 1) {
  Array channels;
  for (const std::int64_t id : ids) {
    channels.push_back(
        Dictionary{{"DriverID", Int64(7)}, {"LegendChannel", Array{Int64(id), Int64(type)}}});
  }
  return {{"DrvReportChannels", channels}};
}

// "ID*records" of each sample, or the code of the error.
std::string Sampled(const Dictionary& channels, std::span<const std::byte> buffer) {
  std::optional<ErrorValue> error;
  const auto samples = DrvReportCreateSamplesRaw(&channels, buffer, &error);
  if (!samples) {
    return std::to_string(static_cast<std::uint32_t>(error->code) - 0xE0000000) + error->reason;
  }
  std::string text;
  for (const PropertyValue& value : *ArrayEntry(*samples, "DrvReportChannels")) {
    const Data* records = DataEntry(*value.asDictionary(), "RawElements");
    text += std::to_string(DrvReportChannelGetChannelID(*value.asDictionary())) + "*" +
            std::to_string(records != nullptr ? records->size() / 64 : 0) + " ";
  }
  return text;
}

TEST(Samples, AreWhatASearchFromTheStartFinds) {
  const std::string failed = "couldn't create samples";
  const Data one = RunOf(7, 1, 1, 1), two = RunOf(7, 2, 2, 2), empty = RunOf(7, 3, 1, 0);
  const Data again = RunOf(7, 1, 3, 3), tooLong = RunOf(7, 3, 1, 9);
  const std::tuple<const char*, Data, std::string> cases[] = {
      {"in order", Joined({one, two}), "1*1 2*2 "},
      {"out of order", Joined({two, one}), "1*1 2*2 "},
      {"twice", Joined({one, two, again}), "1*1 2*2 "},
      {"twice, sorted", Joined({one, again, two}), "1*1 2*2 "},
      {"one missing", two, "2*2 "},
      {"another driver", Joined({RunOf(8, 1, 1, 1), two}), "2*2 "},
      {"half a record", Joined({one, two, Data(2)}), "1*1 2*2 "},
      {"an empty run after", Joined({one, two, empty}), "1*1 2*2 "},
      {"an empty run between", Joined({one, empty, two}), "700" + failed},
      {"an empty run and one missing", Joined({empty, one, two}), "700" + failed},
      {"beyond the end", Joined({one, tooLong}), "1*1 2*0 "},
      {"matching, beyond the end", Joined({two, RunOf(7, 1, 1, 2)}), "1*0 2*2 "},
      {"too short", Data(63), "706" + failed}};
  for (const auto& [name, buffer, samples] : cases) {
    EXPECT_EQ(Sampled(Channels({1, 2}), buffer), samples) << name;
  }
  EXPECT_EQ(Sampled(Channels({9, 1, 2}), Joined({one, empty})), "700" + failed);
  EXPECT_EQ(Sampled(Channels({9, 1}), one), "1*1 ");
}

TEST(Samples, TeachTheTypeWord) {
  const Dictionary channels = Channels({2}, 0);
  EXPECT_EQ(Sampled(channels, RunOf(7, 2, 2, 2)), "2*2 ");
  EXPECT_EQ(
      DrvReportChannelGetFormat(*(*ArrayEntry(channels, "DrvReportChannels"))[0].asDictionary()), 1)
      << "the legend entry is shared";
}

struct Subscription : testing::Test {
  Subscription() {
    FakeEntry hub;
    hub.className = "DrvReportHub";
    hub.memory = RunOf(7, 1, 1, 1);
    hub.driver = [this](std::uint32_t method, DriverCall& call) {
      calls += std::to_string(method);
      if (std::to_string(method) == failing) return KernelReturn{0x99};
      if (method == 2) {
        interests = Data(call.structInput.begin(), call.structInput.end());
        call.scalarOutput[0] = 0x5500000042;
      }
      if (method == 3 && call.scalarInput[0] != 0x5500000042u) return KernelReturn{0x98};
      return kKernelSuccess;
    };
    registry.entries.push_back(hub);
  }
  ~Subscription() override { EXPECT_TRUE(registry.isBalanced()); }
  // The error's code and reason; empty without one.
  std::string subscribe(const Dictionary* desired) {
    std::optional<ErrorValue> error;
    subscription = DrvReportCreateSubscription(registry, nullptr, desired, &subscribed, 0, &error);
    EXPECT_NE(subscription == nullptr, !error);
    if (!error) return "";
    std::array<char, 16> code{};
    snprintf(code.data(), code.size(), "%x ", static_cast<unsigned>(error->code));
    return code.data() + error->reason;
  }

  FakeDriverRegistry registry;
  std::string calls, failing;
  Data interests;
  Dictionary subscribed;
  std::shared_ptr<DrvReportSubscription> subscription;
};

TEST_F(Subscription, TellsTheHubAndSamplesWhatItDelivers) {
  const Dictionary desired = Channels({1, 2}, 0x100000001);
  EXPECT_EQ(subscribe(&desired), "");
  constexpr std::uint64_t kType = 0x100000001;
  EXPECT_EQ(interests,
            ByteWriter().u64(2).u64(7).u64(1).u64(kType).u64(7).u64(2).u64(kType).data());
  EXPECT_EQ(registry.mapped, std::multiset<std::uint32_t>{0x42});
  auto samples = DrvReportCreateSamples(subscription.get(), &subscribed);
  subscription.reset();
  EXPECT_EQ(calls, "023");
  ASSERT_TRUE(samples);
  EXPECT_EQ(DrvReportGetChannelCount(*samples), 1);
  EXPECT_EQ(DrvReportSimpleGetIntegerValue(
                *(*ArrayEntry(*samples, "DrvReportChannels"))[0].asDictionary()),
            100);
}

TEST_F(Subscription, EveryStepThatFailsSaysSoAndUndoesTheOthers) {
  const Dictionary good = Channels({1}), bad{{"DrvReportChannels", "x"}}, none;
  EXPECT_EQ(subscribe(nullptr), "e00002c2 bad arguments");
  EXPECT_EQ(subscribe(&bad), "e00002c2 iteration error");
  EXPECT_EQ(subscribe(&none), "e00002c2 no channels");
  const Dictionary invalid = Channels({INT64_MIN});
  EXPECT_EQ(subscribe(&invalid), "e00002bd createInterestList() failed");
  EXPECT_EQ(registry.opens, 0);
  failing = "2";
  EXPECT_EQ(subscribe(&good), "99 kDrvReportUserClientConfigureInterests failed");
  failing = "0";
  EXPECT_EQ(subscribe(&good), "99 kDrvReportUserClientOpen failed");
  failing = "3";
  EXPECT_EQ(subscribe(&good), "");
  std::optional<ErrorValue> error;
  EXPECT_FALSE(DrvReportCreateSamples(subscription.get(), &subscribed, &error));
  EXPECT_EQ(error->code, 0x99);
  EXPECT_FALSE(DrvReportCreateSamples(nullptr, &subscribed, &error));
  subscription.reset();
  registry.entries[0].mapStatus = 8;
  EXPECT_EQ(subscribe(&good), "8 MapDriverMemory() failed");
  registry.entries[0].openStatus = 7;
  EXPECT_EQ(subscribe(&good), "7 Could not open DrvReportHub");
  registry.entries.clear();
  EXPECT_EQ(subscribe(&good), "e00002f0 createErr() passed a NULL string!");
}

}  // namespace
}  // namespace quorlet
