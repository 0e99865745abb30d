// The Linux services against the files of a temporary root.
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <thread>

#include "fakes/fake_platform.h"
#include "fakes/temp_root.h"
#include "platform/linux/descriptor.h"
#include "platform/linux/linux_platform.h"
#include "platform/linux/services.h"

namespace quorlet {
namespace {

using Names = std::vector<std::string>;

class LinuxServices : public testing::Test {
 protected:
  Names errors() { return log.errors(); }
  // A file of `size` bytes that takes no room, last changed at `modified`.
  void writeSparse(std::string_view path, off_t size, std::time_t modified) {
    root.write(path, "");
    ASSERT_EQ(truncate(root.path(path).c_str(), size), 0);
    const timespec times[] = {{modified, 0}, {modified, 0}};
    ASSERT_EQ(utimensat(AT_FDCWD, root.path(path).c_str(), times, 0), 0);
  }

  TempRoot root;
  FakeSystemLog log;
  FakeClock clock;  // 2024-10-04T12:00:00Z
};

TEST_F(LinuxServices, ReadingStopsAtTheLimitAndAtWhatIsNoFile) {
  for (const std::size_t size : {0u, 1u, 65535u, 65536u, 65537u, 131072u}) {
    root.write("/file", std::string(size, 'x'));
    EXPECT_EQ(ReadWholeFile(root.path("/file"), size),
              (std::variant<std::string, int>(std::string(size, 'x'))));
    if (size == 0) continue;
    EXPECT_EQ(std::get<int>(ReadWholeFile(root.path("/file"), size - 1)), EFBIG) << size;
  }
  ASSERT_EQ(mkfifo(root.path("/fifo").c_str(), 0600), 0);
  EXPECT_EQ(std::get<int>(ReadWholeFile(root.path("/fifo"), 9)), EINVAL);
  EXPECT_EQ(std::get<int>(ReadWholeFile(root.directory(), 9)), EISDIR);
  EXPECT_EQ(std::get<int>(ReadWholeFile(root.path("/none"), 9)), ENOENT);
  EXPECT_EQ(std::get<int>(ReadWholeFile("/proc/self/status", 9)), EFBIG) << "announces no size";
  EXPECT_EQ(root.root().kernelPath("/proc/x"), "/proc/x");
  root.write("/proc/y", "");
  EXPECT_EQ(root.root().kernelPath("/proc/x"), root.path("/proc/x"));
}

TEST_F(LinuxServices, FilesAppearWholeWhateverOthersDo) {
  root.write("/a/.f.tmp", std::string(100000, 'l'));  // left behind by a killed writer
  std::vector<std::thread> writers;
  for (char c = 'a'; c < 'i'; ++c) {
    writers.emplace_back([&, c] {
      for (int i = 0; i < 20; ++i) {
        ASSERT_EQ(WriteWholeFile(root.path("/a/f"), std::string(50000, c)), 0);
        const std::string seen = root.read("/a/f");
        ASSERT_EQ(seen, std::string(50000, seen[0]));
      }
    });
  }
  for (std::thread& writer : writers) writer.join();
  EXPECT_EQ(root.list("/a"), Names{"f"});
  {
    AtomicFile abandoned(root.path("/new/dir"), "stem");
    ASSERT_EQ(abandoned.open(), 0);
    ASSERT_EQ(abandoned.write("half"), 0);
    EXPECT_EQ(root.list("/new/dir"), Names{".stem.tmp"});
  }
  EXPECT_EQ(root.list("/new/dir"), Names());
  struct stat status = {};
  ASSERT_EQ(stat(root.path("/new").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0007, 0u) << "not for others";
  EXPECT_NE(WriteWholeFile(root.path("/a/f/g"), "x"), 0);
  EXPECT_NE(AtomicFile(root.path("/a"), "../x").open(), 0);
}

TEST_F(LinuxServices, NoMessageForgesALogLine) {
  const struct {
    std::string text;
    std::string logged;
  } cases[] = {
      {"plain %s %n ä\t\\", "plain %s %n ä\t\\"},
      {"a\n2026-01-01T00:00:00Z error quorlet[1]: b\r\n\nc\n",
       "a\n\t2026-01-01T00:00:00Z error quorlet[1]: b\n\t\n\tc"},
      {std::string("\0\x1b[2J\r\x7f\v", 8), "\\x00\\x1b[2J\\x0d\\x7f\\x0b"},
      {"\xff\xc2\x85\xe2\x80\xa8\xe2\x80\xa6", "\xEF\xBF\xBD\\xc2\\x85\\xe2\\x80\\xa8\xe2\x80\xa6"},
      {"", ""},
  };
  std::string expected;
  const auto file = MakeLinuxSystemLog(root.root(), Access::kReadWrite, clock);
  for (const auto& c : cases) {
    file->write(LogLevel::kDefault, c.text);
    expected += "2024-10-04T12:00:00Z default quorlet[" + std::to_string(getpid()) +
                "]: " + c.logged + "\n";
  }
  EXPECT_EQ(root.read("/var/log/quorlet.log"), expected);

  const TempRoot blocked;
  blocked.write("/var", "not a directory");
  const auto blockedLog = MakeLinuxSystemLog(blocked.root(), Access::kReadWrite, clock);
  testing::internal::CaptureStderr();
  blockedLog->info("lost");
  blockedLog->error("kept");
  const std::string shown = testing::internal::GetCapturedStderr();
  EXPECT_NE(shown.find(" error quorlet["), std::string::npos) << shown;
  EXPECT_EQ(shown.find("lost"), std::string::npos) << shown;
}

TEST_F(LinuxServices, TheOSVersionComesFromOsRelease) {
  const struct {
    const char* etc;
    const char* usr;
    std::string text;
    std::size_t errorLines;
  } cases[] = {
      {nullptr, nullptr, "unknown", 0},
      {"NAME=\"A \\\"B\\\" \\$\\n\"\nVERSION_ID='1 \\'\nBUILD_ID=x\\ y #z\n", "NAME=no",
       "A \"B\" $\\n 1 \\ (x y)", 0},
      {nullptr, "# c\n  NAME=Free Words \r\nVERSION_ID=12\nIMAGE_VERSION=i\n", "Free Words 12 (i)",
       0},
      {"NAME=A\nVERSION_ID=2\nBUILD_ID=\n", nullptr, "A 2 (2)", 0},
      {"NAME=A", nullptr, "A", 0},
      {"BUILD_ID=7\n=x\n1=2\nnonsense\n", nullptr, "(7)", 0},
      {"NAME=\"open\nVERSION_ID=\xff"
       "1",
       nullptr,
       "\xEF\xBF\xBD"
       "1 (\xEF\xBF\xBD"
       "1)",
       0},
      {"garbage", "NAME=B", "B", 1},
      {"", nullptr, "unknown", 1},
  };
  for (const auto& c : cases) {
    const TempRoot own;
    log.lines.clear();
    if (c.etc != nullptr) own.write("/etc/os-release", c.etc);
    if (c.usr != nullptr) own.write("/usr/lib/os-release", c.usr);
    const auto version = MakeLinuxOSVersion(own.root(), log);
    EXPECT_EQ(OSVersionText(*version), c.text);
    EXPECT_EQ(OSVersionText(*version), c.text);
    EXPECT_EQ(version->CopySystemVersionDictionary().has_value(), c.text != "unknown");
    EXPECT_EQ(errors().size(), c.errorLines) << c.text;
  }
}

class LinuxDiagnosticsTest : public LinuxServices {
 protected:
  static constexpr char kPending[] = "/var/mobile/Library/Logs/Diagwell/pending";
  static constexpr char kOutbox[] = "/var/mobile/Library/Logs/Diagwell/outbox";

  bool write(std::string_view name, std::string_view body,
             const std::optional<Dictionary>& metadata = std::nullopt) {
    return diagnostics->DGWWriteLogForSubmission(
        "193", name, metadata, [&](LogOutput& output) { return output.write(body); });
  }

  FakePreferences preferences;
  FakeOSVersion osVersion;
  std::unique_ptr<Diagnostics> diagnostics =
      MakeLinuxDiagnostics(root.root(), Access::kReadWrite, clock, preferences, osVersion, log);
};

TEST_F(LinuxDiagnosticsTest, ALogIsOneFileWithANewName) {
  const std::string body("<x/>\n\0\xff", 7);
  EXPECT_TRUE(write("l", body,
                    Dictionary{{"d", Array{Date{0}, Data{std::byte{255}}, true}},
                               {"n", Double(1.0 / 0.0)},
                               {"t\n", "ä\xff"}}));
  EXPECT_EQ(root.read(std::string(kPending) + "/l-20241004T120000Z-1.log"),
            "{\"type\":\"193\",\"name\":\"l\",\"created\":\"2024-10-04T12:00:00Z\","
            "\"os_version\":\"(A1)\",\"metadata\":{\"d\":[\"1970-01-01T00:00:00Z\",\"/w==\",true],"
            "\"n\":\"inf\",\"t\\n\":\"\\u00e4\\ufffd\"}}\n" +
                body);
  root.write(std::string(kPending) + "/.hidden", "");
  diagnostics->SubmitDiagnosticLogs();
  EXPECT_TRUE(write("l", ""));
  EXPECT_TRUE(write("l", ""));
  EXPECT_EQ(root.list(kOutbox), Names{"l-20241004T120000Z-1.log"});
  EXPECT_EQ(root.list(kPending),
            (Names{".hidden", "l-20241004T120000Z-2.log", "l-20241004T120000Z-3.log"}));
  EXPECT_EQ(errors(), Names());
}

TEST_F(LinuxDiagnosticsTest, AFailedLogLeavesNothing) {
  const auto failing = [](LogOutput& output) { return output.write("half") && false; };
  EXPECT_FALSE(diagnostics->DGWWriteLogForSubmission("1", "l", std::nullopt, failing));
  EXPECT_FALSE(write("../l", ""));
  EXPECT_FALSE(write("l", std::string(64UL << 20, 'x')));
  const auto readOnly =
      MakeLinuxDiagnostics(root.root(), Access::kReadOnly, clock, preferences, osVersion, log);
  EXPECT_FALSE(readOnly->DGWWriteLogForSubmission("1", "l", std::nullopt, failing));
  EXPECT_EQ(root.list(kPending), Names());
  EXPECT_EQ(errors().size(), 4u);
}

TEST_F(LinuxDiagnosticsTest, TheOldestLogsMakeRoom) {
  constexpr off_t kQuarter = 16L << 20;
  const std::string pending = std::string(kPending) + "/";
  writeSparse(pending + "young.log", kQuarter, 3000);
  writeSparse(std::string(kOutbox) + "/oldest.log", kQuarter, 1000);
  writeSparse(pending + "a-old.log", kQuarter, 2000);
  writeSparse(pending + "b-old.log", kQuarter, 2000);
  writeSparse(pending + ".temporary", kQuarter, 1);
  EXPECT_TRUE(write("new", std::string(kQuarter, 'x')));  // and a header: two must go
  EXPECT_EQ(root.list(kOutbox), Names());
  EXPECT_EQ(root.list(kPending),
            (Names{".temporary", "b-old.log", "new-20241004T120000Z-1.log", "young.log"}));
}

TEST_F(LinuxServices, OldStructuredLinesMoveOnce) {
  const std::string directory = "/var/mobile/Library/Logs/FaultScribe/";
  const auto line = [](const std::string& day, int n) {
    return "{\"type\":172,\"time\":\"" + day + "T23:59:59Z\",\"data\":" + std::to_string(n) + "}\n";
  };
  const auto crash = MakeLinuxCrashSupport(root.root(), Access::kReadWrite, clock, log);
  crash->FSDumpAllOldStructuredDataLogs();
  EXPECT_FALSE(root.exists("/var")) << "nothing to do";

  const std::string kept = "lost\n" + line("2024-10-04", 4) + "{\"time\":\"2024-10-0\n" +
                           line("2024-10-05", 5) + line("2024-13-01", 7);
  root.write(directory + "structured.jsonl",
             "lost\n" + line("2024-10-02", 1) + "cut\n" + line("2024-10-03", 2) +
                 line("2024-10-04", 4) + "{\"time\":\"2024-10-0\n" + line("2024-10-05", 5) +
                 line("2024-13-01", 7) + line("2024-10-02", 3) + "torn");
  root.write(directory + "structured-20241003.jsonl", "before\n");
  crash->FSDumpAllOldStructuredDataLogs();
  const auto expectMoved = [&] {
    EXPECT_EQ(root.read(directory + "structured.jsonl"), kept);
    EXPECT_EQ(root.read(directory + "structured-20241002.jsonl"),
              line("2024-10-02", 1) + "cut\n" + line("2024-10-02", 3) + "torn\n");
    EXPECT_EQ(root.read(directory + "structured-20241003.jsonl"),
              "before\n" + line("2024-10-03", 2));
    EXPECT_EQ(root.list(directory), (Names{".structured.lock", "structured-20241002.jsonl",
                                           "structured-20241003.jsonl", "structured.jsonl"}));
  };
  expectMoved();

  // Killed after the new log took its place: what is staged counts. Killed before: it does not.
  struct stat status = {};
  ASSERT_EQ(stat(root.path(directory + "structured.jsonl").c_str(), &status), 0);
  ASSERT_EQ(rename(root.path(directory + "structured-20241002.jsonl").c_str(),
                   root.path(directory + ".structured-20241002.1").c_str()),
            0);
  root.write(directory + ".structured-20241003." + std::to_string(status.st_ino), "twice\n");
  root.write(directory + ".structured.new", "half");
  crash->FSDumpAllOldStructuredDataLogs();
  expectMoved();
  EXPECT_EQ(errors(), Names());
}

TEST_F(LinuxServices, SupportLogsRotate) {
  const std::string logs = "/var/mobile/Library/Logs/Carewell/";
  const auto crash = MakeLinuxCrashSupport(root.root(), Access::kReadWrite, clock, log);
  for (int round = 1; round <= 7; ++round) {
    root.write(logs + "a.log", std::to_string(round));
    root.write(logs + "empty.log", "");
    crash->rollCarewellLogs();
    if (round == 6) std::filesystem::remove(root.path(logs + "a.log.2"));  // cut short
  }
  std::string oldToNew;
  for (int n = 5; n > 0; --n) oldToNew += root.read(logs + "a.log." + std::to_string(n));
  EXPECT_EQ(oldToNew, "23467");
  EXPECT_EQ(root.list(logs).size(), 6u);
}

TEST_F(LinuxServices, TheSupportLibraryWorksOnThePreferencesItIsGiven) {
  FakePreferences preferences;
  const auto library = MakeLinuxSupportLibrary();
  EXPECT_EQ(library->findFunction("DGWPreferencesSetValue"), nullptr) << "not loaded";
  ASSERT_TRUE(library->load());
  const auto writer = library->findFunction("DGWPreferencesSetValue");
  const auto reader = library->findFunction("DGWPreferencesGetIntegerValue");
  ASSERT_TRUE(writer != nullptr && reader != nullptr);
  reinterpret_cast<IntegerPreferenceWriter>(writer)(preferences, "k", -7, "d");
  EXPECT_EQ(preferences.DGWPreferencesGetIntegerValue("k", "d"), -7);
  EXPECT_EQ(reinterpret_cast<IntegerPreferenceReader>(reader)(preferences, "k", "d"), -7);
  EXPECT_EQ(library->findFunction("DGWNoSuchFunction"), nullptr);
}

TEST_F(LinuxServices, DeviceInfoAnswersFromTheFileFirst) {
  root.write("/etc/machine-id", "abc\n");
  const auto own = MakeLinuxDeviceInfo(root.root(), log);
  EXPECT_EQ(own->DQCopyAnswer("InverseDeviceID"),
            PropertyValue("a9993e364706816aba3e25717850c26c9cd0d89d"));
  const auto usage = own->DQCopyAnswer("DiskUsage");
  ASSERT_TRUE(usage && usage->asDictionary() != nullptr);
  const auto capacity = IntegerEntry(*usage->asDictionary(), "kDQQDiskUsageTotalDiskCapacity");
  const auto available = IntegerEntry(*usage->asDictionary(), "kDQQDiskUsageTotalDataAvailable");
  EXPECT_TRUE(capacity && available && *available >= 0 && *capacity > *available);
  EXPECT_EQ(own->DQCopyAnswer("Other"), std::nullopt);

  root.write("/var/db/DeviceInfo.plist",
             "<plist version=\"1.0\"><dict><key>DiskUsage</key><string>s</string>"
             "<key>MultiUserMode</key><integer>99999999999</integer></dict></plist>");
  const auto answers = MakeLinuxDeviceInfo(root.root(), log);
  EXPECT_EQ(answers->DQCopyAnswer("DiskUsage"), PropertyValue("s"));
  const auto environment = MakeLinuxEnvironment(root.root(), *answers, log);
  std::int32_t mode = 5;
  EXPECT_TRUE(environment->CheckMultiUserMode(mode));
  EXPECT_EQ(mode, 2147483647);
  EXPECT_FALSE(MakeLinuxEnvironment(root.root(), *own, log)->CheckMultiUserMode(mode));
  EXPECT_EQ(errors(), Names());
  root.write("/var/db/DeviceInfo.plist", "broken");
  const auto broken = MakeLinuxDeviceInfo(root.root(), log);
  EXPECT_EQ(broken->DQCopyAnswer("MultiUserMode"), std::nullopt);
  EXPECT_FALSE(broken->DQGetBoolAnswer("InternalBuild"));
  EXPECT_EQ(errors().size(), 1u);
}

TEST_F(LinuxServices, ContainersAndFilesLieBelowTheRoot) {
  FakeDeviceInfo deviceInfo;
  const auto environment = MakeLinuxEnvironment(root.root(), deviceInfo, log);
  root.write("/var/lib/quorlet/file", "12345");
  root.write("/var/lib/quorlet/group/x", "");
  std::uint64_t error = 1;
  EXPECT_EQ(environment->SystemGroupContainerPath("group", error), "/var/lib/quorlet/group");
  for (const auto& [name, expected] : std::map<std::string, int>{
           {"none", ENOENT}, {"file", ENOTDIR}, {"../quorlet/group", EINVAL}}) {
    EXPECT_EQ(environment->SystemGroupContainerPath(name, error), std::nullopt) << name;
    EXPECT_EQ(error, static_cast<std::uint64_t>(expected)) << name;
  }
  EXPECT_EQ(environment->stat("/var/lib/quorlet/file")->size, 5u);
  EXPECT_TRUE(environment->stat("/var/lib"));
  EXPECT_FALSE(environment->stat("/none") || environment->stat("var") ||
               environment->stat(std::string_view("/var\0x", 6)));
  EXPECT_EQ(environment->readFile("/var/lib/quorlet/file", 5), "12345");
  EXPECT_EQ(environment->readFile("/var/lib/quorlet/file", 4), std::nullopt);
}

TEST_F(LinuxServices, KernelParametersAreFilesAndQueues) {
  const auto kernel = MakeLinuxKernelParameters(root.root(), Access::kReadWrite, log);
  const auto ask = [&](KernelParameters& parameters, std::string_view name, std::size_t room = 4) {
    std::vector<std::byte> buffer(room);
    std::size_t length = 0;
    const int error = parameters.sysctlbyname(name, buffer, length);
    const std::string bytes(reinterpret_cast<const char*>(buffer.data()), length);
    return error == 0 ? bytes : ErrnoText(error);
  };
  const std::string kMissing = ErrnoText(ENOENT);
  root.write("/var/db/kernel/a", std::string("\0xy\xff", 4));
  EXPECT_EQ(ask(*kernel, "a"), std::string("\0xy\xff", 4));
  EXPECT_EQ(ask(*kernel, "a", 3), ErrnoText(ENOMEM));
  EXPECT_EQ(ask(*kernel, "b"), kMissing);
  EXPECT_EQ(ask(*kernel, "../kernel/a") + ask(*kernel, ""), kMissing + kMissing);
  EXPECT_EQ(errors().size(), 2u);

  for (const char* name : {"10", "9", ".1", "8"})
    root.write(std::string("/var/db/kernel/q/") + name, name);
  const auto readOnly = MakeLinuxKernelParameters(root.root(), Access::kReadOnly, log);
  EXPECT_EQ(ask(*readOnly, "q"), "10");
  EXPECT_EQ(ask(*kernel, "q", 1), ErrnoText(ENOMEM));
  for (const std::string& next :
       {std::string("10"), std::string("8"), std::string("9"), kMissing}) {
    EXPECT_EQ(ask(*kernel, "q"), next);
  }

  const struct {
    std::string text;
    std::vector<std::uint64_t> expected;  // total, available, used; empty when there is no value
  } cases[] = {
      {"MemTotal: 1 kB\nSwapTotal:   2097148 kB\nSwapFree:  1 kB\n",
       {2147479552, 1024, 2147478528}},
      {"SwapTotal: 1 kB\nSwapFree: 2 kB", {1024, 2048, 0}},
      {"SwapTotal: 18014398509481984 kB\nSwapFree: 0 kB\n", {}},
      {"SwapTotal: -1 kB\nSwapFree: 0 kB\n", {}},
      {"SwapTotal: 1\nSwapFree: 0 kB\n", {}},
      {"SwapFree: 0 kB\n", {}},
      {"", {}},
  };
  for (const auto& c : cases) {
    root.write("/proc/meminfo", c.text);
    std::string expected = kMissing;
    if (!c.expected.empty()) {
      const std::uint32_t last[] = {static_cast<std::uint32_t>(sysconf(_SC_PAGESIZE)), 0};
      expected.assign(reinterpret_cast<const char*>(c.expected.data()), 24);
      expected.append(reinterpret_cast<const char*>(last), 8);
    }
    EXPECT_EQ(ask(*kernel, "vm.swapusage", 32), expected) << c.text;
  }
  EXPECT_EQ(
      ask(*MakeLinuxKernelParameters(Root("/"), Access::kReadOnly, log), "vm.swapusage", 32).size(),
      32u);
}

TEST_F(LinuxServices, ApplicationsAreDesktopFiles) {
  const std::string application = "[Desktop Entry]\nType=Application\n";
  for (const auto& [path, text] : std::map<std::string, std::string>{
           {"usr/share/applications/a.desktop", application},
           {"usr/share/applications/sub/b.desktop",
            "#c\n[Desktop Entry]\r\nType = Application\r\n"},
           {"usr/share/applications/link.desktop",
            "[Desktop Entry]\nType=Link\n[x]\nType=Application"},
           {"usr/share/applications/deleted.desktop", application + "Hidden=true\n"},
           {"usr/share/applications/shown.desktop", application + "NoDisplay=true\n"},
           {"usr/share/applications/a.txt", application},
           {"usr/share/applications/.c.desktop", application},
           {"usr/share/applications/big.desktop", application + std::string(1 << 20, '#')},
           {"usr/local/share/applications/a.desktop", application},
           {"var/lib/flatpak/exports/share/applications/d.desktop", application},
           {"var/mobile/.local/share/applications/e.desktop", application}}) {
    root.write("/" + path, text);
  }
  std::filesystem::create_directory_symlink(".", root.path("/usr/share/applications/loop"));
  std::map<ApplicationBundleType, int> counts;
  MakeLinuxApplications(root.root())->EnumerateApplicationBundles([&](auto type) {
    ++counts[type];
  });
  EXPECT_EQ(counts[ApplicationBundleType::SystemApplicationBundleType], 3);
  EXPECT_EQ(counts[ApplicationBundleType::UserApplicationBundleType], 3);
}

TEST_F(LinuxServices, LanguagesComeFromTheEnvironmentAndLocaleConf) {
  using Variables = std::map<std::string, std::string>;
  const struct {
    Variables variables;
    const char* localeConf;
    Names preferred;
    std::optional<std::string> region;
  } cases[] = {
      {{}, "", {}, std::nullopt},
      {{{"LANG", "de_AT.UTF-8"}}, "LANG=de_AT.UTF-8", {"de-AT"}, "AT"},
      {{{"LANGUAGE", "fr:pt_br:C::../x"}, {"LC_ALL", "C.UTF-8"}, {"LANG", "en_US"}},
       "LC_MESSAGES='ja'\n",
       {"fr", "pt-BR", "en-US", "ja"},
       "US"},
      {{{"LC_ALL", "sr_RS.UTF-8@latin"}, {"LANG", "POSIX"}}, "", {"sr-Latn-RS"}, "RS"},
      {{{"LC_ALL", "eo"}, {"LC_MESSAGES", "zh-hant-tw"}, {"LANG", "ca_ES@valencia"}},
       "",
       {"eo", "zh-Hant-TW", "ca-ES-valencia"},
       std::nullopt},
      {{{"LC_ALL", "de_AT_DE"}, {"LC_MESSAGES", "e\nn"}, {"LANG", "es_419@euro"}},
       "",
       {"es-419"},
       "419"},
  };
  for (const auto& c : cases) {
    root.write("/etc/locale.conf", c.localeConf);
    const auto locale = MakeLinuxLocale(root.root(), [&](const char* name) {
      const auto found = c.variables.find(name);
      return found != c.variables.end() ? found->second.c_str() : nullptr;
    });
    EXPECT_EQ(locale->PreferredLanguages(), c.preferred);
    EXPECT_EQ(locale->CurrentRegionCode(), c.region);
  }
  for (const char* name : {"de", "pt_BR", "sr@latin", "en_GB", "C"}) {
    root.write(std::string("/usr/share/locale/") + name + "/LC_MESSAGES/x", "");
  }
  root.write("/usr/share/locale/fr/x", "");
  const auto locale = MakeLinuxLocale(root.root(), [](const char*) { return nullptr; });
  const Names system = locale->SystemLanguages();
  EXPECT_EQ(system, (Names{"de", "en-GB", "pt-BR", "sr-Latn", "en"}));
  EXPECT_EQ(locale->PreferredLocalizations(
                system, {"fr-FR", "pt", "sr-latn-RS-x-abc", "de-AT", "DE", "en-US"}),
            (Names{"sr-Latn", "de", "en"}));
  EXPECT_EQ(locale->PreferredLocalizations(system, {"fr"}), Names());
}

TEST_F(LinuxServices, APassExcludesOthers) {
  const auto pass = MakeLinuxPassLock(root.root(), Access::kReadWrite, log);
  pass->lock();
  const Descriptor other(open(root.path("/run/quorlet/pass.lock").c_str(), O_RDWR));
  ASSERT_TRUE(other.isOpen());
  EXPECT_NE(flock(other.get(), LOCK_EX | LOCK_NB), 0);
  pass->unlock();
  EXPECT_EQ(flock(other.get(), LOCK_EX | LOCK_NB), 0);
}

TEST_F(LinuxServices, APlatformThatIsNotUsedTouchesNothing) {
  { LinuxPlatform idle(root.root(), Access::kReadWrite); }
  EXPECT_EQ(root.list(""), Names());
  auto ownLog = std::make_unique<FakeSystemLog>();
  LinuxPlatform readOnly(root.root(), Access::kReadOnly, std::move(ownLog));
  Platform& services = readOnly.services();
  services.log.error("x");
  services.preferences.DGWPreferencesSetValue("k", true, "d");
  services.preferences.DGWPreferencesSynchronize("d");
  services.crashSupport.FSDumpAllOldStructuredDataLogs();
  services.diagnostics.SubmitDiagnosticLogs();
  services.passLock.lock();
  services.passLock.unlock();
  EXPECT_EQ(root.list(""), Names());
}

}  // namespace
}  // namespace quorlet
