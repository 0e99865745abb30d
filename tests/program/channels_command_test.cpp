// quorletctl channels, over a driver file and a recorded machine.
#include <gtest/gtest.h>
#include <pty.h>

#include <algorithm>
#include <nlohmann/json.hpp>
#include <thread>

#include "fakes/temp_root.h"
#include "program/run_program.h"

namespace quorlet {
namespace {

using Words = std::vector<std::string>;
using Json = nlohmann::json;

// Three channels whose names no terminal must see: simple (42 events), state (2.5 and 7.5 ms) and
// array.
constexpr char kDriver[] =
    R"(<plist version="1.0"><dict><key>EntryID</key><integer>7</integer>
<key>EntryName</key><string>drv</string><key>Properties</key><dict>
<key>DrvReportLegendPublic</key><true/><key>DrvReportLegend</key><array>
<dict><key>DrvReportGroupName</key><string>Events</string>
<key>DrvReportChannelInfo</key><dict><key>DrvReportChannelUnit</key><integer>7205759403792793600</integer></dict>
<key>DrvReportChannels</key><array>
<array><integer>1</integer><integer>4311941121</integer><string>a)"
    "\xc2\x9b\x7f\nb%n\\"
    R"(</string></array></array></dict>
<dict><key>DrvReportGroupName</key><string>Power</string><key>DrvReportSubGroupName</key><string>Radio</string>
<key>DrvReportChannelInfo</key><dict><key>DrvReportChannelUnit</key><integer>72058113728970752</integer></dict>
<key>DrvReportChannels</key><array>
<array><integer>2</integer><integer>8590065666</integer><string>st)"
    "\xc2\x85\n"
    R"(</string></array><array><integer>3</integer><integer>8589934596</integer></array>
</array></dict></array></dict><key>Channels</key><array>
<dict><key>ChannelID</key><integer>1</integer><key>Elements</key><data>BwAAAAAAAAABAAAAAAAAAAEAAwEBAAAAAAAAAAAAAAAqAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAA==</data></dict>
<dict><key>ChannelID</key><integer>2</integer><key>Elements</key><data>
BwAAAAAAAAACAAAAAAAAAAIAAgACAAAAAAAAAAAAAAAAAAAAAABOTwMAAAAAAAAAxAkAAAAAAAAAAAAAAAAAAAcAAAAAAAAA
AgAAAAAAAAACAAIAAgAAAAkAAAAAAAAAAAAAAABGRk8EAAAAAAAAAEwdAAAAAAAAAAAAAAAAAAA=</data></dict>
<dict><key>ChannelID</key><integer>3</integer><key>Elements</key><data>
BwAAAAAAAAADAAAAAAAAAAQAAAACAAAAAAAAAAAAAAABAAAAAAAAAAIAAAAAAAAAAwAAAAAAAAD8/////////wcAAAAAAAAA
AwAAAAAAAAAEAAAAAgAAAAAAAAAAAAAABQAAAAAAAAAAAAAAAAAAgAcAAAAAAAAACAAAAAAAAAA=</data></dict>
</array></dict></plist>)";

class ChannelsCommandTest : public testing::Test {
 protected:
  ChannelsCommandTest() {
    device.write("/var/db/drivers/drv.plist", kDriver);
    device.write("/proc/pressure/io", "some avg10=0.00 avg60=0.00 avg300=0.00 total=500\n");
    device.write("/sys/empty", "");
  }

  ProgramResult run(Words words, const char* program = QUORLETCTL_PROGRAM) const {
    return RunProgram(program, std::move(words), {{{"QUORLET_ROOT", device.directory()}}, {}});
  }
  std::string outputOf(const Words& words) const {
    const ProgramResult result = run(words);
    EXPECT_EQ(result.status, 0) << testing::PrintToString(words) << result.err;
    EXPECT_EQ(result.err, "") << testing::PrintToString(words);
    return result.out;
  }
  // What the program prints on a terminal of 24 lines.
  std::string outputOnTerminal(const std::string& verb, const char* count) const {
    int terminal = -1;
    const pid_t child = forkpty(&terminal, nullptr, nullptr, nullptr);
    if (child == 0) {
      setenv("QUORLET_ROOT", device.directory().c_str(), 1);
      setenv("TERM", "xterm", 1);
      execl(QUORLETCTL_PROGRAM, "quorletctl", "channels", verb.c_str(), count, nullptr);
      _exit(127);
    }
    std::string out;
    char block[4096];
    for (ssize_t size = 0; (size = read(terminal, block, sizeof block)) > 0;) {
      out.append(block, static_cast<std::size_t>(size));
    }
    int status = -1;
    waitpid(child, &status, 0);
    EXPECT_EQ(status, 0) << out;
    close(terminal);
    return out;
  }

  TempRoot device;
};

TEST_F(ChannelsCommandTest, SelectionsNarrowEachOtherDown) {
  const std::pair<Words, Words> cases[] = {
      {{}, {"0x1", "0x2", "0x3", "0x696f2e736f6d6500"}},
      {{"--category", "0x102"}, {"0x1", "0x2", "0x696f2e736f6d6500"}},
      {{"--category", "256", "--group", "Events"}, {"0x1"}},
      {{"--format", "array"}, {"0x3"}},
      {{"--format", "0x2"}, {"0x2"}},
      {{"--subgroup", "Radio", "--format", "state"}, {"0x2"}},
      {{"--unit", "72058113728970752"}, {"0x2", "0x3", "0x696f2e736f6d6500"}},
      {{"--unit", "us"}, {"0x2", "0x3", "0x696f2e736f6d6500"}},
      {{"--id", "0X2"}, {"0x2"}},
      {{"--id", "x"}, {}},
      {{"--group", "Radio"}, {}},
  };
  for (const auto& [options, expected] : cases) {
    Words words = {"channels", "list", "--json"};
    words.insert(words.end(), options.begin(), options.end());
    Words ids;
    const Json json = Json::parse(outputOf(words));
    for (const Json& channel : json["channels"]) ids.push_back(channel["id"]);
    EXPECT_EQ(ids, expected) << testing::PrintToString(options);
  }
  EXPECT_EQ(outputOf({"channels", "list", "--group", "none"}), "");
}

TEST_F(ChannelsCommandTest, WrongOptionsAndNoMatchesGetOneLine) {
  const std::pair<int, Words> cases[] = {
      {2, {"list", "--category", "0x10000"}}, {2, {"list", "--id", "-1"}},
      {2, {"sample", "--format", "states"}},  {2, {"sample", "--unit", "0x"}},
      {2, {"watch", "--interval", "0"}},      {2, {"watch", "--interval", "nan"}},
      {2, {"watch", "--count", "0"}},         {1, {"sample", "--group", "none"}},
      {1, {"watch", "--id", "99"}},
  };
  for (auto [status, words] : cases) {
    words.insert(words.begin(), "channels");
    const ProgramResult result = run(words);
    EXPECT_EQ(result.status, status) << testing::PrintToString(words) << result.err;
    EXPECT_EQ(std::ranges::count(result.err, '\n'), 1) << result.err;
    EXPECT_EQ(result.out, "") << testing::PrintToString(words);
  }
}

TEST_F(ChannelsCommandTest, SamplesAreShownLineByLineWithoutControlBytes) {
  const std::string name = R"(a\xc2\x9b\x7f\nb%n\\)";
  EXPECT_EQ(outputOf({"channels", "list", "--id", "1"}),
            "drv <id 0x7> " + name +
                " < 0x1 (events) | G/g Events/(none) | cat 0x103 | format 0x01 | elts 1 >\n");
  EXPECT_EQ(outputOf({"channels", "sample"}),
            std::string(23, ' ') + name + " = {           42 events }\n" + std::string(15, ' ') +
                R"(st\xc2\x85\n[      ON] = { # 3        2.500e-03 s / 25.0% })" + "\n" +
                std::string(15, ' ') +
                R"(st\xc2\x85\n[     OFF] = { # 4        7.500e-03 s / 75.0% })" + "\n" +
                std::string(29, ' ') + "0x3[0] = { 1 2 3 -4 us }\n" + std::string(29, ' ') +
                "0x3[4] = { 5 - 7 8 us }\n" + std::string(16, ' ') +
                "pressure.io.some = {          500 us }\n");
  const Json json = Json::parse(outputOf({"channels", "sample", "--json"}));
  EXPECT_EQ(json["channels"][0]["name"], "a\u009b\x7f\nb%n\\");
  EXPECT_EQ(json["channels"][0]["value"], 42);
  EXPECT_EQ(json["channels"][1]["states"][1]["share"], 0.75);
  for (const char* verb : {"list", "sample", "watch"}) {
    std::string shown =
        outputOnTerminal(verb, verb == std::string("watch") ? "--count=1" : nullptr);
    EXPECT_EQ(shown.find("[#####"),
              verb == std::string("sample") ? shown.rfind("[#####....") : std::string::npos);
    // The terminal's line ends, and what places the table, are the program's own.
    for (const char* own : {"\r\n", "\x1b[H", "\x1b[2J", "\x1b[K", "\x1b[J"}) {
      for (std::size_t at; (at = shown.find(own)) != std::string::npos;) {
        shown.erase(at, std::string(own).size());
      }
    }
    for (const char* control : {"\x1b", "\x7f", "\n", "\r", "\xc2\x9b", "\xc2\x85"}) {
      EXPECT_EQ(shown.find(control), std::string::npos) << verb << Json(control);
    }
  }
}

TEST_F(ChannelsCommandTest, AWatchAddsUp) {
  std::thread machine([this] {
    for (int total = 501; total <= 560; ++total) {
      device.write("/proc/pressure/next", "some avg10=0.00 total=" + std::to_string(total) + "\n");
      std::filesystem::rename(device.path("/proc/pressure/next"), device.path("/proc/pressure/io"));
      std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
  });
  std::istringstream lines(
      outputOf({"channels", "watch", "--interval", "0.05", "--count", "5", "--json"}));
  machine.join();
  std::vector<std::int64_t> values;
  for (std::string line; std::getline(lines, line);) {
    const Json json = Json::parse(line);
    EXPECT_GT(json["seconds"], 0);
    const Json& pressure = json["channels"][3];
    const std::int64_t before =
        pressure["value"].get<std::int64_t>() - pressure["delta"]["value"].get<std::int64_t>();
    EXPECT_EQ(before, values.empty() ? before : values.back());
    values.push_back(pressure["value"]);
    EXPECT_EQ(json["channels"][0]["delta"]["value"], 0);
    EXPECT_EQ(json["channels"][0]["value"], 42);
  }
  ASSERT_EQ(values.size(), 5U);
  EXPECT_GT(values.back(), values.front());
  const ProgramResult stopped = run({"--preserve-status", "-s", "INT", "0.5", QUORLETCTL_PROGRAM,
                                     "channels", "watch", "--interval", "60"},
                                    "/usr/bin/timeout");
  EXPECT_EQ(stopped.status, 0) << stopped.err;
  EXPECT_EQ(stopped.out + stopped.err, "");
}

}  // namespace
}  // namespace quorlet
