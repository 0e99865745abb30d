// quorlet as the named service, and tasking: real processes, sockets and files.
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <list>
#include <tuple>

#include "platform/linux/service/unix_socket.h"
#include "program/program_device.h"

namespace quorlet {
namespace {

using Texts = std::vector<std::string>;
constexpr char kService[] = "nuvex.aggregated.quorlet";
constexpr char kOwn[] = "nuvex.aggregated.quorlet";

// quorlet without arguments: it serves until ten quiet seconds have passed.
struct ServingDevice : ProgramDevice {
  ServingDevice() : service(start()) {}

  // Each message comes on a connection of its own, which stays open.
  void send(const PropertyValue& message) {
    const auto document = WriteXmlPropertyList(message);
    const std::string& bytes = std::get<std::string>(document);
    std::string frame;
    for (int i = 0; i < 4; ++i) frame += static_cast<char>(bytes.size() >> (8 * i));
    frame += bytes;
    const UnixSocketAddress address(device.path("/run/quorlet"), kService);
    peers.push_back(MakeUnixSocket());
    for (int i = 0; address.connect(peers.back().get()) != 0; ++i) {
      ASSERT_LT(i, 2000) << "nobody listens";
      usleep(5000);
    }
    EXPECT_EQ(::send(peers.back().get(), frame.data(), frame.size(), MSG_NOSIGNAL),
              static_cast<ssize_t>(frame.size()));
  }
  void waitForEnd() {
    int status = 1;
    waitpid(service, &status, 0);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(lines("error"), Texts{});
  }

  pid_t service;
  std::list<Descriptor> peers;
};

PropertyValue Operation(std::int64_t operation) {
  return Dictionary{{"operation", Int64(operation)}};
}
PropertyValue RunDay(std::int64_t day) {
  return Dictionary{{"operation", Int64(1)}, {"value", Int64(day)}};
}
PropertyValue AppInfo(Array elements) {
  return Dictionary{{"operation", Int64(2)}, {"app_data", std::move(elements)}};
}

// What a listener's life does: the passes with the number of records in the log, what it said
// about app info, and how often it announced a log.
using Outcome = std::tuple<Texts, Texts, std::string>;

Outcome OutcomeOf(const ServingDevice& served) {
  Texts passes, said;
  for (const std::string& line : served.lines("default")) {
    if (line.starts_with("daily tasks for day ")) passes.push_back(line.substr(20));
    if (line.starts_with("quorlet got") || line.starts_with("never received")) {
      said.push_back(line);
    }
  }
  const Texts logs = served.logs();
  EXPECT_EQ(logs.size(), passes.size());
  for (std::size_t i = 0; i < std::min(logs.size(), passes.size()); ++i) {
    const Dictionary log = served.document(logs[i]);
    if (const Array* apps = ArrayEntry(log, "TLActivatedAppInfo")) {
      passes[i] += "+" + std::to_string(apps->size());
    }
  }
  const std::string posted = "/run/quorlet/notify/nuvex.aggregated.quorlet.logging";
  return {passes, said, served.device.read(posted)};
}

TEST(ListenerProgramTest, EveryTransitionThroughTheSocket) {
  const std::string requested = "quorlet got requestedAAI:";
  const std::string unsolicited = "quorlet got (unsolicited -- so ignoring) AAI:";
  const std::string never = "never received requested AAI, so moving along without it";
  const std::string yesterday = ProgramDevice::yesterday();
  const PropertyValue status = Operation(0);
  const PropertyValue run = RunDay(std::stoll(yesterday));
  const PropertyValue apps = AppInfo(
      {Dictionary{{"uuid", Data(16)}, {"bundle_id", "b"}, {"version", "1"}, {"tesk_id", Int64(7)}},
       "x", Dictionary{{"uuid", Data(15)}, {"bundle_id", "b"}, {"version", "1"}}});
  struct Case {
    const char* name;
    std::vector<PropertyValue> messages;
    Outcome outcome;
    ServingDevice served = {};
  };
  // All of them at once: each waits out its ten seconds.
  Case cases[] = {
      {"nobody", {}, {{}, {}, ""}},
      {"status only", {status}, {{yesterday}, {never}, "1\n"}},
      {"status by default", {Dictionary()}, {{yesterday}, {never}, "1\n"}},
      {"status, apps", {status, apps}, {{yesterday + "+1"}, {requested}, "1\n"}},
      {"apps first", {apps, status, apps}, {{yesterday + "+1"}, {unsolicited, requested}, "1\n"}},
      {"apps twice", {status, apps, apps}, {{yesterday + "+1"}, {requested, unsolicited}, "1\n"}},
      {"no apps", {status, AppInfo({})}, {{yesterday + "+0"}, {requested}, "1\n"}},
      {"no array", {status, Operation(2)}, {{yesterday + "+0"}, {requested}, "1\n"}},
      {"low bits", {status, Operation((5ll << 32) + 2)}, {{yesterday + "+0"}, {requested}, "1\n"}},
      {"run day", {run}, {{yesterday}, {}, ""}},
      {"run once", {run, RunDay(3), status, apps}, {{yesterday}, {unsolicited}, ""}},
      {"status once", {status, status, run, apps}, {{yesterday + "+1"}, {requested}, "1\n"}},
      {"unknown takes the slot", {Operation(3), status}, {{}, {}, ""}},
      {"no dictionaries", {Array(), "x", status, apps}, {{yesterday + "+1"}, {requested}, "1\n"}},
      {"odd types",
       {Dictionary{{"operation", "0"}}, AppInfo({"x"})},
       {{yesterday + "+0"}, {requested}, "1\n"}},
  };
  for (Case& c : cases) {
    for (const PropertyValue& message : c.messages) c.served.send(message);
  }
  for (Case& c : cases) {
    SCOPED_TRACE(c.name);
    c.served.waitForEnd();
    EXPECT_EQ(OutcomeOf(c.served), c.outcome);
  }
}

TEST(ListenerProgramTest, AppInfoThatIsSentGoesIntoTheLog) {
  ServingDevice served;
  served.ctl({"send", "logging-status", "--wait", "10"});
  served.device.write("/apps.json",
                      R"([{"uuid": "1b4e28ba-2fa1-11d2-883f-b9a761bde3fb", "bundle_id": "b",
                           "version": "1.2", "tesk_id": 7, "arch": -1}])");
  served.ctl({"send", "app-info", served.device.path("/apps.json")});
  served.waitForEnd();
  ASSERT_EQ(served.logs().size(), 1u);
  Dictionary record{{"bundle", "b"}, {"version", "1.2"}};
  record["uuid"] = "1B4E28BA-2FA1-11D2-883F-B9A761BDE3FB";
  record["teskID"] = Int64(7);
  record["arch"] = Int64(-1);
  EXPECT_EQ(*served.document(served.logs()[0]).find("TLActivatedAppInfo"),
            PropertyValue(Array{record}));
}

// First, same, changed, another OS build, removed: through the files of the preferences.
TEST(TaskingProgramTest, TheRoundTripOfATasking) {
  ProgramDevice device;
  const auto schedule = [&](const std::string& json) {
    device.ctl({"prefs", "set", "nuvex.Ferryman", "ScheduledTasking", json});
  };
  const auto runUnder = [&](const std::string& build) {
    device.device.write("/etc/os-release", "NAME=TestOS\nBUILD_ID=" + build + "\n");
    device.quorlet({"-f"});
    return device.device.read("/run/quorlet/notify/nuvex.da.tasking_changed");
  };
  schedule(R"({"TaskingID": "one", "TaskingDigest": "d1", "TaskingPayload": [
      {"Domain": "x", "Key": "a", "Value": 1}, {"Domain": "../y", "Key": "b", "Value": 2},
      {"Domain": "z", "Key": "c", "Value": [true, "t"]}]})");
  EXPECT_EQ(runUnder("A1"), "1\n");
  EXPECT_EQ(device.lines("error").size(), 1u) << "the domain that leaves the directory";
  EXPECT_EQ(device.preferences("x"), (Dictionary{{"a", Int64(1)}}));
  EXPECT_EQ(device.preferences("z"), (Dictionary{{"c", Array{true, "t"}}}));
  Dictionary own = device.preferences(kOwn);
  EXPECT_EQ(*own.find("TaskingID"), "one");
  EXPECT_EQ(*own.find("TaskingDigest"), "d1");
  EXPECT_EQ(own.find("TaskingPayload")->asArray()->size(), 3u);

  const std::string before = device.device.read(std::string(kPreferences) + kOwn + ".plist");
  EXPECT_EQ(runUnder("A1"), "1\n") << "the same again changes nothing";
  EXPECT_EQ(device.device.read(std::string(kPreferences) + kOwn + ".plist"), before);

  schedule(
      R"({"TaskingID": "two", "TaskingPayload": [{"Domain": "x", "Key": "k", "Value": 2.5}]})");
  EXPECT_EQ(runUnder("A1"), "2\n");
  EXPECT_EQ(device.preferences("x"), (Dictionary{{"k", Double(2.5)}}));
  EXPECT_EQ(device.preferences("z"), Dictionary());

  EXPECT_EQ(runUnder("B2"), "3\n") << "another build applies it anew";
  EXPECT_EQ(*device.preferences(kOwn).find("TaskingOS"), "B2");
  EXPECT_FALSE(device.preferences(kOwn).contains("TaskingDigest"));

  schedule(R"({"TaskingID": "three"})");
  EXPECT_EQ(runUnder("B2"), "4\n");
  EXPECT_EQ(device.preferences("x"), Dictionary());
  own = device.preferences(kOwn);
  for (const char* key : {"TaskingID", "TaskingDigest", "TaskingPayload", "TaskingInProgress"}) {
    EXPECT_FALSE(own.contains(key)) << key;
  }
  EXPECT_EQ(*own.find("TaskingOS"), "B2");
}

}  // namespace
}  // namespace quorlet
