// One run of quorletctl: what its commands share.
#ifndef QUORLET_CTL_SESSION_H_
#define QUORLET_CTL_SESSION_H_

#include <functional>
#include <memory>

#include "ctl/messages.h"
#include "ctl/output.h"
#include "platform/linux/linux_platform.h"

namespace CLI {
class App;
}

namespace quorlet {

struct Session {
  Output out;
  Messages messages;
  // What the command line asks for; throws Failure.
  std::function<void()> command;

  // The services of the root that QUORLET_ROOT names.
  std::unique_ptr<LinuxPlatform> open(Access access) {
    return std::make_unique<LinuxPlatform>(Root::FromEnvironment(), access,
                                           messages.makeLog(access));
  }
};

// Throws Failure, which names the remedy, while the device's owner has not consented.
void RequireConsent(Platform& services);

// Each adds one command family to the command line. Parsing sets `session.command`; the session
// outlives the application.
void AddInitCommand(CLI::App& app, Session& session);
void AddChannelsCommands(CLI::App& app, Session& session);
void AddTallyCommands(CLI::App& app, Session& session);
void AddPrefsCommands(CLI::App& app, Session& session);
void AddReportCommands(CLI::App& app, Session& session);
void AddCompletionCommand(CLI::App& app, Session& session);
void AddConsentCommands(CLI::App& app, Session& session);
void AddLogsCommands(CLI::App& app, Session& session);
void AddSendCommands(CLI::App& app, Session& session);
void AddStatusCommand(CLI::App& app, Session& session);
void AddStorageCommands(CLI::App& app, Session& session);
void AddWhitelistCommands(CLI::App& app, Session& session);

}  // namespace quorlet

#endif  // QUORLET_CTL_SESSION_H_
