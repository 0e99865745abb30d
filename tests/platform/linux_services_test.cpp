// The Linux services against the files of a temporary root.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <thread>

#include "fakes/fake_platform.h"
#include "fakes/temp_root.h"
#include "platform/linux/base/descriptor.h"
#include "platform/linux/base/services.h"
#include "platform/linux/device/services.h"
#include "platform/linux/logs/services.h"
#include "platform/sync_recorder.h"

namespace quorlet {
namespace {

using Names = std::vector<std::string>;

class LinuxServices : public testing::Test {
 protected:
  static constexpr char kPending[] = "/var/mobile/Library/Logs/Diagwell/pending";
  static constexpr char kOutbox[] = "/var/mobile/Library/Logs/Diagwell/outbox";

  LinuxServices() {
    preferences.DGWPreferencesSetValue("SubmissionEnabled", PropertyValue(true), "nuvex.diagwell");
  }
  bool write(std::string_view name, std::string_view body,
             const std::optional<Dictionary>& metadata = std::nullopt) {
    return diagnostics->DGWWriteLogForSubmission(
        "193", name, metadata, [&](LogOutput& output) { return output.write(body); });
  }
  // A file of `size` bytes that takes no room, last changed at `modified`.
  void writeSparse(std::string_view path, std::size_t size, std::time_t modified) {
    root.write(path, "");
    std::filesystem::resize_file(root.path(path), size);
    const timespec times[] = {{modified, 0}, {modified, 0}};
    ASSERT_EQ(utimensat(AT_FDCWD, root.path(path).c_str(), times, 0), 0);
  }

  TempRoot root;
  FakeSystemLog log;
  FakeClock clock;  // 2024-10-04T12:00:00Z
  FakePreferences preferences;
  FakeOSVersion osVersion;
  std::unique_ptr<Diagnostics> diagnostics =
      MakeLinuxDiagnostics(root.root(), Access::kReadWrite, clock, preferences, osVersion, log);
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
  EXPECT_EQ(std::get<int>(ReadWholeFile("/proc/self/status", 9)), EFBIG) << "announces no size";
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
  EXPECT_NE(WriteWholeFile(root.path("/a/f/g"), "x"), 0);
  EXPECT_NE(AtomicFile(root.path("/a"), "../x").open(), 0);
}

TEST_F(LinuxServices, NoMessageForgesALogLine) {
  const std::pair<std::string, std::string> cases[] = {
      {"plain %s %n ä\t\\", "plain %s %n ä\t\\"},
      {"a\n2026-01-01T00:00:00Z error quorlet[1]: b\r\n\nc\n",
       "a\n\t2026-01-01T00:00:00Z error quorlet[1]: b\n\t\n\tc"},
      {std::string("\0\x1b[2J\r\x7f\v", 8), "\\x00\\x1b[2J\\x0d\\x7f\\x0b"},
      {"\xff\xc2\x85\xe2\x80\xa8\xe2\x80\xa6", "\xEF\xBF\xBD\\xc2\\x85\\xe2\\x80\\xa8\xe2\x80\xa6"},
  };
  std::string expected;
  const auto file = MakeLinuxSystemLog(root.root(), Access::kReadWrite, clock);
  for (const auto& [text, logged] : cases) {
    file->write(LogLevel::kDefault, text);
    expected +=
        "2024-10-04T12:00:00Z default quorlet[" + std::to_string(getpid()) + "]: " + logged + "\n";
  }
  EXPECT_EQ(root.read("/var/log/quorlet.log"), expected);
}

TEST_F(LinuxServices, TheOSVersionComesFromOsRelease) {
  const std::pair<std::string, std::string> cases[] = {
      {"NAME=\"A \\\"B\\\" \\$\\n\"\nVERSION_ID='1 \\'\nBUILD_ID=x\\ y #z\n",
       "A \"B\" $\\n 1 \\ (x y)"},
      {"# c\n  NAME=Free Words \r\nVERSION_ID=12\nIMAGE_VERSION=i\n", "Free Words 12 (i)"},
      {"BUILD_ID=7\n=x\n1=2\nnonsense\nNAME=\"open\nVERSION_ID=\xff", "\xEF\xBF\xBD (7)"},
  };
  for (const auto& [text, version] : cases) {
    root.write("/etc/os-release", text);
    EXPECT_EQ(OSVersionText(*MakeLinuxOSVersion(root.root(), log)), version);
  }
}

TEST_F(LinuxServices, ALogIsOneFileWithANewName) {
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
}

TEST_F(LinuxServices, WithoutConsentNoLogIsWrittenOrSubmitted) {
  EXPECT_TRUE(write("l", "body"));
  preferences.DGWPreferencesSetValue("SubmissionEnabled", std::nullopt, "nuvex.diagwell");
  EXPECT_FALSE(write("m", "body"));
  diagnostics->SubmitDiagnosticLogs();
  EXPECT_EQ(root.list(kPending).size(), 1u);
  EXPECT_EQ(root.list(kOutbox), Names());
  EXPECT_EQ(log.at(LogLevel::kInfo).size(), 2u);
  EXPECT_TRUE(log.errors().empty());
  EXPECT_TRUE(diagnostics->removeAllLogs());
  EXPECT_EQ(root.list(kPending), Names());
}

TEST_F(LinuxServices, AFailedLogLeavesNothing) {
  const auto failing = [](LogOutput& output) { return output.write("half") && false; };
  EXPECT_FALSE(diagnostics->DGWWriteLogForSubmission("1", "l", std::nullopt, failing));
  EXPECT_FALSE(write("../l", ""));
  EXPECT_FALSE(write("l", std::string(64UL << 20, 'x')));
  EXPECT_EQ(root.list(kPending), Names());
  EXPECT_EQ(log.errors().size(), 3u);
}

TEST_F(LinuxServices, TheOldestLogsMakeRoom) {
  constexpr std::size_t kQuarter = 16L << 20;
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
  const auto crash = MakeLinuxCrashSupport(root.root(), Access::kReadWrite, clock, osVersion, log);
  const std::string kept = "lost\n" + line("2024-10-04", 4) + "{\"time\":\"2024-10-0\n" +
                           line("2024-10-05", 5) + line("2024-13-01", 7);
  root.write(directory + "structured.jsonl",
             "lost\n" + line("2024-10-02", 1) + "cut\n" + line("2024-10-03", 2) +
                 line("2024-10-04", 4) + "{\"time\":\"2024-10-0\n" + line("2024-10-05", 5) +
                 line("2024-13-01", 7) + line("2024-10-02", 3) + "torn");
  root.write(directory + "structured-20241003.jsonl", "before\n");
  crash->FSDumpAllOldStructuredDataLogs();
  EXPECT_EQ(root.read(directory + "structured.jsonl"), kept);
  EXPECT_EQ(root.read(directory + "structured-20241002.jsonl"),
            line("2024-10-02", 1) + "cut\n" + line("2024-10-02", 3) + "torn\n");
  EXPECT_EQ(root.read(directory + "structured-20241003.jsonl"), "before\n" + line("2024-10-03", 2));
  EXPECT_EQ(root.list(directory), (Names{".structured.lock", "structured-20241002.jsonl",
                                         "structured-20241003.jsonl", "structured.jsonl"}));
  EXPECT_EQ(log.errors(), Names());
}

TEST_F(LinuxServices, NoNameOrFileGoesBeyondItsBounds) {
  FakeDeviceInfo deviceInfo;
  const auto environment = MakeLinuxEnvironment(root.root(), deviceInfo, log);
  root.write("/var/lib/quorlet/file", "12345");
  root.write("/var/lib/quorlet/group/x", "");
  std::uint64_t error = 1;
  EXPECT_EQ(environment->SystemGroupContainerPath("../quorlet/group", error), std::nullopt);
  EXPECT_EQ(error, std::uint64_t{EINVAL});
  EXPECT_FALSE(environment->stat(std::string_view("/var\0x", 6)));
  EXPECT_EQ(environment->readFile("/var/lib/quorlet/file", 4), std::nullopt);
}

TEST_F(LinuxServices, KernelParametersAreFilesAndQueues) {
  const auto kernel = MakeLinuxKernelParameters(root.root(), Access::kReadWrite, log);
  const auto ask = [&](std::string_view name, std::size_t room = 4) {
    std::vector<std::byte> buffer(room);
    std::size_t length = 0;
    const int error = kernel->sysctlbyname(name, buffer, length);
    const std::string bytes(reinterpret_cast<const char*>(buffer.data()), length);
    return error == 0 ? bytes : ErrnoText(error);
  };
  const std::string kMissing = ErrnoText(ENOENT);
  root.write("/var/db/kernel/a", std::string("\0xy\xff", 4));
  EXPECT_EQ(ask("a"), std::string("\0xy\xff", 4));
  EXPECT_EQ(ask("a", 3), ErrnoText(ENOMEM));
  EXPECT_EQ(ask("../kernel/a") + ask(""), kMissing + kMissing);

  const auto fill = [&](const Names& names) {
    for (const std::string& name : names) root.write("/var/db/kernel/q/" + name, name);
  };
  const auto askFor = [&](int times) {
    std::string all;
    while (times-- > 0) all += ask("q");
    return all;
  };
  fill({"10", "9", ".1", "8"});
  EXPECT_EQ(ask("q", 1), ErrnoText(ENOMEM)) << "it stays";
  EXPECT_EQ(askFor(2), "108");
  kernel->returnTaken("q");
  EXPECT_EQ(askFor(2), "108");
  std::filesystem::remove(root.path("/var/db/kernel/q/8"));
  fill({"8"});  // another one
  EXPECT_TRUE(kernel->removeTaken("q"));
  EXPECT_EQ(root.list("/var/db/kernel/q"), (Names{".1", "8", "9"}));
  EXPECT_EQ(askFor(3), "89" + kMissing);

  // What is no event, or is too large for one, is in nobody's way; refused files are bounded.
  EXPECT_TRUE(kernel->removeTaken("q"));
  std::filesystem::create_symlink("/etc/passwd", root.path("/var/db/kernel/q/0"));
  ASSERT_EQ(mkfifo(root.path("/var/db/kernel/q/00").c_str(), 0600), 0);
  for (int i = 0; i < 20; ++i) {
    root.write("/var/db/kernel/q/x", std::string(73, 'x'));
    EXPECT_EQ(ask("q", 72), ErrnoText(ENOMEM));
  }
  EXPECT_EQ(ask("q", 72), kMissing);
  EXPECT_EQ(root.list("/var/db/kernel/q").size(), 3u + 16);
  EXPECT_EQ(log.errors().size(), 2u + 20);
  SyncRecorder recorder(root.path("/var/db/kernel/q"));
  recorder.fail("list", 1, EMFILE);
  EXPECT_EQ(ask("q"), ErrnoText(EMFILE)) << "not: empty";
  fill({"y"});
  EXPECT_EQ(ask("q"), "y");
  recorder.fail("unlink", 1, EACCES);
  EXPECT_FALSE(kernel->removeTaken("q"));
  EXPECT_EQ(log.errors().back(),
            "Cannot remove " + root.path("/var/db/kernel/q/y: ") + ErrnoText(EACCES));

  root.write("/proc/meminfo", "SwapTotal: 2 kB\nSwapFree:  3 kB\n");
  const std::uint64_t expected[] = {2048, 3072, 0};  // total, available, used
  EXPECT_EQ(ask("vm.swapusage", 32).substr(0, 24),
            std::string(reinterpret_cast<const char*>(expected), 24));
  for (const char* total : {"18014398509481984", "-1", ""}) {
    root.write("/proc/meminfo", std::string("SwapTotal: ") + total + " kB\nSwapFree: 0 kB\n");
    EXPECT_EQ(ask("vm.swapusage", 32), kMissing) << total;
  }
}

}  // namespace
}  // namespace quorlet
