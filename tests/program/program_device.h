// A root that the installed programs work on.
#ifndef QUORLET_TESTS_PROGRAM_PROGRAM_DEVICE_H_
#define QUORLET_TESTS_PROGRAM_PROGRAM_DEVICE_H_

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <ctime>
#include <sstream>
#include <string>
#include <variant>
#include <vector>

#include "fakes/temp_root.h"
#include "fakes/whitelist.h"
#include "program/run_program.h"
#include "values/property_list.h"

namespace quorlet {

inline constexpr char kPending[] = "/var/mobile/Library/Logs/Diagwell/pending";
inline constexpr char kWhitelist[] = "/Library/Application Support/TallyLedger/Whitelist_Zed.plist";
inline constexpr char kPreferences[] = "/var/mobile/Library/Preferences/";

// Allows scalars and distributions whose keys begin with s and d, and has some of yesterday.
struct ProgramDevice {
  ProgramDevice() {
    device.write(kWhitelist,
                 Plist("<dict>" + Group("G", "ScalarKeyPrefixes", {{"s", "", ""}}) +
                       Group("H", "DistributionKeyPrefixes", {{"d", "", ""}}) + "</dict>"));
    ctl({"prefs", "set", "nuvex.diagwell", "SubmissionEnabled", "true"});
    ctl({"tally", "set", "s", "7", "--day", yesterday()});
    ctl({"tally", "record", "d", "1", "2", "--day", yesterday()});
  }
  static std::string yesterday() { return std::to_string(std::time(nullptr) / 86400 - 1); }
  ProgramSetting setting() const { return {{{"QUORLET_ROOT", device.directory()}}, {}}; }
  void ctl(std::vector<std::string> words) const {
    const auto result = RunProgram(QUORLETCTL_PROGRAM, std::move(words), setting());
    EXPECT_EQ(result.status, 0) << result.err;
  }
  // Runs quorlet, which must end with 0 and say nothing but that there is no storage driver.
  void quorlet(std::vector<std::string> words) const {
    const auto result = RunProgram(QUORLET_PROGRAM, std::move(words), setting());
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.out, "");
    const std::string line = "Could not get matching Devreg service for exporting classes\n";
    EXPECT_TRUE(result.err.empty() || result.err == line + line + line) << result.err;
  }
  // The names of the logs, hidden files included.
  std::vector<std::string> logs() const { return device.list(kPending); }
  // The texts of the system log's lines of one level.
  std::vector<std::string> lines(const std::string& level) const {
    std::vector<std::string> texts;
    std::istringstream log(device.read("/var/log/quorlet.log"));
    for (std::string line; std::getline(log, line);) {
      const std::size_t at = line.find(' ');
      if (at == std::string::npos || line.compare(at + 1, level.size(), level) != 0) continue;
      texts.push_back(line.substr(line.find(": ") + 2));
    }
    return texts;
  }
  // The document of a log, which must be whole.
  Dictionary document(const std::string& name) const {
    const std::string bytes = device.read(std::string(kPending) + "/" + name);
    return parsed(bytes.substr(bytes.find('\n') + 1));
  }
  // The file of a preference domain.
  Dictionary preferences(const std::string& domain) const {
    return parsed(device.read(kPreferences + domain + ".plist"));
  }
  // Starts quorlet without waiting for it.
  pid_t start(const char* argument = nullptr) const {
    const pid_t child = fork();
    if (child == 0) {
      setenv("QUORLET_ROOT", device.directory().c_str(), 1);
      execl(QUORLET_PROGRAM, "quorlet", argument, nullptr);
      _exit(127);
    }
    return child;
  }

  TempRoot device;

 private:
  static Dictionary parsed(std::string_view bytes) {
    const auto read = ReadPropertyList(bytes);
    const auto* value = std::get_if<PropertyValue>(&read);
    const Dictionary* dictionary = value != nullptr ? value->asDictionary() : nullptr;
    EXPECT_NE(dictionary, nullptr) << bytes;
    return dictionary != nullptr ? *dictionary : Dictionary();
  }
};

}  // namespace quorlet

#endif  // QUORLET_TESTS_PROGRAM_PROGRAM_DEVICE_H_
