// quorletctl: the companion program for people and scripts.
//
// Exit status: 0, 1 when the command failed, 2 when the command line makes no sense. Both of the
// latter come with exactly one line on standard error.
#include <sys/stat.h>

#include <CLI/CLI.hpp>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <string>
#include <string_view>
#include <utility>

#include "ctl/session.h"
#include "platform/linux/base/descriptor.h"
#include "platform/linux/base/files.h"

namespace quorlet {
namespace {

constexpr int kFailed = 1;
constexpr int kUsage = 2;

void AddCommands(CLI::App& app, Session& session) {
  app.require_subcommand(1);
  app.set_version_flag("--version", "quorletctl " QUORLET_VERSION);
  app.footer(
      "QUORLET_ROOT names the directory that stands for \"/\" (default: the machine's own).\n"
      "Exit status: 0, 1 failed, 2 wrong usage.\n"
      "Example: QUORLET_ROOT=/tmp/demo quorletctl init --demo");
  AddInitCommand(app, session);
  AddTallyCommands(app, session);
  AddPrefsCommands(app, session);
  AddReportCommands(app, session);
  AddLogsCommands(app, session);
  AddConsentCommands(app, session);
  AddStatusCommand(app, session);
  AddWhitelistCommands(app, session);
  AddChannelsCommands(app, session);
  AddStorageCommands(app, session);
  AddSendCommands(app, session);
  AddCompletionCommand(app, session);
}

int ReportUsage(const CLI::App& app, std::string_view why) {
  std::string command = "quorletctl";
  const CLI::App* level = &app;
  while (!level->get_subcommands().empty()) {
    level = level->get_subcommands().front();
    command += " " + level->get_name();
  }
  PrintErrorLine(std::string(why) + " (see: " + command + " --help)");
  return kUsage;
}

// Parses the command line; when it holds a command, `session.command` is set.
int Parse(CLI::App& app, Session& session, int argc, char** argv) {
  try {
    app.parse(argc, argv);
  } catch (const CLI::CallForHelp&) {
    session.out.write(app.help());
  } catch (const CLI::CallForVersion&) {
    session.out.line(app.version());
  } catch (const CLI::RequiredError& error) {
    // A misspelt command is one that is missing, and a word too many.
    const std::vector<std::string> words = app.remaining(true);
    return ReportUsage(app, words.empty() ? error.what() : "Unknown: " + words.front());
  } catch (const CLI::ParseError& error) {
    return ReportUsage(app, error.what());
  }
  return 0;
}

// A root that is mistyped must not look like one that is empty. Only `init` makes a new one.
void CheckRoot(bool mayBeNew) {
  const char* variable = ::secure_getenv("QUORLET_ROOT");
  if (variable == nullptr || *variable == '\0') return;
  const std::string root = variable;
  if (!root.starts_with('/')) throw Failure("QUORLET_ROOT is not an absolute path: " + root);
  struct stat status {};
  if (::stat(root.c_str(), &status) != 0) {
    if (errno == ENOENT && mayBeNew) return;
    throw Failure("QUORLET_ROOT cannot be used: " + root + ": " + ErrnoText(errno));
  }
  if (!S_ISDIR(status.st_mode)) throw Failure("QUORLET_ROOT is not a directory: " + root);
}

// What went wrong, and what to do about it where that is always the same.
std::string WithRemedy(const std::string& failure) {
  const std::pair<std::string, std::string_view> kRemedies[] = {
      {ErrnoText(EACCES),
       "try it as root or as the owner of the files, which \"quorletctl status\" names"},
      {"Couldn't load whitelist", "\"quorletctl status\" shows how to put one there"},
      {"there is no whitelist", "\"quorletctl status\" shows how to put one there"},
      {"there is no log yet", "\"quorletctl status\" says what is missing"},
      {"the service is not running", "\"quorlet\" is it, or systemctl start quorlet.socket"},
  };
  for (const auto& [failed, remedy] : kRemedies) {
    if (failure.find(failed) != std::string::npos) return failure + ": " + std::string(remedy);
  }
  return failure;
}

int Run(int argc, char** argv) {
  Session session;
  CLI::App app("Puts counters, preferences and whitelists before quorlet and shows its logs.",
               "quorletctl");
  AddCommands(app, session);
  if (const int status = Parse(app, session, argc, argv)) return status;
  try {
    if (session.command) {
      CheckRoot(app.got_subcommand("init"));
      session.command();
    }
  } catch (const AnswerIsNo&) {
    if (session.out.finish()) return kFailed;
  } catch (const std::exception& failure) {
    // What has been written already belongs to the result as far as it goes.
    [[maybe_unused]] const bool written = session.out.finish();
    PrintErrorLine(WithRemedy(failure.what()));
    return kFailed;
  }
  if (!session.out.finish()) {
    // Whoever read has seen enough.
    if (session.out.error() == EPIPE) return kFailed;
    PrintErrorLine("cannot write to standard output: " + ErrnoText(session.out.error()));
    return kFailed;
  }
  session.messages.print();
  return 0;
}

}  // namespace
}  // namespace quorlet

int main(int argc, char** argv) {
  quorlet::OccupyStandardStreams();
  // A closed pipe and a file that hits the size limit are failed writes like any other.
  std::signal(SIGPIPE, SIG_IGN);
  std::signal(SIGXFSZ, SIG_IGN);
  try {
    return quorlet::Run(argc, argv);
  } catch (const std::exception& failure) {
    quorlet::PrintErrorLine(failure.what());
    return quorlet::kFailed;
  }
}
