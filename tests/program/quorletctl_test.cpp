// quorletctl, run as its users run it.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <map>
#include <nlohmann/json.hpp>
#include <string>
#include <utility>
#include <vector>

#include "fakes/temp_root.h"
#include "program/run_program.h"

namespace quorlet {
namespace {

using Words = std::vector<std::string>;
using Json = nlohmann::json;

constexpr char kPending[] = "/var/mobile/Library/Logs/Diagwell/pending/";
constexpr char kOutbox[] = "/var/mobile/Library/Logs/Diagwell/outbox/";
constexpr char kPreferences[] = "/var/mobile/Library/Preferences/";
constexpr char kWhitelist[] = "/Library/Application Support/TallyLedger/Whitelist_Zed.plist";

constexpr char kStore[] = "/var/mobile/Library/TallyLedger/TLDataStore.sqlitedb";

class QuorletctlTest : public testing::Test {
 protected:
  ProgramResult run(Words words, std::string input = {}) const {
    return RunProgram(QUORLETCTL_PROGRAM, std::move(words),
                      {{{"QUORLET_ROOT", device.directory()}}, std::move(input)});
  }

  // What a command that must succeed silently prints.
  std::string outputOf(Words words, std::string input = {}) const {
    const ProgramResult result = run(words, std::move(input));
    EXPECT_EQ(result.status, 0) << testing::PrintToString(words) << result.err;
    EXPECT_EQ(result.err, "") << testing::PrintToString(words);
    return result.out;
  }

  // A command that must fail with one line that says `why`.
  void expectFailure(const Words& words, int status, const std::string& why,
                     std::string input = {}) const {
    const ProgramResult result = run(words, std::move(input));
    const std::string shown = testing::PrintToString(words) + ": " + result.err;
    EXPECT_EQ(result.status, status) << shown;
    EXPECT_EQ(result.err.find("quorletctl: "), 0U) << shown;
    EXPECT_EQ(std::ranges::count(result.err, '\n'), 1) << shown;
    EXPECT_NE(result.err.find(why), std::string::npos) << shown;
  }

  void expectLatest(const std::string& name) const {
    const std::string log = outputOf({"logs", "show", "latest"});
    EXPECT_EQ(log.substr(log.find('\n') + 1), name);
  }

  // Every path below the root with its time of change and, of a file, its bytes.
  auto everything() const {
    std::map<std::string, std::pair<std::filesystem::file_time_type, std::string>> found;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(device.directory())) {
      const std::string path = entry.path().string().substr(device.directory().size());
      found[path] = {entry.last_write_time(), entry.is_regular_file() ? device.read(path) : ""};
    }
    return found;
  }

  TempRoot device;
};

TEST_F(QuorletctlTest, WrongUsageGetsOneLineAndStatusTwo) {
  const std::vector<std::pair<Words, std::string>> cases = {
      {{"tally", "sett", "k", "1"}, "sett (see: quorletctl tally --help)"},
      {{"tally", "set", "k", "9223372036854775808"}, "not a whole number"},
      {{"tally", "add", "k", "1", "--day", "010x"}, "not a day number"},
      {{"tally", "dump", "--day", "2026-02-29"}, "not a day number"},
      {{"tally", "record", "k", "1", "--day", "1969-12-31"}, "before 1970"},
      {{"tally", "set", "k", "1", "--day", "-1"}, "before 1970"},
      {{"report", "preview", "--day", "9999-12-31"}, "in the future"},
      {{"send", "run-day", "2147483647"}, "in the future"},
      {{"tally", "record", "k", "1e999"}, "not a number: 1e999"},
      {{"tally", "record", "k", "1", "--second", "86400"}, "not a second of the day"},
      {{"tally", "dump", "\x1b[31m\nforged"}, "\\x1b[31m\\nforged"},
      {{"prefs", "set", "d", "k", "1 2"}, "not a JSON value"},
      {{"prefs", "set", "d", "k", "1e400"}, "overflow"},
      {{"prefs", "set", "d", "k", "{\"$date\":\"2026-02-30T00:00:00Z\"}"}, "$date"},
      {{"prefs", "set", "d", "k", "{\"$data\":\"AA=A\"}"}, "$data"},
      {{"prefs", "set", "d", "k", std::string(100'000, '[')}, "nested too deeply"},
  };
  for (const auto& [words, why] : cases) expectFailure(words, 2, why);
}

TEST_F(QuorletctlTest, FailuresGetOneLineAndStatusOne) {
  device.write("/cut.plist", "<plist version=\"1.0\"><dict>");
  device.write(std::string(kPreferences) + "damaged.plist", "<plist");
  const std::vector<std::pair<Words, std::string>> cases = {
      {{"prefs", "get", "damaged", "k"}, "damaged"},
      {{"prefs", "get", "../x", "k"}, "not a preference domain: ../x"},
      {{"prefs", "set", std::string(201, 'd'), "k", "1"}, "not a preference domain"},
      {{"prefs", "set", "d", "k", "\"\\u0001\""}, "cannot hold"},
      {{"report", "preview", "--day", "5"}, "nothing to report for day 5"},
      {{"logs", "show", ".hidden"}, "not the name of a log"},
      {{"whitelist", "check", device.path("/cut.plist")}, "cannot parse"},
      {{"tally", "import", device.directory()}, "cannot read"},
      {{"storage", "info"}, "there is no storage drive"},
      {{"storage", "health"}, "there is no drive"},
      {{"storage", "snapshot"}, "there is no storage drive"},
      {{"storage", "advice"}, "there is no storage drive"},
      {{"storage", "vmfreezer"}, "no memory freezer"},
  };
  for (const auto& [words, why] : cases) expectFailure(words, 1, why);

  device.write(kStore, std::string(8192, '\xa5'));
  expectFailure({"tally", "dump"}, 1, "damaged");
  EXPECT_EQ(device.read(kStore), std::string(8192, '\xa5'));
}

// Whoever runs the tests may read everything: a thing of another kind is what cannot be read.
TEST_F(QuorletctlTest, WhatCannotBeReadIsAFailureAndNotEmpty) {
  const auto block = [&](const std::string& path) {
    std::filesystem::remove_all(device.path(path));
    device.write(path, "");
  };
  std::filesystem::create_directories(device.path(kStore));
  expectFailure({"tally", "dump"}, 1, device.path(kStore));
  block("/var/mobile/Library/TallyLedger");
  expectFailure({"tally", "dump"}, 1, device.path(kStore) + ": Not a directory");
  block("/var/mobile/Library/Logs/Diagwell");
  expectFailure({"logs", "list"}, 1, "Diagwell/pending: Not a directory");
  expectFailure({"logs", "show", "latest"}, 1, "Diagwell/pending: Not a directory");
  expectFailure({"logs", "show", "x.log"}, 1, "Not a directory");
  block("/var/db/drivers");
  expectFailure({"channels", "list"}, 1, device.path("/var/db/drivers") + ": Not a directory");
  const std::string lock = device.path(kPreferences) + ".d.lock";
  std::filesystem::create_directories(lock);
  expectFailure({"prefs", "set", "d", "k", "1"}, 1, lock);
  block("/var/mobile/Library/Preferences");
  expectFailure({"prefs", "get", "d", "k"}, 1, "Not a directory");
  expectFailure({"prefs", "list", "d"}, 1, "Not a directory");
}

TEST_F(QuorletctlTest, ASnapshotHeaderThatCannotBeReadIsNotAMissingOne) {
  const auto describe = [&](const std::string& status) {
    device.write("/var/db/drivers/a.plist",
                 "<plist version=\"1.0\"><dict><key>EntryID</key><integer>1</integer>"
                 "<key>ClassName</key><string>FSPStorage</string><key>ExportMethods</key><array>"
                 "<integer>8</integer></array><key>Exports</key><array><dict><key>Selector</key>"
                 "<integer>22</integer><key>Data</key><data>AAAA</data></dict><dict>"
                 "<key>Selector</key><integer>145</integer><key>Data</key><data>AAAA</data>"
                 "<key>SizeStatus</key><integer>" +
                     status + "</integer></dict></array></dict></plist>");
  };
  for (const char* none : {"-536870201", "-536870160"}) {  // unsupported, not found
    describe(none);
    EXPECT_TRUE(outputOf({"storage", "snapshot"}).starts_with("Key: ")) << none;
  }
  describe("-536870212");
  expectFailure({"storage", "snapshot"}, 1, "snapshot header: status 0xe00002bc");
  expectFailure({"storage", "info"}, 1, "does not answer");
}

TEST_F(QuorletctlTest, ADriveThatSleepsOrIsNoneIsSaidToBe) {
  const std::string power = "/sys/class/nvme/nvme0/device/power/runtime_status";
  const std::string broken = "cannot ask the storage drive nvme0: " + ErrnoText(ENOTTY);
  device.write("/dev/nvme0", "");
  for (const char* command : {"info", "health"}) {
    device.write(power, "suspended\n");
    expectFailure({"storage", command}, 1, "the storage drive nvme0 is asleep");
    device.write(power, "active\n");
    expectFailure({"storage", command}, 1, broken);
  }
  // Beside one that tells.
  device.write("/sys/block/mmcblk1/device/type", "MMC\n");
  device.write("/sys/block/mmcblk1/device/life_time", "0x01 0x03\n");
  const ProgramResult partly = run({"storage", "health", "--json"});
  EXPECT_EQ(partly.status, 1);
  EXPECT_EQ(partly.err, "quorletctl: " + broken + "\n");
  EXPECT_EQ(Json::parse(partly.out)["drives"][0]["usedPercent"], 30);
  device.write(power, "suspended\n");
  const ProgramResult note = run({"storage", "health"});
  EXPECT_EQ(note.status, 0);
  EXPECT_NE(note.err.find("nvme0 is asleep"), std::string::npos) << note.err;
  EXPECT_EQ(note.out,
            "drive       used  written  per day  days left   errors\n"
            "mmcblk1  20-30 %  unknown  unknown    unknown  unknown\n"
            "nvme0    unknown  unknown  unknown    unknown  unknown\n");
}

TEST_F(QuorletctlTest, ARootThatIsNoneIsRefused) {
  const std::string missing = device.path("/missing");
  device.write("/file", "");
  const std::pair<std::string, std::string> cases[] = {{"relative", "not an absolute path"},
                                                       {missing, missing + ": No such file"},
                                                       {device.path("/file"), "not a directory"}};
  for (const auto& [root, why] : cases) {
    const auto result =
        RunProgram(QUORLETCTL_PROGRAM, {"tally", "dump"}, {{{"QUORLET_ROOT", root}}, {}});
    EXPECT_EQ(result.status, 1) << root;
    EXPECT_NE(result.err.find(why), std::string::npos) << result.err;
    EXPECT_EQ(std::ranges::count(result.err, '\n'), 1) << result.err;
  }
  EXPECT_EQ(RunProgram(QUORLETCTL_PROGRAM, {"init"}, {{{"QUORLET_ROOT", missing}}, {}}).status, 0);
}

TEST_F(QuorletctlTest, TheLatestLogIsTheLastAggregatedOne) {
  const auto add = [&](const std::string& name, const std::string& type,
                       const std::string& second) {
    device.write(kPending + name, "{\"type\":\"" + type + "\",\"created\":\"2026-03-04T05:06:" +
                                      second + "Z\"}\n" + name);
  };
  add("status-20260304T050609Z-1.log", "225", "09");
  expectLatest("status-20260304T050609Z-1.log");
  add("day-20260304T050607Z-9.log", "193", "07");
  add("day-20260304T050607Z-10.log", "193", "07");
  expectLatest("day-20260304T050607Z-10.log");
  add("a-20260304T050608Z-1.log", "193", "08");
  expectLatest("a-20260304T050608Z-1.log");
}

// Lines that come slowly keep nobody waiting, and neither does output that nobody takes.
TEST_F(QuorletctlTest, APipeHoldsNoLock) {
  outputOf({"tally", "set", "k", "1", "--day", "5"});
  std::string lines;
  for (int i = 0; i < 20'000; ++i) lines += "value\t5\td\t1\t" + std::to_string(i) + "\n";
  outputOf({"tally", "import"}, lines);
  const auto tool = [&](const std::string& words) {
    return "QUORLET_ROOT='" + device.directory() + "' '" QUORLETCTL_PROGRAM "' " + words;
  };
  std::FILE* dump = popen(tool("tally dump 2>/dev/null").c_str(), "r");
  std::FILE* import = popen((tool("tally import") + " >/dev/null").c_str(), "w");
  ASSERT_TRUE(dump != nullptr && import != nullptr);
  char first = 0;
  EXPECT_EQ(std::fread(&first, 1, 1, dump), 1U);  // it is in the middle of its answer
  EXPECT_GT(std::fputs("scalar\t5\tslow\t1\n", import), 0);
  std::fflush(import);
  const auto start = std::chrono::steady_clock::now();
  outputOf({"tally", "add", "k", "1", "--day", "5"});
  EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(4));
  EXPECT_EQ(pclose(import), 0);
  pclose(dump);
  EXPECT_EQ(outputOf({"tally", "dump", "--day", "5"}).find("scalar\t5\tk\t2\nscalar\t5\tslow"), 0U);
}

TEST_F(QuorletctlTest, DaysHaveNames) {
  const auto dumped = [&](const std::string& day) {
    return outputOf({"tally", "dump", "--day", day});
  };
  outputOf({"tally", "set", "k", "1", "--day", "1970-03-01"});
  EXPECT_EQ(dumped("59"), "scalar\t59\tk\t1\n");
  outputOf({"tally", "set", "k", "2", "--day", "yesterday"});
  outputOf({"tally", "set", "k", "3"});
  EXPECT_TRUE(dumped("today").ends_with("k\t3\n"));
  EXPECT_TRUE(dumped("yesterday").ends_with("k\t2\n"));
}

TEST_F(QuorletctlTest, ScalarsAreAddedAndValuesRecordedInOrder) {
  outputOf({"tally", "set", "top", "9223372036854775807", "--day", "20000"});
  outputOf({"tally", "add", "top", "1", "--day", "20000"});
  outputOf({"tally", "set", "--day", "9", "--", "-dash", "-3"});
  outputOf({"tally", "add", "--day", "9", "--", "-dash", "-4"});
  outputOf({"tally", "record", "d", "2.5", "-3", "1e3", "--day", "9", "--second", "60"});
  outputOf({"tally", "record", "d", "--day", "9", "--second", "0", "--", "-inf", "nan"});
  EXPECT_EQ(outputOf({"tally", "dump", "--day", "20000"}),
            "scalar\t20000\ttop\t9223372036854775807\n");
  EXPECT_EQ(Json::parse(outputOf({"tally", "dump", "--json", "--day", "9"})),
            Json::parse(R"({"schema": 1, "scalars": [{"day": 9, "key": "-dash", "value": -7}],
                "distributions": [{"day": 9, "key": "d", "values":
                [[60, 2.5], [60, -3], [60, 1000], [0, null], [0, null]]}]})"));
}

// Lines in the order of a dump, with what is hard to carry.
constexpr char kHardLines[] =
    "scalar\t-3\t\t-9223372036854775808\nscalar\t5\ta\\tb\\nc\\\\d\\x00\\xff\\x1b\t1\n"
    "scalar\t6\ta\\tb\\nc\\\\d\\x00\\xff\\x1b\t2\nscalar\t20000\t\xc3\xbc\t0\n"
    "value\t5\td\t86399\t5e-324\nvalue\t5\td\t0\t0.1\nvalue\t5\td\t0\t-0\n"
    "value\t5\td\t0\t1.7976931348623157e+308\nvalue\t5\td\t1\tnan\nvalue\t5\td\t1\tinf\n"
    "value\t6\td\\rx\t1\t-inf\n";

TEST_F(QuorletctlTest, ADumpCanBeImportedAgain) {
  EXPECT_EQ(outputOf({"tally", "import"}, kHardLines), "imported 4 scalars and 7 values\n");
  EXPECT_EQ(outputOf({"tally", "dump"}), kHardLines);
  const Json json = Json::parse(outputOf({"tally", "dump", "--json"}));
  EXPECT_EQ(json["scalars"][1]["key"], Json::parse(R"({"$data": "YQliCmNcZAD/Gw=="})"));
  const ProgramResult full = RunProgram(QUORLETCTL_PROGRAM, {"tally", "dump"},
                                        {{{"QUORLET_ROOT", device.directory()}}, {}, "/dev/full"});
  EXPECT_EQ(full.status, 1);
  EXPECT_NE(full.err.find("No space left"), std::string::npos) << full.err;
}

TEST_F(QuorletctlTest, AnImportWithAWrongLineImportsNothing) {
  outputOf({"tally", "set", "k", "1", "--day", "5"});
  const std::vector<std::pair<std::string, std::string>> wrongLines = {
      {"scalar 5 k 1", "starts with neither"},
      {"scalar\t5\tk\t1\t", "four fields"},
      {"scalar\t5\tk\t1\r", "whole number"},
      {"scalar\t-2147483648\tk\t1", "day number"},
      {"scalar\t2147483647\tk\t1", "day number"},
      {"scalar\t5\tk\\x4\t1", "backslash"},
      {"value\t5\tk\t-1\t1", "second of the day"},
      {"value\t5\tk\t1\t1,5", "not a number"},
      {"scalar\t5\t" + std::string(2 << 20, 'k') + "\t1", "too long"},
  };
  for (const auto& [line, why] : wrongLines) {
    const std::string input =
        "scalar\t5\tk\t2\nvalue\t5\td\t1\t1\n" + line + "\nscalar\t5\tother\t1\n";
    expectFailure({"tally", "import"}, 1, why, input);
  }
  EXPECT_EQ(outputOf({"tally", "dump"}), "scalar\t5\tk\t1\n");
}

TEST_F(QuorletctlTest, PreferencesSurviveAsJson) {
  const std::vector<std::string> values = {"-9223372036854775808",
                                           "18446744073709551615",
                                           "0.1",
                                           R"("line\nbreak \u00fc \"quoted\"")",
                                           R"([1,[false,{"a":{"b":"c"}}],"x"])",
                                           R"({"when":{"$date":"0999-12-31T23:59:59Z"}})",
                                           R"({"$data":""})",
                                           R"({"$data":"AAEC/w=="})"};
  Json all;
  for (const std::string& value : values) {
    const std::string key = "key " + std::to_string(all.size());
    outputOf({"prefs", "set", "nuvex.test", key, value});
    EXPECT_EQ(outputOf({"prefs", "get", "nuvex.test", key}), value + "\n");
    all[key] = Json::parse(value);
  }
  EXPECT_EQ(Json::parse(outputOf({"prefs", "list", "nuvex.test", "--json"})), all);
  const std::string file = device.read(std::string(kPreferences) + "nuvex.test.plist");
  EXPECT_NE(file.find("<date>0999-12-31T23:59:59Z"), std::string::npos) << file;
  outputOf({"prefs", "remove", "nuvex.test", "key 0"});
  expectFailure({"prefs", "get", "nuvex.test", "key 0"}, 1, "nuvex.test has no value for key 0");
}

TEST_F(QuorletctlTest, ReadingCommandsLeaveNothingBehind) {
  for (const Words& words :
       {Words{"tally", "dump"}, Words{"prefs", "get", "d", "k"}, Words{"prefs", "list", "d"},
        Words{"report", "preview"}, Words{"logs", "list"}, Words{"logs", "show", "latest"},
        Words{"whitelist", "check"}, Words{"prefs", "set", "d", "k", "null"}}) {
    run(words);
    EXPECT_TRUE(everything().empty()) << testing::PrintToString(words);
  }
}

// Whatever bytes come from outside: JSON stays JSON, and no terminal is given a control byte.
TEST_F(QuorletctlTest, HostileBytesAreShownHarmlessly) {
  const std::string hostile = "\x1b]0;title\x07 \xc2\x9bJ \x7f \xff\r\n\t\\";
  outputOf({"tally", "set", hostile, "1"});
  outputOf({"tally", "record", hostile, "1"});
  outputOf({"prefs", "set", "d", "k", R"("\u009b\u007f\u0085")"});
  device.write(
      std::string(kPending) + "x.log",
      "{\"type\":\"\\u001b\\u009b\",\"created\":\"2026-03-01\\u001bT00:00:00Z\"}\nbody " + hostile);
  device.write(
      "/list.plist",
      "<plist version=\"1.0\"><dict><key>g\xc2\x9b\x7f</key><dict><key>ScalarKeys</key><dict>"
      "<key>k\xc2\x85</key><dict><key>why</key><string>\xc2\x90\x7f</string></dict></dict>"
      "</dict></dict></plist>");
  for (Words words : {Words{"tally", "dump"}, Words{"prefs", "list", "d"}, Words{"logs", "list"},
                      Words{"whitelist", "check", device.path("/list.plist")}}) {
    const std::string text = outputOf(words);
    for (const char* control : {"\x1b", "\x07", "\xc2\x9b", "\xc2\x85", "\xc2\x90", "\x7f", "\r"}) {
      EXPECT_EQ(text.find(control), std::string::npos) << words.front() << Json(control);
    }
    words.push_back("--json");
    EXPECT_TRUE(Json::accept(outputOf(words))) << words.front();
  }
  EXPECT_TRUE(Json::accept(outputOf({"logs", "show", "x.log", "--json"})));
}

TEST_F(QuorletctlTest, InitKeepsWhatIsThere) {
  device.write(std::string(kPreferences) + "nuvex.diagwell.plist", "mine");
  outputOf({"init"});
  EXPECT_TRUE(device.exists(kOutbox));
  EXPECT_FALSE(device.exists(kWhitelist));
  outputOf({"init", "--demo"});
  const auto before = everything();
  EXPECT_EQ(device.read(std::string(kPreferences) + "nuvex.diagwell.plist"), "mine");
  outputOf({"init", "--demo"});
  EXPECT_EQ(everything(), before);
}

TEST_F(QuorletctlTest, SampleDataStaysOutOfTheMachinesOwnRoot) {
  for (const char* root : {"", "/"}) {
    const ProgramResult result =
        RunProgram(QUORLETCTL_PROGRAM, {"init", "--demo"}, {{{"QUORLET_ROOT", root}}, {}});
    EXPECT_EQ(result.status, 1);
    EXPECT_NE(result.err.find("set QUORLET_ROOT"), std::string::npos) << result.err;
  }
}

// The document without the date of its creation.
std::string Undated(std::string document) {
  const std::size_t key = document.find("<key>TLLogCreationDate</key>");
  EXPECT_NE(key, std::string::npos) << document;
  const std::size_t end = document.find("</date>", key);
  return document.erase(key, end - key);
}

TEST_F(QuorletctlTest, ThePreviewIsThePassesDocumentAndLeavesNoTrace) {
  outputOf({"init", "--demo"});
  const auto before = everything();
  const std::string preview = outputOf({"report", "preview"});
  EXPECT_EQ(preview.find("nuvex.demo.unlisted"), std::string::npos);
  const Json asJson = Json::parse(outputOf({"report", "preview", "--json"}));
  EXPECT_EQ(asJson["TLScalars"]["nuvex.demo.launches"], 1200);
  EXPECT_EQ(asJson["TLDistributionsHistogram"]["nuvex.demo.launch.milliseconds"].size(), 5U);
  EXPECT_EQ(everything(), before);

  RunProgram(QUORLET_PROGRAM, {"-d"}, {{{"QUORLET_ROOT", device.directory()}}, {}});
  const std::string log = outputOf({"logs", "show", "latest"});
  EXPECT_EQ(Undated(log.substr(log.find('\n') + 1)), Undated(preview));
}

TEST_F(QuorletctlTest, APreviewsMessagesStayOutOfTheDocument) {
  device.write(kWhitelist,
               "<plist version=\"1.0\"><dict><key>g</key><dict><key>ScalarKeys</key><dict>"
               "<key>bad\nkey</key><string>x</string><key>good</key><dict/></dict></dict>"
               "<key>flat</key><true/></dict></plist>");
  outputOf({"tally", "set", "good", "7", "--day", "100"});
  const ProgramResult result = run({"report", "preview", "--day", "100", "--json"});
  EXPECT_EQ(result.status, 0);
  EXPECT_EQ(Json::parse(result.out)["TLScalars"], Json::parse(R"({"good": 7})"));
  // One for each entry that was skipped, and the notes on the day's age and on submission.
  EXPECT_EQ(std::ranges::count(result.err, '\n'), 4) << result.err;
  EXPECT_NE(result.err.find("more than 30 days old"), std::string::npos) << result.err;
  EXPECT_NE(result.err.find("bad\\nkey"), std::string::npos) << result.err;
}

TEST_F(QuorletctlTest, WhitelistCheckShowsWhatDoesNotWork) {
  device.write("/bad.plist", R"(<plist version="1.0"><dict><key>Bad</key><dict>
      <key>ScalarKeys</key><dict><key>works</key><dict/><key>text</key><string>x</string>
        <key>slip</key><dict><key>sig_figs</key><integer>1</integer></dict></dict>
      <key>ScalarKey</key><dict/></dict><key>Flat</key><integer>1</integer></dict></plist>)");
  const std::string path = device.path("/bad.plist");
  const ProgramResult result = run({"whitelist", "check", path});
  EXPECT_EQ(result.status, 1);
  EXPECT_EQ(result.err, "") << "the answer is no, which is no error";
  EXPECT_NE(result.out.find("slip: \"sig_figs\" is not an option, did you mean \"sig_fig\"?"),
            std::string::npos)
      << result.out;
  const Json json = Json::parse(run({"whitelist", "check", path, "--json"}).out);
  std::vector<std::string> keys;
  for (const Json& group : json["groups"]) {
    for (const Json& fault : group["faults"]) keys.push_back(fault["key"]);
  }
  std::ranges::sort(keys);
  EXPECT_EQ(keys, (Words{"", "ScalarKey", "slip", "text"}));
}

TEST_F(QuorletctlTest, ExplainShowsWhatALogWouldHold) {
  device.write(kWhitelist, R"(<plist version="1.0"><dict><key>G</key><dict>
      <key>ScalarKeys</key><dict><key>old</key><dict><key>expires</key><string>2020-01-01</string>
        </dict></dict>
      <key>ScalarKeyPrefixes</key><dict><key>o</key><dict/><key>s.</key><dict>
        <key>sig_fig</key><integer>1</integer></dict></dict>
      <key>DistributionKeys</key><dict><key>s.d</key><dict><key>intervals</key><array>
        <integer>1</integer><integer>5</integer></array></dict></dict></dict></dict></plist>)");
  const std::tuple<Words, int, std::string> cases[] = {
      {{"s.d", "1234"},
       0,
       "scalar: prefix s.  sig_fig=1\n  reported: 1000\n"
       "distribution: key s.d  intervals=[1,5]\n"
       "  reported: counted in (5, inf), and summed up with the day's values\n"},
      {{"old", "3"}, 1, "scalar: key old  expires=\"2020-01-01\"  EXPIRED\n"},
      {{"none"}, 1, "no entry names none: it is not reported\n"},
  };
  for (const auto& [arguments, status, out] : cases) {
    Words words = {"whitelist", "explain"};
    words.insert(words.end(), arguments.begin(), arguments.end());
    const ProgramResult result = run(words);
    EXPECT_EQ(std::tie(result.status, result.out), std::tie(status, out)) << result.err;
    EXPECT_EQ(result.err, "");
  }
  device.write(kWhitelist, "cut");
  expectFailure({"whitelist", "explain", "k"}, 1, "parse");
}

TEST_F(QuorletctlTest, StatusNamesWhatIsWrongAndItsRemedy) {
  const auto states = [&](int status) {
    const ProgramResult result = run({"status", "--json"});
    EXPECT_EQ(result.status, status);
    EXPECT_EQ(result.err, "");
    std::map<std::string, std::string> found;
    std::string order;
    const Json document = Json::parse(result.out);
    for (const Json& check : document["checks"]) {
      const std::string name = check["name"];
      const std::string remedy = check["remedy"];
      found[name] = check["state"];
      EXPECT_EQ(remedy.empty(), found[name] == "ok") << name;
      order += name + " ";
    }
    EXPECT_EQ(order,
              "root permissions consent whitelist store last-pass spool structured-log clock "
              "service storage units ");
    return found;
  };
  auto found = states(0);
  EXPECT_EQ(found["consent"] + found["whitelist"], "warningwarning");
  run({"init", "--demo"});
  run({"tally", "add", "nuvex.demo.launches", "1", "--day",
       std::to_string(std::time(nullptr) / 86400 - 4)});
  EXPECT_EQ(states(0)["last-pass"], "warning");
  EXPECT_EQ(std::ranges::count(outputOf({"report", "close-missing"}), '\n'), 1);
  EXPECT_EQ(outputOf({"report", "close-missing"}), "");
  device.write("/run/systemd/system/quorlet.socket", "");
  device.write("/etc/systemd/system/timers.target.wants/quorlet-daily.timer", "");
  found = states(0);
  EXPECT_EQ(found["service"] + found["units"], "okwarning");
  device.write("/usr/lib/systemd/system/quorlet-daily.timer", "");
  EXPECT_EQ(states(0)["units"], "ok");
  run({"prefs", "set", "nuvex.aggregated.quorlet", "LastCrashLogSerializationDateInDaysSince1970",
       "30000"});
  std::string store = device.read(kStore);
  std::filesystem::remove(device.path(std::string(kStore) + "-wal"));  // it has the pages as well
  store.replace(store.size() / 2, store.size() / 4, store.size() / 4, 'x');
  device.write(kStore, store);
  device.write(kWhitelist, "cut");
  run({"prefs", "set", "nuvex.diagwell", "SubmissionEnabled", "1"});
  const auto before = everything();
  found = states(1);
  EXPECT_EQ(everything(), before);
  for (const char* name : {"consent", "whitelist", "store", "last-pass"}) {
    EXPECT_EQ(found[name], "error") << name;
  }
  EXPECT_EQ(run({"status"}).out.substr(0, 8), "ok root ");
}

TEST_F(QuorletctlTest, ConsentIsGivenOnceAndWithdrawnWhole) {
  const std::string domain = "nuvex.diagwell";
  run({"prefs", "remove", domain, "SubmissionEnabled"});
  EXPECT_EQ(run({"consent", "status"}).out + run({"consent", "status"}).err, "off\n");
  EXPECT_EQ(run({"logs", "submit"}).status, 1);
  run({"tally", "add", "counted.before", "1"});
  EXPECT_EQ(run({"consent", "on"}).status, 0);
  EXPECT_EQ(run({"tally", "dump"}).out, "");
  run({"tally", "add", "counted.after", "1"});
  EXPECT_EQ(run({"consent", "on"}).status, 0);
  EXPECT_NE(run({"tally", "dump"}).out.find("counted.after"), std::string::npos);
  EXPECT_EQ(run({"consent", "status", "--json"}).out, "{\"consent\":\"on\",\"text\":\"on\"}\n");
  device.write("/var/mobile/Library/Logs/Diagwell/pending/a.log", "{}\n");
  EXPECT_EQ(run({"logs", "submit"}).status, 0);
  EXPECT_TRUE(device.exists("/var/mobile/Library/Logs/Diagwell/outbox/a.log"));
  EXPECT_EQ(run({"consent", "off"}).status, 0);
  EXPECT_FALSE(device.exists("/var/mobile/Library/Logs/Diagwell/outbox/a.log"));
  run({"prefs", "set", domain, "SubmissionEnabled", "1"});
  EXPECT_EQ(run({"consent", "status"}).status, 1);
}

TEST_F(QuorletctlTest, WhatRootCreatesBelongsToTheOwnerOfItsDirectory) {
  if (geteuid() != 0) GTEST_SKIP() << "only root gives files away";
  constexpr uid_t kOwner = 1234;
  constexpr gid_t kGroup = 1235;
  const std::string library = device.path("/var/mobile/Library");
  const std::string store = library + "/TallyLedger";
  const std::string linked = device.path("/victim");
  device.write("/victim", "kept");
  std::filesystem::create_directories(store);
  for (const std::string& directory : {library, store}) {
    ASSERT_EQ(chown(directory.c_str(), kOwner, kGroup), 0);
  }
  ASSERT_EQ(chmod(store.c_str(), 02770), 0);
  const mode_t before = umask(077);
  outputOf({"tally", "add", "k", "5"});
  outputOf({"prefs", "set", "d", "k", "5"});
  outputOf({"consent", "on"});
  umask(before);
  int files = 0;
  for (const auto& entry : std::filesystem::recursive_directory_iterator(library)) {
    struct stat status = {};
    ASSERT_EQ(lstat(entry.path().c_str(), &status), 0);
    EXPECT_TRUE(status.st_uid == kOwner && status.st_gid == kGroup) << entry.path();
    const bool isInStore = entry.path().parent_path() == store;
    const mode_t file = isInStore ? 0660 : 0640;
    const mode_t directory = entry.path() == store ? 02770 : 0750;
    EXPECT_EQ(status.st_mode & 07777U, entry.is_directory() ? directory : file) << entry.path();
    files += entry.is_directory() ? 0 : 1;
  }
  EXPECT_GE(files, 6) << "the store with its log and lock, two domains with theirs";

  // A link where a domain's file belongs is neither read nor written through.
  std::filesystem::create_symlink(linked, library + "/Preferences/other.plist");
  EXPECT_EQ(run({"prefs", "list", "other"}).status, 1);
  EXPECT_EQ(run({"prefs", "set", "other", "k", "1"}).status, 1);
  EXPECT_EQ(device.read("/victim"), "kept");
}

}  // namespace
}  // namespace quorlet
