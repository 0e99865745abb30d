// quorletctl logs export, as a fleet's loader sees it.
#include <gtest/gtest.h>
#include <pty.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <sstream>
#include <string>
#include <vector>

#include "fakes/temp_root.h"
#include "program/run_program.h"

namespace quorlet {
namespace {

constexpr char kHeader[] =
    R"json({"type":"193","created":"2026-03-05T00:00:01Z","os_version":"OS 1 (A)"})json"
    "\n";
constexpr char kShared[] =
    R"json("day":"2026-03-04","created":"2026-03-05T00:00:01Z","os_version":"OS 1 (A)","log":"193",)json";

// An aggregated log with these parts of its document.
std::string Log(const std::string& parts, const std::string& header = kHeader) {
  return header + "<plist><dict><key>TLStartDate</key><date>2026-03-04T00:00:00Z</date>" + parts +
         "</dict></plist>";
}
std::string Scalars(const std::string& entries) {
  return "<key>TLScalars</key><dict>" + entries + "</dict>";
}
std::string Figures(const std::string& minimum, const std::string& count) {
  return "<key>TLDistributions</key><dict><key>d</key><array><real>" + minimum +
         "</real><real>9</real><real>4.5</real><real>nan</real><integer>" + count +
         "</integer></array></dict>";
}
std::string Buckets(const std::vector<std::string>& labels) {
  std::string text = "<key>TLDistributionsHistogram</key><dict><key>d</key><dict>";
  for (const std::string& label : labels) {
    text += "<key>" + label + "</key><integer>2</integer>";
  }
  return text + "</dict></dict>";
}
const std::string kOne = Scalars("<key>k</key><integer>1</integer>");

class LogsExportTest : public testing::Test {
 protected:
  ProgramResult run(std::vector<std::string> words) const {
    words.insert(words.begin(), {"logs", "export"});
    return RunProgram(QUORLETCTL_PROGRAM, std::move(words),
                      {{{"QUORLET_ROOT", device.directory()}}, {}});
  }
  std::string rowsOf(const std::string& log, const std::string& format = "ndjson") const {
    device.write("/x.log", log);
    const auto result = run({"--device", "none", "--format", format, device.path("/x.log")});
    EXPECT_EQ(result.status, 0) << result.err;
    return result.out;
  }
  TempRoot device;
};

TEST_F(LogsExportTest, EveryKindOfFigureBecomesARow) {
  const std::string start = R"({"schema":"quorlet.metrics/1",)" + std::string(kShared);
  const std::vector<std::pair<std::string, std::string>> cases = {
      {Scalars("<key>a\"&#10;é</key><integer>18446744073709551615</integer>"),
       R"("kind":"scalar","key":"a\"\né","value":18446744073709551615})"},
      {Scalars("<key>nuvex.kernel.swapusage</key><real>-inf</real>"),
       R"("kind":"scalar","key":"nuvex.kernel.swapusage","unit":"By","value":null})"},
      {Scalars("<key>datausage.wifiInKB.nuvex.x.y</key><integer>-9007199254740993</integer>"),
       R"("kind":"scalar","key":"datausage.wifiInKB.nuvex.x.y","unit":"KiBy",)"
       R"("value":-9007199254740993})"},
      {Figures("0.1", "4"),
       R"("kind":"distribution","key":"d","min":0.1,"max":9,"mean":4.5,"m2":null,"count":4})"},
      // Byte order of the labels is another one.
      {Buckets({"(-inf, -5]", "(-5, 9007199254740993]", "(100, inf)", "(20, 100]"}),
       R"("kind":"histogram","key":"d","lower":[null,-5,20,100],)"
       R"("upper":[-5,9007199254740993,100,null],"counts":[2,2,2,2]})"},
  };
  for (const auto& [parts, row] : cases) EXPECT_EQ(rowsOf(Log(parts)), start + row + "\n");
  EXPECT_EQ(rowsOf(Log("<key>TLWhitelistDigest</key><string>w</string>"
                       "<key>TLTaskID</key><string>(no tasking id)</string>" +
                       kOne)),
            start + R"("whitelist":"w","kind":"scalar","key":"k","value":1})" + "\n");

  const std::string status = R"({"type":"165","created":"2026-03-05T00:00:01Z"})"
                             "\nSystem ID: a]: b:1\n\n2026-03-05 00:00:01 +0000 quorlet[1]: "
                             "UserWamp:2.50;ValidityList[0]:3;x:nan;y:-7\n";
  std::string rows;
  for (const char* row :
       {R"("UserWamp","unit":"1","value":2.5)", R"("ValidityList[0]","value":"3")",
        R"("x","value":null)", R"("y","value":-7)"}) {
    rows += R"({"schema":"quorlet.metrics/1","day":"2026-03-05","created":"2026-03-05T00:00:01Z",)"
            R"("log":"165","kind":"status","key":)" +
            std::string(row) + "}\n";
  }
  EXPECT_EQ(rowsOf(status), rows);
}

TEST_F(LogsExportTest, BucketsOfOtlpCoverTheLineOrAreLeftOut) {
  const auto buckets = [](const std::string& counts, const std::string& bounds) {
    return R"("bucketCounts":[)" + counts + R"(],"explicitBounds":[)" + bounds + "]";
  };
  const std::vector<std::pair<std::vector<std::string>, std::string>> cases = {
      {{"(-inf, 5]", "(5, inf)"}, buckets(R"("2","2")", "5")},
      {{"(20, 40]", "(5, 10]"}, buckets(R"("0","2","0","2","0")", "5,10,20,40")},
      {{"(0, 10]", "(5, 20]"}, ""},      // overlap
      {{"(30, 20]", "(-inf, 10]"}, ""},  // descend
      {{"(-inf, 5]"}, ""},               // do not add up to the count
  };
  for (const auto& [labels, expected] : cases) {
    const std::string line = rowsOf(Log(Figures("0", "4") + Buckets(labels)), "otlp-json");
    EXPECT_NE(line.find(R"("count":"4","sum":18,"min":0,"max":9)" +
                        (expected.empty() ? "}]" : "," + expected + "}]")),
              std::string::npos)
        << line;
    EXPECT_EQ(line.find("m2"), std::string::npos) << line;
  }
  EXPECT_EQ(rowsOf(Log(Figures("-1", "4")), "otlp-json").find("sum"), std::string::npos);
  EXPECT_EQ(rowsOf(Log(Scalars("<key>k</key><real>inf</real>")), "otlp-json"), "");
}

TEST_F(LogsExportTest, WhatCannotBeReadCostsOnlyItself) {
  const std::string whole = Log(kOne);
  const std::vector<std::pair<std::string, std::string>> bad = {
      {"", "line of JSON"},
      {"[]\n", "line of JSON"},
      {"{\"type\":\"193\"}\n", "is empty"},
      {Log(kOne, "{\"type\":\"193\"}\n"), "created"},
      {whole.substr(0, whole.size() - 3), "ends inside"},
      {std::string(kHeader) + "<plist><dict/></plist>", "start date"},
      {Log("<key>TLScalars</key><array/>"), "no dictionary"},
      {Log(Scalars("<key>k</key><string>1</string>")), "scalar k"},
      {Log(kOne + Figures("1", "-1")), "distribution d"},
      {Log(kOne + Buckets({"(1, 2]", "(2; 3]"})), "histogram d"},
      {Log(kOne + Buckets({"(nan, 2]"})), "histogram d"},
      {R"({"type":"165","created":"2026-03-05T00:00:01Z"})"
       "\nx quorlet[1]: a:1;b",
       "cut short"},
      {std::string("\0\xff", 2), "line of JSON"},
  };
  for (std::size_t i = 0; i < bad.size(); ++i) {
    device.write("/logs/dev/outbox/" + std::to_string(100 + i), bad[i].first);
  }
  device.write("/logs/dev/outbox/a", whole);
  device.write("/logs/dev/outbox/.lock", "");
  device.write("/logs/dev/pending/z", whole);
  std::filesystem::create_directory_symlink(".", device.path("/logs/circle"));
  ASSERT_EQ(mkfifo(device.path("/logs/fifo").c_str(), 0600), 0);

  const std::string output = device.path("/rows");
  const auto result = run({"--output", output, device.path("/logs"), device.path("/missing")});
  EXPECT_EQ(result.status, 1);
  EXPECT_EQ(std::ranges::count(result.err, '\n'), std::ssize(bad) + 2) << result.err;
  std::size_t at = 0;
  for (const auto& [bytes, why] : bad) {
    const std::size_t end = result.err.find('\n', at);
    EXPECT_NE(result.err.substr(at, end - at).find(why), std::string::npos) << bytes << result.err;
    at = end + 1;
  }
  const std::string row = R"({"schema":"quorlet.metrics/1","device":"dev",)" +
                          std::string(kShared) + R"("kind":"scalar","key":"k","value":1})" + "\n";
  EXPECT_EQ(device.read("/rows"), row + row);

  // What is there stays when the new one cannot be written.
  std::filesystem::create_directory(device.path("/directory"));
  for (const char* path : {"/directory", "/none/rows", "/logs/fifo"}) {
    EXPECT_EQ(run({"--output", device.path(path), device.path("/logs/dev/pending")}).status, 1);
  }
  EXPECT_FALSE(std::filesystem::exists(device.path("/none")));
  EXPECT_EQ(RunProgram(QUORLETCTL_PROGRAM, {"logs", "export", device.path("/logs/dev/pending")},
                       {{{"QUORLET_ROOT", device.directory()}}, {}, "/dev/full"})
                .status,
            1);
}

TEST_F(LogsExportTest, TheDeviceIsTheLogsElseThePathsElseThisOne) {
  const std::string named = Log(kOne, R"({"type":"193","created":"2026-03-05T00:00:01Z",)"
                                      R"("device":"own"})"
                                      "\n");
  constexpr char kSpool[] = "/var/mobile/Library/Logs/Diagwell";
  device.write(std::string(kSpool) + "/outbox/a.log", Log(kOne));
  device.write("/f/named/pending/a.log", named);
  device.write("/f/\xff/outbox/a.log", Log(kOne));
  device.write("/f/plain/a.log", Log(kOne));
  device.write("/var/db/DeviceInfo.plist",
               "<plist><dict><key>InverseDeviceID</key><string>me</string></dict></plist>");
  const auto deviceOf = [&](std::vector<std::string> words) {
    const std::string row = run(std::move(words)).out;
    const std::size_t at = row.find("\"device\":\"");
    return at == std::string::npos ? "" : row.substr(at + 10, row.find('"', at + 10) - at - 10);
  };
  EXPECT_EQ(deviceOf({}), "me");
  EXPECT_EQ(deviceOf({"--device", "none"}), "");
  EXPECT_EQ(deviceOf({device.path("/f/named")}), "own");
  EXPECT_EQ(deviceOf({"--device", "text", device.path("/f/named")}), "text");
  EXPECT_EQ(deviceOf({device.path("/f/\xff/outbox/a.log")}), "\\\\xff");
  EXPECT_EQ(deviceOf({device.path("/f/plain/a.log")}), "");
}

// What a terminal of 80 columns gets.
std::string ShownInTerminal(const std::string& root, std::vector<const char*> words) {
  int terminal = -1;
  const winsize size{24, 80, 0, 0};
  const pid_t child = forkpty(&terminal, nullptr, nullptr, &size);
  if (child == 0) {
    setenv("QUORLET_ROOT", root.c_str(), 1);
    setenv("TERM", "xterm", 1);
    words.insert(words.begin(), "quorletctl");
    words.push_back(nullptr);
    execv(QUORLETCTL_PROGRAM, const_cast<char**>(words.data()));
    _exit(127);
  }
  std::string shown;
  char bytes[4096];
  for (ssize_t got = 0; (got = read(terminal, bytes, sizeof bytes)) > 0;) {
    shown.append(bytes, static_cast<std::size_t>(got));
  }
  close(terminal);
  waitpid(child, nullptr, 0);
  std::erase(shown, '\r');
  return shown;
}

TEST_F(LogsExportTest, ATerminalGetsASummaryThatFits) {
  const std::string log =
      Log(Scalars("<key>launches</key><integer>-9223372036854775807</integer><key>" +
                  std::string(100, 'k') + "</key><integer>1234</integer>") +
          Figures("-1234567890.5", "4000000") + Buckets({"(-inf, 2]", "(2, 40]", "(40, inf)"}));
  device.write("/x.log", log);
  const std::string path = device.path("/x.log");
  const std::string shown = ShownInTerminal(device.directory(), {"logs", "show", path.c_str()});
  std::istringstream lines(shown);
  for (std::string line; std::getline(lines, line);) EXPECT_LE(line.size(), 80u) << line;
  for (const char* part : {"Aggregated log of 2026-03-04", " -9,223,372,036,854,775,807\n",
                           " 1,234\n", " 4,000,000 -1.23457e+09", "    (2, 40]   2 [####"}) {
    EXPECT_NE(shown.find(part), std::string::npos) << part << " in\n" << shown;
  }
  EXPECT_EQ(ShownInTerminal(device.directory(), {"logs", "show", "--raw", path.c_str()}), log);
}

TEST_F(LogsExportTest, APageShowsHostileNamesAsText) {
  const auto day = [](const char* date, const char* value) {
    std::string log = Log(Scalars("<key>&lt;script&gt;\"'&amp;&#10;</key><integer>" +
                                  std::string(value) + "</integer>") +
                          Figures("1", "2") + Buckets({"(1, 2]"}));
    return log.replace(log.find("2026-03-04"), 10, date);
  };
  device.write("/d/a", day("2026-03-04", "5"));
  device.write("/d/b", day("2026-03-05", "12"));
  const auto page = [&](std::vector<std::string> words) {
    words.insert(words.begin(), {"logs", "html"});
    return RunProgram(QUORLETCTL_PROGRAM, std::move(words),
                      {{{"QUORLET_ROOT", device.directory()}}, {}});
  };
  const auto result = page({device.path("/d")});
  EXPECT_EQ(result.status, 0) << result.err;
  for (const char* part :
       {"<title>Logs of 2026-03-04 to 2026-03-05</title>",
        "&lt;script&gt;&quot;&#39;&amp;\\n</th><td class=\"number\">12</td><td></td>"
        "<td class=\"number\">+7</td>",
        "aria-label=\"from 5 to 12 in 2 days\"", "(1, 2]"}) {
    EXPECT_NE(result.out.find(part), std::string::npos) << part;
  }
  EXPECT_EQ(result.out.find("<script>\""), std::string::npos);
  device.write("/d/c", "cut");
  EXPECT_EQ(page({"--output", device.path("/page"), device.path("/d")}).status, 1);
  EXPECT_EQ(device.read("/page"), result.out) << "a log that cannot be read costs only itself";
}

}  // namespace
}  // namespace quorlet
