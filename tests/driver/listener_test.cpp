#include "driver/listener.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <tuple>

#include "fakes/fake_platform.h"
#include "fakes/whitelist.h"
#include "report/config.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

Data Uuid() {
  Data uuid;
  for (int i = 0; i < 16; ++i) uuid.push_back(static_cast<std::byte>(0xA0 + i));
  return uuid;
}

PropertyValue Operation(std::int64_t operation) {
  return Dictionary{{"operation", Int64(operation)}};
}
PropertyValue RunDay(std::int64_t day) {
  return Dictionary{{"operation", Int64(1)}, {"value", Int64(day)}};
}
PropertyValue AppInfo(Array elements) {
  return Dictionary{{"operation", Int64(2)}, {"app_data", std::move(elements)}};
}
Dictionary Element() {
  Dictionary element{{"uuid", Uuid()}, {"bundle_id", "b"}, {"version", "1"}};
  element["tesk_id"] = Int64(7);
  element["arch"] = Int64(-1);
  return element;
}

using Texts = std::vector<std::string>;
// What a listener's life does: the passes ("day", "day+2 records"), what it said about app info,
// how often it announced a log.
using Outcome = std::tuple<Texts, Texts, std::ptrdiff_t>;

Outcome Serve(std::vector<PropertyValue> messages) {
  FakePlatform device;
  device.environment.files[std::string(kWhitelistPath)] =
      Plist("<dict>" + Group("G", "ScalarKeys", {{"s", "", ""}}) + "</dict>");
  for (std::int32_t day = 19990; day < 20010; ++day) device.counterStore.hasScalar("s", day, 1);
  device.namedService.arriving = std::move(messages);
  RunDriver driver(device.services);
  Listener listener(device.services, driver);
  listener.serve();
  EXPECT_EQ(device.namedService.listeningAs, "nuvex.aggregated.quorlet");

  Texts passes, said;
  for (const std::string& line : device.log.at(LogLevel::kDefault)) {
    if (line.starts_with("daily tasks for day ")) passes.push_back(line.substr(20));
    if (line.starts_with("quorlet got") || line.starts_with("never received")) {
      said.push_back(line.substr(0, line.find('\n')));
    }
  }
  for (std::size_t i = 0; i < device.diagnostics.logs.size(); ++i) {
    const auto parsed = ReadPropertyList(device.diagnostics.logs[i].body);
    const auto& log = *std::get<PropertyValue>(parsed).asDictionary();
    if (const Array* apps = ArrayEntry(log, "TLActivatedAppInfo")) {
      passes[i] += "+" + std::to_string(apps->size());
    }
  }
  return {passes, said,
          std::ranges::count(device.notifications.posted, "nuvex.aggregated.quorlet.logging")};
}

TEST(ListenerTest, EveryTransition) {
  const std::string requested = "quorlet got requestedAAI:";
  const std::string unsolicited = "quorlet got (unsolicited -- so ignoring) AAI:";
  const std::string never = "never received requested AAI, so moving along without it";
  const PropertyValue status = Operation(0);
  const PropertyValue apps = AppInfo({Element()});
  const std::tuple<const char*, std::vector<PropertyValue>, Outcome> cases[] = {
      {"nobody", {}, {{}, {}, 0}},
      {"status only", {Operation(0)}, {{"19999"}, {never}, 1}},
      {"status by default", {Dictionary()}, {{"19999"}, {never}, 1}},
      {"status, apps", {Operation(0), apps}, {{"19999+1"}, {requested}, 1}},
      {"apps first", {apps, Operation(0), apps}, {{"19999+1"}, {unsolicited, requested}, 1}},
      {"apps twice", {Operation(0), apps, apps}, {{"19999+1"}, {requested, unsolicited}, 1}},
      {"no apps", {Operation(0), AppInfo({})}, {{"19999+0"}, {requested}, 1}},
      {"no array", {Operation(0), Operation(2)}, {{"19999+0"}, {requested}, 1}},
      {"low bits", {Operation(0), Operation((5ll << 32) + 2)}, {{"19999+0"}, {requested}, 1}},
      {"run day", {RunDay(19995)}, {{"19995"}, {}, 0}},
      {"run once", {RunDay(19995), RunDay(3), status, apps}, {{"19995"}, {unsolicited}, 0}},
      {"status once", {status, status, RunDay(3), apps}, {{"19999+1"}, {requested}, 1}},
      {"unknown takes the slot", {Operation(3), Operation(0)}, {{}, {}, 0}},
      {"no dictionaries", {Array(), "x", Int64(0), status, apps}, {{"19999+1"}, {requested}, 1}},
      {"odd types", {Dictionary{{"operation", "0"}}, AppInfo({})}, {{"19999+0"}, {requested}, 1}},
  };
  for (const auto& [name, messages, outcome] : cases) EXPECT_EQ(Serve(messages), outcome) << name;
}

TEST(ListenerTest, RecordsHaveFiveFields) {
  Array records;
  EXPECT_TRUE(appInfoRecordFromMessage(Element(), records));
  Dictionary sparse = Element();
  sparse.remove("arch");
  sparse["tesk_id"] = "7";
  EXPECT_TRUE(appInfoRecordFromMessage(sparse, records));
  const std::string uuid = "A0A1A2A3-A4A5-A6A7-A8A9-AAABACADAEAF";
  const auto record = [&](std::int64_t teskID, std::int64_t arch) {
    Dictionary fields{{"bundle", "b"}, {"version", "1"}, {"uuid", uuid}};
    fields["teskID"] = Int64(teskID);
    fields["arch"] = Int64(arch);
    return fields;
  };
  EXPECT_EQ(records, (Array{record(7, -1), record(0, 0)}));

  for (const char* key : {"uuid", "bundle_id", "version"}) {
    Dictionary broken = Element();
    broken.remove(key);
    EXPECT_TRUE(appInfoRecordFromMessage(broken, records));
    broken[key] = Data(15);
    EXPECT_TRUE(appInfoRecordFromMessage(broken, records));
  }
  EXPECT_TRUE(appInfoRecordFromMessage("x", records));
  EXPECT_EQ(records.size(), 2u) << "incomplete elements add nothing";
}

TEST(ListenerTest, WithoutAListenerOneQuietSliceIsWaitedOut) {
  FakePlatform device;
  device.namedService.canListen = false;
  RunDriver driver(device.services);
  Listener(device.services, driver).serve();
  EXPECT_EQ(device.namedService.sliceSeconds, std::vector<double>{10.0});
}

}  // namespace
}  // namespace quorlet
