// Entries of the structured log: one line each, whatever they hold and whatever goes wrong.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>

#include <algorithm>
#include <regex>
#include <sstream>
#include <thread>

#include "fakes/fake_platform.h"
#include "fakes/temp_root.h"
#include "platform/linux/logs/services.h"
#include "platform/sync_recorder.h"

namespace quorlet {
namespace {

const std::string kDirectory = "/var/mobile/Library/Logs/FaultScribe/";
const std::string kLog = kDirectory + "structured.jsonl";

using Names = std::vector<std::string>;

TEST(AtomicFileTest, IsSyncedBeforeItsNameAndItsNameAfter) {
  const TempRoot root;
  SyncRecorder recorder(root.directory());
  EXPECT_EQ(WriteWholeFile(root.path("/f"), "x"), 0);
  EXPECT_EQ(recorder.calls(), (Names{"truncate .f.tmp", "write .f.tmp", "fsync .f.tmp",
                                     "rename .f.tmp f", "fsync ."}));
  for (const auto& [call, left] :
       {std::pair("write", "x"), {"fsync .f", "x"}, {"rename", "x"}, {"fsync .", "y"}}) {
    recorder.fail(call, call == std::string("fsync .") ? 2 : 1, EIO);
    EXPECT_EQ(WriteWholeFile(root.path("/f"), "y"), EIO) << call;
    EXPECT_EQ(root.read("/f"), left) << call;
    EXPECT_EQ(root.list(""), Names{"f"}) << call;
  }
}

// Lets the process open only a few more files.
class DescriptorLimit {
 public:
  explicit DescriptorLimit(rlim_t spare) {
    const int next = open("/", O_RDONLY);
    close(next);
    getrlimit(RLIMIT_NOFILE, &before_);
    const rlimit limit = {static_cast<rlim_t>(next) + spare, before_.rlim_max};
    setrlimit(RLIMIT_NOFILE, &limit);
  }
  ~DescriptorLimit() { lift(); }
  void lift() const { setrlimit(RLIMIT_NOFILE, &before_); }

 private:
  rlimit before_ = {};
};

class StructuredLogTest : public testing::Test {
 protected:
  std::unique_ptr<CrashSupport> start() {
    return MakeLinuxCrashSupport(root.root(), Access::kReadWrite, clock, osVersion, log);
  }
  // A file of `size` bytes that takes no room.
  void writeSparse(const std::string& name, std::size_t size) {
    root.write(kDirectory + name, "");
    std::filesystem::resize_file(root.path(kDirectory + name), size);
  }
  // Every line of the log and its days, sorted.
  Names lines() {
    Names all;
    for (const std::string& name : root.list(kDirectory)) {
      if (name.starts_with('.')) continue;
      std::istringstream file(root.read(kDirectory + name));
      for (std::string line; std::getline(file, line);) all.push_back(line);
    }
    std::ranges::sort(all);
    return all;
  }

  TempRoot root;
  FakeSystemLog log;
  FakeClock clock;  // 2024-10-04T12:00:00Z
  FakeOSVersion osVersion;
  const std::unique_ptr<CrashSupport> support = start();
};

std::string Line(const std::string& day, int type) {
  return "{\"type\":" + std::to_string(type) + ",\"time\":\"" + day + "T12:00:00Z\",\"data\":{}}";
}

TEST_F(StructuredLogTest, EveryEntryIsALineOrNothing) {
  root.write(kLog, "{\"ty");  // cut short by a crash
  support->FSLogStructuredData(INT32_MIN, {{"e\xff", "a\nb \xc3\x28 \"%s\""}});
  const std::string before = root.read(kLog);
  EXPECT_EQ(before, R"({"ty
{"type":-2147483648,"time":"2024-10-04T12:00:00Z","data":{"e\ufffd":"a\nb \ufffd( \"%s\""}})"
                    "\n");

  // A full disk leaves it as it was.
  rlimit limit = {};
  ASSERT_EQ(getrlimit(RLIMIT_FSIZE, &limit), 0);
  const rlimit full = {before.size() + 20, limit.rlim_max};
  signal(SIGXFSZ, SIG_IGN);
  ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &full), 0);
  support->FSLogStructuredData(1, {});
  ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &limit), 0);
  EXPECT_EQ(root.read(kLog), before);
  EXPECT_EQ(log.errors().size(), 1u);
}

TEST_F(StructuredLogTest, NoLineIsLostWhileOldDaysAreMoved) {
  FakeClock tomorrow;
  tomorrow.seconds += 86400;
  const auto mover =
      MakeLinuxCrashSupport(root.root(), Access::kReadWrite, tomorrow, osVersion, log);
  std::thread moves([&] {
    for (int i = 0; i < 30; ++i) mover->FSDumpAllOldStructuredDataLogs();
  });
  for (int i = 0; i < 100; ++i) support->FSLogStructuredData(i, {});
  moves.join();
  mover->FSDumpAllOldStructuredDataLogs();
  EXPECT_EQ(std::ranges::count(root.read(kDirectory + "structured-20241004.jsonl"), '\n'), 100);
}

// What a pass logs is there once, whichever call on a file is the last one that it makes, or fails.
TEST_F(StructuredLogTest, NoCutLosesOrDoublesALine) {
  const Names old = {Line("2024-10-02", 2), Line("2024-10-03", 3), Line("2024-10-03", 4)};
  for (const bool dies : {true, false}) {
    int nth = 0;
    for (bool isCut = true; isCut;) {
      ++nth;
      SCOPED_TRACE(testing::Message() << (dies ? "killed before" : "failing") << " call " << nth);
      std::filesystem::remove_all(root.path(kDirectory));
      root.write(kLog, old[0] + "\n" + old[2] + "\n" + Line("2024-10-04", 5));
      root.write(kDirectory + "structured-20241003.jsonl", old[1] + "\n");
      bool isDurable = false;
      {
        const auto pass = start();
        ASSERT_TRUE(pass->stageEntries());
        const Dictionary entries[2];
        ASSERT_TRUE(pass->logEntries(6, entries));
        EXPECT_FALSE(pass->syncStructuredData()) << "nobody may take them for logged";
        SyncRecorder recorder(root.path(kDirectory.substr(0, kDirectory.size() - 1)));
        dies ? recorder.stopAt(nth) : recorder.fail("", nth, EIO);
        pass->publishStagedEntries();
        isDurable = pass->FSLogStructuredData(172, {}) && pass->syncStructuredData();
        pass->FSDumpAllOldStructuredDataLogs();
        isCut = recorder.hasFailed();
      }
      const auto next = start();
      EXPECT_TRUE(next->publishStagedEntries());
      EXPECT_TRUE(next->publishStagedEntries());
      next->FSDumpAllOldStructuredDataLogs();
      Names expected = old;
      for (const int type : {5, 6, 6}) expected.push_back(Line("2024-10-04", type));
      if (isDurable) expected.push_back(Line("2024-10-04", 172));
      std::ranges::sort(expected);
      Names found = lines();
      if (!isDurable) std::erase(found, Line("2024-10-04", 172));
      EXPECT_EQ(found, expected);
      EXPECT_EQ(root.list(kDirectory).size(), 4u) << "the log, its lock and two days";
    }
    EXPECT_GT(nth, 25) << "calls on files of a whole pass";
  }
}

TEST_F(StructuredLogTest, ItsSyncsAreInOrderAndFew) {
  root.write(kLog, Line("2024-10-03", 1) + "\n");
  SyncRecorder recorder(root.path(kDirectory.substr(0, kDirectory.size() - 1)));
  support->stageEntries();
  support->FSLogStructuredData(176, {});
  support->publishStagedEntries();
  support->FSDumpAllOldStructuredDataLogs();
  support->FSLogStructuredData(172, {});
  support->syncStructuredData();
  Names calls;
  for (const std::string& call : recorder.calls()) {
    if (!call.starts_with("fsync") && !call.starts_with("rename")) continue;
    calls.push_back(std::regex_replace(call, std::regex("[.][0-9]+"), ".I"));
  }
  EXPECT_EQ(calls,
            (Names{"rename .structured.staged .structured.staged.I", "fsync .structured-20241003.I",
                   "fsync .structured.new", "fsync .", "rename .structured.new structured.jsonl",
                   "rename .structured-20241003.I structured-20241003.jsonl",
                   "fsync structured.jsonl", "fsync ."}));
}

TEST_F(StructuredLogTest, StagingDropsWhatWasNotBegunToBePublished) {
  support->stageEntries();
  support->FSLogStructuredData(1, {});
  const auto next = start();
  next->stageEntries();
  next->FSLogStructuredData(2, {});
  next->publishStagedEntries();
  EXPECT_EQ(lines(), Names{Line("2024-10-04", 2)});
  // A power cut leaves the start of what is staged.
  root.write(kDirectory + ".structured.staged", Line("2024-10-04", 3) + "\n{\"type\":4");
  next->publishStagedEntries();
  EXPECT_EQ(lines(), (Names{Line("2024-10-04", 2), Line("2024-10-04", 3)}));
  EXPECT_EQ(log.errors(), Names());
}

TEST_F(StructuredLogTest, HoldsWhatItMayAndThirtyDays) {
  constexpr std::size_t kMebibyte = 1UL << 20;
  writeSparse("structured-20240903.jsonl", 1);  // 31 days ago
  writeSparse("structured-20240904.jsonl", kMebibyte);
  writeSparse("structured-20241001.jsonl", 14 * kMebibyte);
  writeSparse("structured-20241003.jsonl", kMebibyte - 1000);
  const auto days = [&] {
    std::string text;
    for (const std::string& name : root.list(kDirectory)) {
      if (name.starts_with("structured-")) text += name.substr(15, 4) + " ";
    }
    return text;
  };
  support->FSDumpAllOldStructuredDataLogs();
  EXPECT_EQ(days(), "0904 1001 1003 ");
  EXPECT_TRUE(support->FSLogStructuredData(172, {{"x", std::string(2000, 'x')}}));
  EXPECT_EQ(days(), "0904 1001 1003 ") << "it has room of its own";
  EXPECT_TRUE(support->FSLogStructuredData(176, {}));
  EXPECT_EQ(days(), "1001 1003 ");

  // Today's own lines stay; then nothing is added but what has its own room.
  writeSparse("structured.jsonl", 16 * kMebibyte - 1000);
  const Dictionary large{{"x", std::string(2000, 'x')}};
  support->stageEntries();
  EXPECT_TRUE(support->FSLogStructuredData(176, {}));
  EXPECT_TRUE(support->FSLogStructuredData(176, large));
  EXPECT_FALSE(support->publishStagedEntries());
  EXPECT_FALSE(support->FSLogStructuredData(176, large));
  EXPECT_EQ(days(), "");
  EXPECT_NE(root.read(kLog).find(Line("2024-10-04", 176)), std::string::npos);
  EXPECT_EQ(log.errors().size(), 1u) << "once a pass";
  EXPECT_TRUE(support->FSLogStructuredData(172, large));
  writeSparse("structured.jsonl", 17 * kMebibyte - 1000);
  support->FSDumpAllOldStructuredDataLogs();
  EXPECT_FALSE(support->FSLogStructuredData(172, large));
  EXPECT_EQ(log.errors().size(), 2u);
}

TEST_F(StructuredLogTest, WhatCannotBeReadIsNotTakenForEmpty) {
  const std::string carewell = "/var/mobile/Library/Logs/Carewell/";
  root.write(carewell + "a.log", "a");
  root.write(kLog, Line("2024-10-03", 1) + "\n");
  const std::string before = root.read(kLog);
  SyncRecorder recorder(root.path("/var/mobile/Library/Logs"));
  recorder.fail("list FaultScribe", 1, EIO);
  support->FSDumpAllOldStructuredDataLogs();
  recorder.fail("list Carewell", 1, EMFILE);
  support->rollCarewellLogs();
  EXPECT_EQ(log.errors().size(), 2u);
  EXPECT_EQ(root.list(carewell), Names{"a.log"});
  for (rlim_t spare = 0; spare < 4; ++spare) {
    const DescriptorLimit limit(spare);
    support->FSDumpAllOldStructuredDataLogs();
    limit.lift();
    EXPECT_EQ(log.errors().size(), 3u + spare);
    EXPECT_EQ(root.read(kLog), before) << spare;
  }
}

TEST_F(StructuredLogTest, WritesNoFileByAnotherName) {
  const std::string victim = "/victim";
  for (const char* name : {"structured.jsonl", ".structured.staged", ".structured.new",
                           ".structured-20241003.I", "structured-20241003.jsonl"}) {
    for (const bool isHard : {true, false}) {
      SCOPED_TRACE(testing::Message() << name << isHard);
      std::filesystem::remove_all(root.path(kDirectory));
      root.write(victim, "theirs");
      root.write(kLog, Line("2024-10-03", 1) + "\n");
      struct stat status = {};
      ASSERT_EQ(stat(root.path(kLog).c_str(), &status), 0);
      const std::string path =
          root.path(kDirectory) +
          std::regex_replace(name, std::regex("I$"), std::to_string(status.st_ino));
      std::filesystem::remove(path);
      isHard ? std::filesystem::create_hard_link(root.path(victim), path)
             : std::filesystem::create_symlink(root.path(victim), path);
      support->FSLogStructuredData(7, {});
      support->stageEntries();
      support->FSLogStructuredData(8, {});
      support->publishStagedEntries();
      support->FSDumpAllOldStructuredDataLogs();
      EXPECT_EQ(root.read(victim), "theirs");
    }
  }
}

TEST_F(StructuredLogTest, SupportLogsRotate) {
  const std::string directory = "/var/mobile/Library/Logs/Carewell/";
  const auto state = [&] {
    std::string text;
    for (const std::string& name : root.list(directory)) {
      text += name + "=" + root.read(directory + name) + " ";
    }
    return text;
  };
  root.write(directory + "a.log", "1");
  root.write(directory + "a.log.2", "0");
  root.write(directory + "empty.log", "");
  support->rollCarewellLogs();
  EXPECT_EQ(state(), "a.log.1=1 a.log.2=0 empty.log= ");
  for (const char* text : {"2", "3", "4", "5"}) {
    root.write(directory + "a.log", text);
    support->rollCarewellLogs();
  }
  EXPECT_EQ(state(), "a.log.1=5 a.log.2=4 a.log.3=3 a.log.4=2 a.log.5=1 empty.log= ");
  SyncRecorder recorder(root.path(directory.substr(0, directory.size() - 1)));
  root.write(directory + "a.log", "6");
  recorder.fail("rename a.log.4", 1, EIO);
  support->rollCarewellLogs();
  EXPECT_EQ(state(), "a.log=6 a.log.1=5 a.log.2=4 a.log.3=3 a.log.4=2 a.log.5=1 empty.log= ");
  EXPECT_EQ(log.errors().size(), 1u);
}

}  // namespace
}  // namespace quorlet
