// What every implementation of the preferences does, and what the Linux files look like.
#include <gtest/gtest.h>
#include <sys/resource.h>

#include <array>
#include <csignal>
#include <filesystem>
#include <thread>

#include "fakes/fake_platform.h"
#include "fakes/temp_root.h"
#include "platform/linux/state/services.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

using Value = std::optional<PropertyValue>;

// Processes that share one place for their preferences.
struct Machine {
  std::unique_ptr<Preferences> startProcess() {
    if (isLinux) return MakeLinuxPreferences(root.root(), Access::kReadWrite, log);
    return std::make_unique<FakePreferences>(disk, &log);
  }
  bool isLinux = true;
  FakeSystemLog log;
  TempRoot root;
  std::shared_ptr<FakePreferences::Disk> disk = std::make_shared<FakePreferences::Disk>();
};

class PreferencesContract : public testing::TestWithParam<bool> {
 protected:
  Value read(std::string_view key, std::string_view domain = "d") {
    return machine.startProcess()->DGWPreferencesGetValue(key, domain);
  }
  Machine machine{.isLinux = GetParam(), .log = {}, .root = {}};
  std::unique_ptr<Preferences> first = machine.startProcess();
  std::unique_ptr<Preferences> second = machine.startProcess();
};
INSTANTIATE_TEST_SUITE_P(FakeAndLinux, PreferencesContract, testing::Bool());

TEST_P(PreferencesContract, AChangeIsSeenAtOnceAndDurableWhenSynchronized) {
  const std::string odd("a\x01\xff\0b", 5);
  const PropertyValue value =
      Array{true,   Int64(-5),   UInt64(~0ULL),      Double(0.1),
            "text", Date{86400}, Data{std::byte{0}}, Dictionary{{"k", Array{}}}};
  for (const std::string& key : {std::string("key"), std::string("ä b/.."), odd}) {
    first->DGWPreferencesSetValue(key, value, "d");
    EXPECT_EQ(first->DGWPreferencesGetValue(key, "d"), Value(value));
    EXPECT_EQ(second->DGWPreferencesGetValue(key, "d"), std::nullopt) << "not synchronized yet";
    first->DGWPreferencesSynchronize("d");
    EXPECT_EQ(second->DGWPreferencesGetValue(key, "d"), Value(value)) << key;
    first->DGWPreferencesSetValue(key, std::nullopt, "d");
    first->DGWPreferencesSynchronize("d");
    EXPECT_EQ(read(key), std::nullopt);
  }
  EXPECT_EQ(machine.log.lines.size(), 0u);
}

TEST_P(PreferencesContract, ProcessesKeepEachOthersKeys) {
  second->DGWPreferencesSetValue("yours", Int64(2), "d");
  second->DGWPreferencesSynchronize("d");
  first->DGWPreferencesSetValue("mine", Int64(1), "d");
  first->DGWPreferencesSetValue("yours", std::nullopt, "d");
  second->DGWPreferencesSetValue("late", Int64(3), "d");
  first.reset();  // ends normally
  EXPECT_EQ(read("mine"), Value(Int64(1)));
  EXPECT_EQ(read("yours"), std::nullopt);
  second.reset();
  EXPECT_EQ(read("late"), Value(Int64(3)));
  EXPECT_EQ(read("mine"), Value(Int64(1)));
}

TEST_P(PreferencesContract, BadDomainNamesAreRefused) {
  const std::string names[] = {
      "", ".x", "..", "a/b", "../d", "a\nb", std::string("a\0b", 3), std::string(201, 'x')};
  for (const std::string& name : names) {
    machine.log.lines.clear();
    first->DGWPreferencesSetValue("k", true, name);
    EXPECT_EQ(first->DGWPreferencesGetValue("k", name), std::nullopt) << name;
    EXPECT_EQ(machine.log.errors().size(), 1u) << "once for each name: " << name;
  }
}

class LinuxPreferencesTest : public testing::Test {
 protected:
  static constexpr char kDirectory[] = "/var/mobile/Library/Preferences";
  static constexpr char kFile[] = "/var/mobile/Library/Preferences/d.plist";
  using Names = std::vector<std::string>;

  Machine machine;
  const TempRoot& root = machine.root;
  std::unique_ptr<Preferences> preferences = machine.startProcess();
};

TEST_F(LinuxPreferencesTest, ADamagedFileReadsAsEmptyAndIsKeptAside) {
  std::string aside = std::string(kFile) + ".damaged";
  int number = 1;
  for (const char* damaged :
       {"", "bplist00", "<plist><dict><key>k</key></dict></plist>", "junk",
        "<plist version=\"1.0\"><array/></plist>", "6", "7", "8", "9", "10"}) {
    machine.log.lines.clear();
    root.write(kFile, damaged);
    EXPECT_EQ(preferences->DGWPreferencesGetValue("k", "d"), std::nullopt) << damaged;
    preferences->DGWPreferencesSetValue("x", Int64(1), "d");
    preferences->DGWPreferencesSynchronize("d");
    EXPECT_EQ(root.read(aside), damaged);
    aside = std::string(kFile) + ".damaged" + (++number > 9 ? "" : "." + std::to_string(number));
    EXPECT_EQ(preferences->DGWPreferencesGetValue("x", "d"), Value(Int64(1)));
    EXPECT_EQ(machine.log.errors().size(), 1u) << damaged;
  }
  EXPECT_EQ(root.list(kDirectory).size(), 11u) << "the oldest went";
}

TEST_F(LinuxPreferencesTest, WhatCannotBeReadIsNeitherEmptyNorReplaced) {
  preferences->DGWPreferencesSetValue("k", Int64(5), "d");
  EXPECT_TRUE(preferences->DGWPreferencesSynchronize("d"));
  const std::string bytes = root.read(kFile);
  preferences = machine.startProcess();
  // A sanitizer that meets a type for the first time needs descriptors itself.
  const std::string other = std::string(kDirectory) + "/other.plist";
  std::filesystem::create_directory(root.path(other));
  EXPECT_FALSE(preferences->isReadable("other"));
  std::filesystem::remove(root.path(other));
  rlimit before{};
  getrlimit(RLIMIT_NOFILE, &before);
  const rlimit none{0, before.rlim_max};
  setrlimit(RLIMIT_NOFILE, &none);
  const bool readable = preferences->isReadable("d");
  preferences->DGWPreferencesSetValue("x", Int64(1), "d");
  const bool written = preferences->DGWPreferencesSynchronize("d");
  setrlimit(RLIMIT_NOFILE, &before);
  EXPECT_FALSE(readable || written);
  EXPECT_EQ(root.read(kFile), bytes);
  EXPECT_EQ(root.list(kDirectory), (Names{".d.lock", "d.plist"}));
  EXPECT_GE(machine.log.errors().size(), 1u);
  EXPECT_TRUE(preferences->DGWPreferencesSynchronize("d")) << "the change was not lost";
  EXPECT_EQ(preferences->DGWPreferencesGetIntegerValue("k", "d"), 5);
}

TEST_F(LinuxPreferencesTest, AdditionsOfTwoProcessesAddUp) {
  const auto other = machine.startProcess();
  const auto count = [](Preferences& of) { return of.DGWPreferencesGetIntegerValue("n", "d"); };
  preferences->addToInteger("n", -3, "d");
  EXPECT_TRUE(preferences->DGWPreferencesSynchronize("d"));
  EXPECT_FALSE(root.exists(kFile)) << "nothing to take off: nothing is written";
  for (Preferences* each : {preferences.get(), other.get()}) each->addToInteger("n", 2, "d");
  EXPECT_EQ(count(*preferences), 2);
  EXPECT_TRUE(preferences->DGWPreferencesSynchronize("d") && other->DGWPreferencesSynchronize("d"));
  EXPECT_EQ(count(*preferences), 4);
  preferences->addToInteger("n", -2, "d");
  other->addToInteger("n", 1, "d");
  EXPECT_TRUE(other->DGWPreferencesSynchronize("d") && preferences->DGWPreferencesSynchronize("d"));
  EXPECT_EQ(count(*other), 3);
  preferences->addToInteger("n", INT64_MIN, "d");
  EXPECT_EQ(count(*preferences), 0);
}

TEST_F(LinuxPreferencesTest, AFailedWriteKeepsTheFileAndTheChange) {
  preferences->DGWPreferencesSetValue("k", Int64(1), "d");
  preferences->DGWPreferencesSynchronize("d");
  const std::string before = root.read(kFile);
  preferences->DGWPreferencesSetValue("k", std::string(5000, 'x'), "d");
  std::signal(SIGXFSZ, SIG_IGN);
  rlimit limit = {};
  getrlimit(RLIMIT_FSIZE, &limit);
  const rlimit small{4096, limit.rlim_max};  // like a disk that is full
  setrlimit(RLIMIT_FSIZE, &small);
  preferences->DGWPreferencesSynchronize("d");
  setrlimit(RLIMIT_FSIZE, &limit);
  EXPECT_EQ(root.read(kFile), before);
  EXPECT_EQ(root.list(kDirectory), (Names{".d.lock", "d.plist"}));
  EXPECT_EQ(machine.log.errors().size(), 1u);
  preferences.reset();
  EXPECT_EQ(machine.startProcess()->DGWPreferencesGetValue("k", "d"),
            Value(std::string(5000, 'x')));
}

TEST_F(LinuxPreferencesTest, AValueThatNoFileHoldsSpoilsNoOther) {
  PropertyValue deep = Int64(1);
  for (std::size_t i = 0; i <= kMaxPropertyListDepth; ++i) deep = Array{deep};
  preferences->DGWPreferencesSetValue("deep", deep, "d");
  preferences->DGWPreferencesSetValue("flat", Int64(2), "d");
  preferences->DGWPreferencesSynchronize("d");
  EXPECT_EQ(machine.log.errors().size(), 1u);
  EXPECT_EQ(preferences->DGWPreferencesGetValue("deep", "d"), Value(deep));
  EXPECT_EQ(machine.startProcess()->DGWPreferencesGetValue("flat", "d"), Value(Int64(2)));
}

TEST_F(LinuxPreferencesTest, ManyWritersLoseNothing) {
  std::array<std::thread, 4> writers;
  for (std::size_t writer = 0; writer < writers.size(); ++writer) {
    writers[writer] = std::thread([&, writer] {
      FakeSystemLog log;
      const auto own = MakeLinuxPreferences(root.root(), Access::kReadWrite, log);
      for (int i = 0; i < 10; ++i) {
        const std::string key = std::to_string(writer) + "/" + std::to_string(i);
        own->DGWPreferencesSetValue(key, Int64(i), "d");
        preferences->DGWPreferencesSetValue("shared " + key, Int64(i), "d");
        own->DGWPreferencesSynchronize("d");
        preferences->DGWPreferencesSynchronize("d");
      }
    });
  }
  for (std::thread& writer : writers) writer.join();
  const auto document = ReadPropertyList(std::string_view(root.read(kFile)));
  EXPECT_EQ(std::get<PropertyValue>(document).asDictionary()->size(), 80u);
}

}  // namespace
}  // namespace quorlet
