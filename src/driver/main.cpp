// quorlet: closes the device's daily metrics record.
#include <unistd.h>

#include <csignal>
#include <exception>
#include <optional>
#include <string_view>

#include "driver/listener.h"
#include "driver/run_driver.h"
#include "platform/linux/base/descriptor.h"
#include "platform/linux/linux_platform.h"

namespace {

using quorlet::Platform;
using quorlet::RunDriver;

void RunListener(Platform& platform) {
  RunDriver driver(platform);
  quorlet::Listener(platform, driver).serve();
}

// Scripts get nothing on standard output, whatever they ask for.
void TellPerson(std::string_view argument) {
  std::string_view line;
  if (argument == "--help") {
    line =
        "quorlet -d (yesterday, once a day) | -f (yesterday) | -t (today so far): closes the day's "
        "metrics record; see quorlet(8), quorletctl --help\n";
  } else if (argument == "--version") {
    line = "quorlet " QUORLET_VERSION "\n";
  }
  if (line.empty() || isatty(STDOUT_FILENO) == 0) return;
  static_cast<void>(!write(STDOUT_FILENO, line.data(), line.size()));
}

// Only the first argument counts; the switches are exact.
void RunArgument(Platform& platform, const char* argument) {
  const std::int32_t today = platform.counterStore.TLDaysSince1970();
  RunDriver driver(platform);
  const std::string_view text = argument;
  if (text == "-d") {
    driver.runDailyTasksIfNewDay(std::nullopt);
  } else if (text == "-f") {
    driver.runDailyTasks(today - 1, std::nullopt);
  } else if (text == "-t") {
    driver.runDailyTasks(today, std::nullopt);
  } else {
    platform.log.log("Unknown arg: %s", argument);
    TellPerson(text);
  }
}

void Run(int argumentCount, char** arguments) {
  quorlet::LinuxPlatform linuxPlatform(quorlet::Root::FromEnvironment(),
                                       quorlet::Access::kReadWrite, nullptr, quorlet::kPassOptions);
  Platform& platform = linuxPlatform.services();
  platform.log.log("quorlet started");
  try {
    if (argumentCount == 1) RunListener(platform);
    if (argumentCount >= 2) RunArgument(platform, arguments[1]);
  } catch (const std::exception& failure) {
    platform.log.error("quorlet gave up: %s", failure.what());
  }
  platform.log.log("quorlet ended");
}

}  // namespace

// The exit status is always 0: what went wrong is in the system log.
int main(int argumentCount, char** arguments) {
  quorlet::OccupyStandardStreams();
  // A reader of our standard error, or a peer, that goes away is no reason to die.
  std::signal(SIGPIPE, SIG_IGN);
  // A file that hits the process's size limit is a failed write, like a full disk.
  std::signal(SIGXFSZ, SIG_IGN);
  try {
    Run(argumentCount, arguments);
  } catch (const std::exception&) {
    // Nothing is left that could be told, not even to the log.
  }
  return 0;
}
