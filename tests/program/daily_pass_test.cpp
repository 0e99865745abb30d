// quorlet, run as the system runs it.
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <filesystem>
#include <string>
#include <vector>

#include "program/program_device.h"

namespace quorlet {
namespace {

namespace fs = std::filesystem;

class DailyPassTest : public testing::Test, public ProgramDevice {};

using Lines = std::vector<std::string>;

TEST_F(DailyPassTest, TheFirstArgumentDecides) {
  quorlet({"-x", "-f"});
  quorlet({"-D"});
  quorlet({"%s%n"});
  EXPECT_EQ(lines("default"), (Lines{"quorlet started", "Unknown arg: -x", "quorlet ended",
                                     "quorlet started", "Unknown arg: -D", "quorlet ended",
                                     "quorlet started", "Unknown arg: %s%n", "quorlet ended"}));
  EXPECT_TRUE(logs().empty());
  quorlet({"-f", "-d"});
  quorlet({"-f"});
  EXPECT_EQ(logs().size(), 2u);
  quorlet({"-d", "-f"});
  quorlet({"-d"});
  EXPECT_EQ(logs().size(), 3u) << "the gate lets one pass through, after ungated ones too";
  EXPECT_EQ(lines("error"), Lines{});
}

TEST_F(DailyPassTest, ManyStartsAtOnceMakeOneLog) {
  std::vector<pid_t> children;
  for (int i = 0; i < 12; ++i) children.push_back(start("-d"));
  for (const pid_t child : children) {
    int status = 0;
    waitpid(child, &status, 0);
    EXPECT_EQ(status, 0);
  }
  EXPECT_EQ(logs().size(), 1u);
  EXPECT_EQ(lines("error"), Lines{});
}

TEST_F(DailyPassTest, APassKilledAtAnyMomentLeavesWholeFiles) {
  // Kills passes ever later, until one is so late that it has ended by itself.
  int status = 1;
  for (useconds_t delay = 0; status != 0 && delay < 2'000'000; delay += 700) {
    const pid_t child = start("-d");
    usleep(delay);
    kill(child, SIGKILL);
    waitpid(child, &status, 0);
    for (const std::string& name : logs()) {
      if (!name.starts_with(".")) (void)document(name);
    }
  }
  EXPECT_EQ(status, 0);
  quorlet({"-d"});
  EXPECT_EQ(lines("error"), Lines{});
  ASSERT_FALSE(logs().empty());
  EXPECT_FALSE(logs().front().starts_with(".")) << "the last pass tidied up: " << logs().front();
  const Dictionary log = document(logs().back());
  EXPECT_EQ(*log.find("TLScalars")->asDictionary()->find("s"), Int64(7));
  const auto dump =
      RunProgram(QUORLETCTL_PROGRAM, {"tally", "dump", "--day", yesterday()}, setting());
  EXPECT_NE(dump.out.find("scalar\t" + yesterday() + "\ts\t7\n"), std::string::npos) << dump.out;
}

TEST_F(DailyPassTest, DamageOfAnyFileCostsOnlyWhatWasInIt) {
  const struct {
    const char* path;
    const char* bytes;
    bool logExpected;
  } cases[] = {
      {kWhitelist, "<plist><dict><key>x</key>", false},
      {"/var/mobile/Library/Preferences/nuvex.aggregated.quorlet.plist", "damaged", true},
      {"/var/mobile/Library/Preferences/nuvex.da.plist", "bplist00", true},
      {"/var/mobile/Library/TallyLedger/TLDataStore.sqlitedb", "SQLite format 3", false},
      {"/etc/os-release", "NAME=\"\xff\nVERSION_ID='\x01", true},
      {"/var/db/DeviceInfo.plist", "<array/>", true},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.path);
    DailyPassTest::SetUp();
    const bool existed = device.exists(c.path);
    const std::string before = device.read(c.path);
    device.write(c.path, c.bytes);
    fs::remove_all(device.path(kPending));
    fs::remove(device.path("/var/log/quorlet.log"));
    quorlet({"-f"});
    EXPECT_EQ(logs().size(), c.logExpected ? 1u : 0u);
    EXPECT_EQ(lines("default").back(), "quorlet ended");
    // A log that is lost is told of beside its reason.
    EXPECT_LE(lines("error").size(), c.logExpected ? 1u : 2u)
        << testing::PrintToString(lines("error"));
    existed ? device.write(c.path, before) : static_cast<void>(fs::remove(device.path(c.path)));
  }
}

TEST_F(DailyPassTest, AFullDiskLeavesNothingHalfWritten) {
  // A file-size limit fails writes in the middle as a full disk does. Thousands of buckets make the
  // log the one large file.
  std::string bounds, values;
  for (int i = 0; i < 3000; ++i) {
    bounds += "<integer>" + std::to_string(i) + "</integer>";
    values += "value\t" + yesterday() + "\tdh\t0\t" + std::to_string(i) + "\n";
  }
  device.write(kWhitelist, Plist("<dict><key>G</key><dict><key>DistributionKeys</key><dict>"
                                 "<key>dh</key><dict><key>intervals</key><array>" +
                                 bounds + "</array></dict></dict></dict></dict>"));
  device.write("/tmp/lines", values);
  ctl({"tally", "import", device.path("/tmp/lines")});
  const pid_t child = fork();
  if (child == 0) {
    const rlimit limit{100'000, 100'000};
    setrlimit(RLIMIT_FSIZE, &limit);
    setenv("QUORLET_ROOT", device.directory().c_str(), 1);
    execl(QUORLET_PROGRAM, "quorlet", "-d", nullptr);
    _exit(127);
  }
  int status = 1;
  waitpid(child, &status, 0);
  EXPECT_EQ(status, 0);
  EXPECT_EQ(logs(), Lines{});
  const Lines errors = lines("error");
  ASSERT_FALSE(errors.empty());
  const std::string lost =
      "The log of day " + yesterday() + " is not in the spool; \"quorlet -f\" repeats it";
  EXPECT_NE(std::ranges::find(errors, lost), errors.end());
  EXPECT_EQ(lines("default").back(), "quorlet ended");
}

}  // namespace
}  // namespace quorlet
