// What every driver registry keeps to, and what the Linux one makes of driver files and sources.
#include <gtest/gtest.h>

#include "fakes/fake_driver_registry.h"
#include "fakes/fake_system_log.h"
#include "fakes/temp_root.h"
#include "platform/linux/registry/driver_files.h"
#include "platform/linux/registry/services.h"
#include "values/byte_reader.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

using IDs = std::vector<std::uint64_t>;
constexpr char kDrivers[] = "/var/db/drivers/";
constexpr std::uint64_t kOneRecord = std::uint64_t{1} << 32;  // a type word

Data Words(std::initializer_list<std::uint64_t> words) {
  const auto bytes = std::as_bytes(std::span(words.begin(), words.size()));
  return {bytes.begin(), bytes.end()};
}
Data Text(std::string_view text) {
  const auto bytes = std::as_bytes(std::span(text));
  return {bytes.begin(), bytes.end()};
}
// A run of driver 1 that claims `count` records.
Data RunOf(std::uint64_t channel, std::size_t records, std::uint64_t count, std::uint64_t value) {
  Data run = Words({1, channel, count << 32, 1, value});
  run.resize(records * 64);
  return run;
}

// A source of entries that is no file.
struct DeviceSource : EntrySource {
  std::vector<RegistryEntry> entries() override { return ++asked, list; }
  void refreshElements() override { ++refreshed; }
  std::span<const std::byte> elements(std::uint64_t, std::uint64_t channel) override {
    return runs[channel];
  }
  void add(std::uint64_t id, const char* className, std::vector<std::string> standsInFor) {
    list.emplace_back();
    list.back().id = id;
    list.back().className = className;
    list.back().properties = {{"DrvReportLegendPublic", true}};
    list.back().standsInFor = std::move(standsInFor);
  }
  std::vector<RegistryEntry> list;
  std::map<std::uint64_t, Data> runs;
  int asked = 0;
  int refreshed = 0;
};

// The Linux registry over a root of driver files and one more source.
struct Device {
  void write(const std::string& name, std::uint64_t id, const char* className, Dictionary more) {
    more["EntryID"] = UInt64(id);
    more["ClassName"] = className;
    root.write(kDrivers + name, std::get<std::string>(WriteXmlPropertyList(more)));
  }
  RegistryHandle open(std::string_view className) const {
    RegistryHandle connection = 0;
    const RegistryHandle service = registry->FindServiceByClass(className);
    EXPECT_EQ(registry->OpenDriverConnection(service, 0, connection), 0u);
    return connection;
  }

  TempRoot root;
  FakeSystemLog log;
  DeviceSource* source = new DeviceSource;
  std::unique_ptr<DriverRegistry> registry = [this] {
    std::vector<std::unique_ptr<EntrySource>> sources;
    sources.push_back(MakeDriverFiles(root.root(), log));
    sources.emplace_back(source);
    return MakeLinuxDriverRegistry(std::move(sources));
  }();
};

IDs Visit(DriverRegistry& registry, const Dictionary& match) {
  RegistryHandle iterator = 0;
  EXPECT_EQ(registry.FindServicesMatching(match, iterator), 0u);
  IDs ids;
  while (const RegistryHandle service = registry.IteratorNext(iterator)) {
    EXPECT_EQ(registry.GetEntryID(service, ids.emplace_back()), 0u);
    registry.ReleaseHandle(service);
  }
  EXPECT_TRUE(registry.IteratorIsValid(iterator));
  registry.ReleaseHandle(iterator);
  return ids;
}

class DriverRegistryContract : public testing::TestWithParam<bool> {
 protected:
  void add(std::uint64_t id, const char* className, const Dictionary& properties) {
    FakeEntry& entry = fake.entries.emplace_back();
    entry.id = id;
    entry.name = "name";
    entry.className = className;
    entry.properties = properties;
    entry.openStatus = id == 3 ? kKernelNotFound : 0;
    entry.closeStatus = 7;
    entry.driver = [](std::uint32_t method, DriverCall& call) -> KernelReturn {
      if (method != 5) return kKernelUnsupported;
      call.scalarOutput[call.scalarsWritten++] = 0x1234;
      return 0;
    };
    const Dictionary methods{{"5", Dictionary{{"Output", Text("\x34\x12")}}}};
    device.write(std::to_string(9 - id) + ".plist", id, className,
                 {{"EntryName", "name"},
                  {"Properties", properties},
                  {"OpenStatus", UInt64(entry.openStatus)},
                  {"CloseStatus", Int64(7)},
                  {"Methods", methods}});
  }

  Device device;
  FakeDriverRegistry fake;
  DriverRegistry& registry = GetParam() ? static_cast<DriverRegistry&>(fake) : *device.registry;
};

TEST_P(DriverRegistryContract, EntriesAreFoundReadAndOpened) {
  EXPECT_EQ(registry.FindServiceByClass("A"), 0u);
  add(1, "A", {{"public", true}, {"list", Array{Int64(1)}}});
  add(2, "B", {{"public", false}});
  add(3, "C", {{"public", true}});
  EXPECT_EQ(Visit(registry, {}), (IDs{1, 2, 3}));
  const Dictionary isPublic{{"public", true}};
  EXPECT_EQ(Visit(registry, {{"PropertyMatch", isPublic}}), (IDs{1, 3}));
  EXPECT_EQ(Visit(registry, {{"PropertyMatch", Dictionary{{"public", Int64(1)}}}}), IDs{});
  EXPECT_EQ(Visit(registry, {{"ClassName", "B"}, {"PropertyMatch", isPublic}}), IDs{});

  const RegistryHandle service = registry.FindServiceByClass("A");
  EXPECT_EQ(registry.HandleRetainCount(service), 1u);
  std::string name;
  EXPECT_EQ(registry.GetEntryName(service, name), 0u);
  EXPECT_EQ(name, "name");
  auto list = registry.CopyEntryProperty(service, "list");
  ASSERT_TRUE(list && list->asArray());
  list->asArray()->push_back(true);  // the copy is the caller's
  EXPECT_EQ(registry.SearchEntryProperty(service, "list"), PropertyValue(Array{Int64(1)}));

  RegistryHandle connection = 0;
  EXPECT_EQ(registry.OpenDriverConnection(registry.FindServiceByClass("C"), 0, connection),
            kKernelNotFound);
  ASSERT_EQ(registry.OpenDriverConnection(service, 0, connection), 0u);
  registry.ReleaseHandle(service);
  EXPECT_EQ(registry.HandleRetainCount(service), 0u);
  std::uint64_t scalars[2] = {9, 9};
  std::size_t written = 0;
  EXPECT_EQ(registry.CallDriverScalar(connection, 5, {}, scalars, written), 0u);
  EXPECT_EQ(written, 1u);
  EXPECT_EQ(scalars[0], 0x1234u);
  EXPECT_EQ(registry.CallDriverScalar(connection, 6, {}, scalars, written), kKernelUnsupported);
  EXPECT_EQ(written, 0u);
  EXPECT_EQ(registry.CloseDriverConnection(connection), 7u);
}

INSTANTIATE_TEST_SUITE_P(Registries, DriverRegistryContract, testing::Bool(),
                         [](const auto& test) { return test.param ? "Fake" : "Linux"; });

TEST(DriverFiles, ExportsAnswerSizeAndFetchAsDescribed) {
  Device device;
  const Dictionary first{{"Selector", Int64(13)}, {"Data", Text("thirteen")}};
  const Dictionary last{{"Selector", Int64(13)},
                        {"ListIndex", Int64(255)},
                        {"Data", Text("last")},
                        {"Size", Int64(0x4443'4241)}};
  const Dictionary failing{{"Selector", Int64(15)},
                           {"SizeStatus", Int64(-536870206)},
                           {"FetchStatus", Int64(3758097084)}};
  const Dictionary methods{{"5", Dictionary{{"Output", Text("abcdef")}}},
                           {"6", Dictionary{{"Status", Int64(3)}}}};
  device.write("a.plist", 1, "Storage",
               {{"ExportMethods", Array{Int64(8), "9"}},
                {"Exports", Array{"odd", first, last, failing}},
                {"Methods", methods}});
  const RegistryHandle connection = device.open("Storage");
  const struct {
    std::uint32_t method;
    std::uint64_t request;  // selector, flags << 32
    std::size_t capacity;
    KernelReturn status;
    const char* output;
  } cases[] = {
      {8, 13 | 1ull << 32, 4, 0, "\x08"},
      {8, 13, 8, 0, "thirteen"},
      {8, 13 | 2ull << 32, 9, 0, "thirteen"},
      {8, 13, 3, 0, "thi"},
      {8, 13 | 0x3FDull << 32, 4, 0, "ABCD"},
      {8, 13 | 0x3FEull << 32, 9, 0, "last"},
      {8, 13 | 4ull << 32, 9, kKernelNotFound, ""},
      {8, 14, 4, kKernelNotFound, ""},
      {8, 15 | 1ull << 32, 4, 0xE00002C2, ""},
      {8, 15, 4, 0xE00002BC, ""},
      {9, 13, 4, kKernelUnsupported, ""},
      {5, 0, 4, 0, "abcd"},
      {6, 0, 4, 3, ""},
  };
  std::size_t written = 99;
  for (const auto& c : cases) {
    Data output(c.capacity, std::byte{0xAA});
    EXPECT_EQ(device.registry->CallDriverStruct(connection, c.method, Words({c.request, 0, 0}),
                                                output, written),
              c.status)
        << &c - cases;
    Data expected = Text(c.output);
    if (c.output[0] == '\x08') expected.resize(4);
    output.resize(written);
    EXPECT_EQ(output, expected) << &c - cases;
  }
  EXPECT_EQ(device.registry->CallDriverStruct(connection, 8, Words({13, 0}), {}, written),
            kKernelBadArgument);
  EXPECT_EQ(device.registry->CloseDriverConnection(connection), 0u);
}

TEST(DriverFiles, ABadFileCostsOnlyItselfAndOneLine) {
  Device device;
  const std::string directory = kDrivers;
  device.write("b.plist", 5, "Good", {{"Properties", "none"}});
  device.write("c.plist", 5, "Good", {});
  device.write("c2.plist", 5, "Good", {});
  device.root.write(directory + "a.plist", "<plist><array/></plist>");
  device.root.write(directory + "d.plist",
                    "<plist><dict><key>EntryID</key><real>6</real></dict></plist>");
  device.root.write(directory + "e.plist", "<plist><dict>");
  device.root.write(directory + "f.plist/not-a-file", "");
  device.root.write(directory + ".g.plist", "hidden");
  for (int i = 0; i < 2; ++i) EXPECT_NE(device.registry->FindServiceByClass("Good"), 0u);
  EXPECT_EQ(device.log.errors().size(), 5u) << "a, c, d, e and f, once each";
  EXPECT_EQ(device.log.errors()[1],
            "Skipped the driver file " + device.root.path(directory) +
                "c.plist: its EntryID is that of b.plist, as with 2 in all");
  std::filesystem::remove(device.root.path(directory) + "b.plist");
  EXPECT_NE(device.registry->FindServiceByClass("Good"), 0u) << "c.plist has taken its place";

  // What is there stays while the directory cannot be read.
  std::filesystem::rename(device.root.path(kDrivers), device.root.path("/elsewhere"));
  device.root.write("/var/db/drivers", "no directory");
  EXPECT_NE(device.registry->FindServiceByClass("Good"), 0u);
  EXPECT_EQ(device.log.errors().back(),
            "Cannot read " + device.root.path("/var/db/drivers: ") + ErrnoText(ENOTDIR));
}

TEST(DriverFiles, SearchGoesUpAndEndsInARing) {
  Device device;
  device.write("1.plist", 1, "1",
               {{"ParentID", Int64(2)}, {"Properties", Dictionary{{"own", true}}}});
  device.write("2.plist", 2, "2",
               {{"ParentID", Int64(1)}, {"Properties", Dictionary{{"own", false}, {"top", true}}}});
  const RegistryHandle service = device.registry->FindServiceByClass("1");
  EXPECT_EQ(device.registry->SearchEntryProperty(service, "top"), PropertyValue(true));
  EXPECT_EQ(device.registry->SearchEntryProperty(service, "own"), PropertyValue(true));
  EXPECT_EQ(device.registry->CopyEntryProperty(service, "top"), std::nullopt);
  EXPECT_EQ(device.registry->SearchEntryProperty(service, "nowhere"), std::nullopt);

  RegistryHandle iterator = 0;
  ASSERT_EQ(device.registry->FindServicesMatching({{"ClassName", "2"}}, iterator), 0u);
  device.write("3.plist", 3, "2", {});
  EXPECT_NE(device.registry->IteratorNext(iterator), 0u);
  EXPECT_EQ(device.registry->IteratorNext(iterator), 0u) << "it was not there at the start";
  EXPECT_FALSE(device.registry->IteratorIsValid(iterator));
}

TEST(DriverRegistry, OtherSourcesAreAskedLateAndSeldomAndStandBackForFiles) {
  Device device;
  device.source->add(9, "Second", {"First", "Second"});
  device.source->add(8, "Publisher", {});
  EXPECT_EQ(device.source->asked, 0) << "nothing is read before the first question";
  EXPECT_NE(device.registry->FindServiceByClass("Second"), 0u);
  const RegistryHandle hub = device.registry->FindServiceByClass("DrvReportHub");
  std::uint64_t hubID = 0;
  EXPECT_EQ(device.registry->GetEntryID(hub, hubID), 0u);
  EXPECT_EQ(Visit(*device.registry, {}), (IDs{8, 9, hubID}));
  EXPECT_EQ(device.source->asked, 1);
  device.write("a.plist", 8, "First", {});
  EXPECT_EQ(Visit(*device.registry, {{"ClassName", "First"}}), IDs{8});
  EXPECT_EQ(Visit(*device.registry, {}), (IDs{8, hubID})) << "the file has 8 and serves First";
}

// The values of the runs that lie in the hub's memory; a run that reaches beyond the end shows as
// 0, and ends it.
IDs Values(std::span<const std::byte> memory) {
  IDs values;
  while (!memory.empty()) {
    ByteReader reader(memory);
    const bool isFiller = reader.little<std::uint64_t>() != 1;
    reader.skip(12);
    const std::size_t bytes = 64UL * reader.little<std::uint32_t>();
    reader.skip(8);
    if (!isFiller) values.push_back(reader.little<std::uint64_t>());
    if (bytes == 0 || bytes > memory.size()) return values.push_back(0), values;
    memory = memory.subspan(bytes);
  }
  return values;
}

class ReportHub : public testing::Test {
 protected:
  void report(const std::map<std::uint64_t, Data>& runs) {
    Array channels{"odd", Dictionary{{"ChannelID", "odd"}}};
    for (const auto& [channel, run] : runs) {
      channels.push_back(Dictionary{{"ChannelID", UInt64(channel)}, {"Elements", run}});
    }
    device.write("driver.plist", 1, "Driver", {{"Channels", channels}});
  }
  void describeHub(const Dictionary& methods) {
    device.write("hub.plist", 2, "DrvReportHub", {{"Methods", methods}});
  }
  KernelReturn configure(const Data& list) {
    connection = device.open("DrvReportHub");
    DriverCall call;
    call.structInput = list;
    call.scalarOutput = std::span(&token, 1);
    return device.registry->CallDriverMethod(connection, 2, call);
  }
  KernelReturn map() {
    const auto memoryType = static_cast<std::uint32_t>(token);
    return device.registry->MapDriverMemory(connection, memoryType, memory);
  }
  KernelReturn update() {
    std::size_t written = 0;
    return device.registry->CallDriverScalar(connection, 3, std::span(&token, 1), {}, written);
  }

  const Data valid = Words({1, 1, 10, kOneRecord});
  Device device;
  RegistryHandle connection = 0;
  std::uint64_t token = 0;
  std::span<const std::byte> memory;
};

TEST_F(ReportHub, EveryUpdateLaysOutWhatTheFilesSayNow) {
  describeHub({});
  report({{10, RunOf(10, 1, 1, 100)}, {20, RunOf(20, 2, 2, 200)}, {30, Data(63)}});
  device.source->runs[40] = RunOf(40, 1, 1, 400);
  ASSERT_EQ(configure(Words({5, 1, 20, 2 * kOneRecord, 1, 99, kOneRecord, 1, 10, kOneRecord, 1, 30,
                             kOneRecord, 1, 40, kOneRecord})),
            0u);
  ASSERT_EQ(map(), 0u);
  EXPECT_EQ(memory.size(), 6u * 64) << "what the type words announce";
  ASSERT_EQ(update(), 0u);
  EXPECT_EQ(Values(memory), (IDs{200, 100, 400}));
  EXPECT_EQ(device.source->refreshed, 1);

  report({{10, RunOf(10, 1, 1, 101)}, {99, RunOf(99, 1, 1, 990)}, {20, RunOf(20, 5, 5, 201)}});
  ASSERT_EQ(update(), 0u);
  EXPECT_EQ(Values(memory), (IDs{201, 990})) << "no room is left for the rest";
  report({});
  device.source->runs.clear();
  ASSERT_EQ(update(), 0u);
  EXPECT_EQ(Values(memory), IDs{}) << "nothing of before survives";
  report({{10, RunOf(10, 2, 3, 102)}, {20, RunOf(20, 2, 1, 202)}});
  device.source->runs[40] = RunOf(40, 1, 0, 402);
  ASSERT_EQ(update(), 0u);
  EXPECT_EQ(Values(memory), IDs{202}) << "neither what claims too much nor what claims nothing";
  EXPECT_EQ(device.registry->CloseDriverConnection(connection), 0u);
}

TEST_F(ReportHub, RefusesWhatIsNoInterestListOrToken) {
  device.source->add(1, "Publisher", {});
  for (std::size_t size = 0; size < valid.size(); ++size) {
    EXPECT_EQ(configure(Data(valid.data(), valid.data() + size)), kKernelBadArgument) << size;
  }
  EXPECT_EQ(configure(Words({89'478'478, 1, 10, 0})), kKernelBadArgument);
  EXPECT_EQ(map(), kKernelNotFound);
  ASSERT_EQ(configure(valid), 0u);
  ++token;
  EXPECT_EQ(update(), kKernelBadArgument);
  token = static_cast<std::uint32_t>(token - 1);
  EXPECT_EQ(update(), kKernelBadArgument) << "half a token";
}

TEST_F(ReportHub, AFileMayFailMethodsAndNameTheToken) {
  report({{10, RunOf(10, 1, 1, 100)}});
  describeHub({{"2", Dictionary{{"Status", Int64(0xE00002C7)}}}});
  EXPECT_EQ(configure(valid), kKernelUnsupported);
  describeHub({{"2", Dictionary{{"Output", Words({0x5'0000'0009})}}}, {"3", Dictionary()}});
  ASSERT_EQ(configure(valid), 0u);
  EXPECT_EQ(token, 0x5'0000'0009u);
  ASSERT_EQ(map(), 0u);
  report({{10, RunOf(10, 1, 1, 101)}});
  EXPECT_EQ(update(), 0u);
  EXPECT_EQ(Values(memory), IDs{101});
}

}  // namespace
}  // namespace quorlet
