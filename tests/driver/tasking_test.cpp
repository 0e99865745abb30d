#include "driver/tasking.h"

#include <gtest/gtest.h>

#include <stdexcept>
#include <tuple>

#include "fakes/fake_platform.h"

namespace quorlet {
namespace {

constexpr char kOwn[] = "nuvex.aggregated.quorlet";

PropertyValue Entry(const char* domain, const char* key, PropertyValue value) {
  return Dictionary{{"Domain", domain}, {"Key", key}, {"Value", std::move(value)}};
}

// The device runs build A1 on day 20000 and has noted that before.
struct TaskedDevice {
  TaskedDevice() {
    store(kOwn, "LastOSUpdate", Dictionary{{"version", "A1"}, {"day", Int32(20000)}});
    device.preferences.DGWPreferencesSynchronize(kOwn);
  }
  void store(const char* domain, const char* key, std::optional<PropertyValue> value) {
    device.preferences.DGWPreferencesSetValue(key, std::move(value), domain);
  }
  std::string stored(const char* domain, const char* key) {
    const auto value = device.preferences.DGWPreferencesGetValue(key, domain);
    return value ? value->description() : "-";
  }
  void schedule(const char* id, std::optional<Array> payload) {
    Dictionary tasking{{"TaskingID", id}, {"TaskingDigest", Int64(9)}};
    if (payload) tasking["TaskingPayload"] = *payload;
    store("nuvex.Ferryman", "ScheduledTasking", tasking);
    device.preferences.DGWPreferencesSynchronize("nuvex.Ferryman");
  }
  // Runs an update; returns what it said, and whether it announced a change.
  std::vector<std::string> update() {
    device.log.lines.clear();
    device.notifications.posted.clear();
    updateTasking(device.services);
    auto texts = device.log.at(LogLevel::kDefault);
    for (const auto& name : device.notifications.posted) texts.push_back("posted " + name);
    return texts;
  }

  FakePlatform device;
};
struct TaskingTest : testing::Test, TaskedDevice {};

using Texts = std::vector<std::string>;
const char kPosted[] = "posted nuvex.da.tasking_changed";

TEST_F(TaskingTest, ATaskingsLife) {
  schedule("one", Array{Entry("x", "a", Int64(1)), Entry("y", "b", "text")});
  EXPECT_EQ(update(), Texts{kPosted}) << "the first tasking";
  EXPECT_EQ(stored("x", "a") + stored("y", "b"), "1text");
  EXPECT_EQ(stored(kOwn, "TaskingID") + stored(kOwn, "TaskingOS") + stored(kOwn, "TaskingDigest"),
            "oneA19");

  store("x", "a", Int64(5));
  EXPECT_EQ(update(), Texts{}) << "the same tasking under the same build";
  EXPECT_EQ(stored("x", "a"), "5");

  schedule("two", Array{Entry("x", "c", true)});
  EXPECT_EQ(update(), (Texts{"Tasking update (one -> two, A1 -> A1)", kPosted}));
  EXPECT_EQ(stored("x", "a") + stored("y", "b") + stored("x", "c"), "--1");

  device.osVersion.build = "B2";
  EXPECT_EQ(update(), (Texts{"OS change since last run (A1 -> B2)",
                             "Tasking update (two -> two, A1 -> B2)", kPosted}));
  EXPECT_EQ(stored(kOwn, "LastOSUpdate"), "{\n    day = 20000;\n    version = B2;\n}");

  schedule("three", std::nullopt);
  EXPECT_EQ(update(), (Texts{"Tasking update (two -> three, B2 -> B2)", kPosted}));
  EXPECT_EQ(stored("x", "c") + stored(kOwn, "TaskingID") + stored(kOwn, "TaskingPayload"), "---");
  EXPECT_EQ(stored(kOwn, "TaskingOS"), "B2");
  EXPECT_EQ(update(), Texts{kPosted}) << "removed but not replaced: like the first tasking";
}

TEST_F(TaskingTest, WithoutABuildATaskingNeverMatches) {
  device.osVersion.build.reset();
  schedule("one", Array{Entry("x", "a", Int64(1))});
  EXPECT_EQ(update(), Texts{kPosted});
  EXPECT_EQ(update(), (Texts{"Tasking update (one -> one, (null) -> (null))", kPosted}));
}

struct Following {
  std::optional<Array> second;
  bool hasThird;
};

// What is durable after tasking "one", a run with tasking "two" that dies before its n-th change,
// and another run, with tasking "three" when there is one. Somebody must hear of "two".
FakePreferences::Disk AfterDeathBefore(int n, bool& died, const Following& following) {
  TaskedDevice tasked;
  tasked.schedule("one", Array{Entry("x", "a", "1"), Entry("y", "b", "1"), Entry(kOwn, "o", "1")});
  tasked.update();
  tasked.schedule("two", following.second);
  FakePreferences& preferences = tasked.device.preferences;
  int left = n;
  const auto dieInTime = [&left] {
    if (left-- == 0) throw std::runtime_error("killed");
  };
  preferences.beforeChange = dieInTime;
  tasked.device.notifications.beforePosting = dieInTime;
  died = false;
  try {
    tasked.update();
  } catch (const std::runtime_error&) {
    died = true;
  }
  preferences.beforeChange = tasked.device.notifications.beforePosting = nullptr;
  preferences.crash();
  const std::size_t announced = tasked.device.notifications.posted.size();
  if (following.hasThird) tasked.schedule("three", Array{Entry("z", "d", "3")});
  tasked.update();
  EXPECT_GE(announced + tasked.device.notifications.posted.size(), 1u)
      << "killed before change " << n;
  preferences.crash();
  auto disk = preferences.disk();
  std::erase_if(disk, [](const auto& domain) { return domain.second.empty(); });
  return disk;
}

TEST_F(TaskingTest, ARunThatDiedIsBroughtToItsEndByTheNext) {
  const Array two{Entry("x", "c", "2"), Entry("aa", "a", "2"), Entry("y", "b", "2")};
  for (const Following& following :
       {Following{two, false}, Following{two, true}, Following{std::nullopt, false},
        Following{std::nullopt, true}}) {
    bool died = true;
    const auto undisturbed = AfterDeathBefore(-1, died, following);
    for (int n = 0; died || n == 0; ++n) {
      EXPECT_EQ(AfterDeathBefore(n, died, following), undisturbed) << "killed before change " << n;
      ASSERT_LT(n, 100);
    }
  }
}

TEST_F(TaskingTest, ADomainThatCouldNotBeWrittenIsWrittenByTheNextRun) {
  device.preferences.full.insert("x");
  schedule("one", Array{Entry("x", "a", "1"), Entry("y", "b", "1")});
  update();
  device.preferences.crash();
  device.preferences.full.clear();
  update();
  EXPECT_TRUE(stored("x", "a") == "1" && device.preferences.isDurable("a", "x"));
  EXPECT_EQ(update(), Texts{});
}

TEST_F(TaskingTest, WrongShapesCountAsAbsent) {
  for (const PropertyValue& scheduled : std::initializer_list<PropertyValue>{
           "x", Dictionary{{"TaskingID", Int64(1)}, {"TaskingPayload", Array()}}}) {
    store("nuvex.Ferryman", "ScheduledTasking", scheduled);
    EXPECT_EQ(update(), Texts{}) << scheduled.description();
  }
  store(kOwn, "LastOSUpdate", Int64(3));
  EXPECT_EQ(update(), Texts{"OS change since last run ((null) -> A1)"});
  schedule("one", Array{"x", Dictionary{{"Key", "a"}}, Dictionary{{"Domain", "x"}},
                        Dictionary{{"Domain", Int64(1)}, {"Key", "a"}}, Entry("x", "k", "v")});
  EXPECT_EQ(update(), Texts{kPosted});
  store(kOwn, "TaskingPayload", PropertyValue("x"));
  schedule("two", Array{Entry("y", "k", "w")});
  EXPECT_EQ(update().size(), 2u);
  EXPECT_EQ(stored("x", "k") + stored("y", "k"), "vw") << "nothing known to be removed";
}

TEST_F(TaskingTest, LogsAreSubmittedForSomeDaysAfterAnOSChange) {
  schedule("one", Array());
  update();
  const std::tuple<PropertyValue, std::int32_t, std::string> cases[] = {
      {Int64(3), 20002, "day 2 of 3"},
      {Int64(3), 20003, ""},
      {Int64(3), 19998, "day 2 of 3"},
      {Int64(-1), 20000, ""},
      {"9", 20000, ""},
      {Int64((1ll << 32) + 1), 20000, "day 0 of 1"}};
  for (const auto& [days, today, said] : cases) {
    device.diagnostics.tasking["AggressiveSubmissionDays"] = days;
    device.diagnostics.submissions = 0;
    device.clock.goToDay(today);
    const std::string text = "Aggressive submission " + said + "; triggering log submission";
    EXPECT_EQ(update(), said.empty() ? Texts{} : Texts{text}) << days.description();
    EXPECT_EQ(device.diagnostics.submissions, said.empty() ? 0 : 1);
  }
  store("nuvex.Ferryman", "ScheduledTasking", std::nullopt);
  EXPECT_EQ(update(), Texts{}) << "nothing scheduled, nothing submitted";
}

}  // namespace
}  // namespace quorlet
