// quorletctl consent: whether the device's owner has agreed to logs being submitted.
#include "driver/consent.h"

#include <CLI/CLI.hpp>
#include <memory>

#include "ctl/json_value.h"
#include "ctl/options.h"
#include "ctl/session.h"
#include "platform/names.h"

namespace quorlet {
namespace {

struct ConsentArguments {
  bool keepCounters = false;
  bool json = false;
};

// Runs `change` with the pass lock held; it says in the log what it could not do.
void Change(Session& session, const std::function<bool(Platform&)>& change) {
  const auto platform = session.open(Access::kReadWrite);
  const PassHold hold(platform->services().passLock);
  if (!hold.isHeld() || !change(platform->services())) {
    throw Failure(session.messages.lastErrorOr("the consent could not be changed"));
  }
}

void Status(Session& session, const ConsentArguments& arguments) {
  const auto platform = session.open(Access::kReadOnly);
  Preferences& preferences = platform->services().preferences;
  const Consent consent = consentOf(preferences);
  if (!session.messages.errors().empty()) throw Failure(session.messages.errors().front());
  const std::string_view word = consent == Consent::kOn    ? "on"
                                : consent == Consent::kOff ? "off"
                                                           : "invalid";
  const std::string text =
      consent == Consent::kInvalid
          ? "the preference SubmissionEnabled is not a boolean, which enables nothing; "
            "\"quorletctl consent on\" or \"off\" sets it right"
          : std::string(word);
  if (arguments.json) {
    session.out.line(JsonText(Dictionary{{"consent", word}, {"text", text}}, JsonForm::kPlain));
  } else {
    session.out.line(text);
  }
  if (consent != Consent::kOn) throw AnswerIsNo();
}

}  // namespace

void RequireConsent(Platform& services) {
  if (services.diagnostics.DiagnosticLogSubmissionEnabled()) return;
  if (!services.preferences.isReadable(kConsentDomain)) {
    throw Failure("the owner's consent cannot be read: see \"quorletctl consent status\"");
  }
  throw Failure(
      "the device's owner has not consented to logs being submitted: see \"quorletctl consent "
      "on\"");
}

void AddConsentCommands(CLI::App& app, Session& session) {
  CLI::App* consent =
      AddFamily(app, "consent", "The owner's consent to submitting logs", "quorletctl consent on");
  const auto arguments = std::make_shared<ConsentArguments>();
  CLI::App* on =
      AddCommand(*consent, "on", "Consent to logs being written and submitted",
                 "Counters recorded before are dropped, so that nothing counted without\n"
                 "consent is ever reported. Said again, it changes nothing.",
                 "quorletctl consent on");
  on->add_flag("--keep-counters", arguments->keepCounters, "Keep what was counted before");
  on->callback([&session, arguments] {
    session.command = [&session, arguments] {
      Change(session,
             [&](Platform& platform) { return giveConsent(platform, arguments->keepCounters); });
    };
  });
  CLI::App* off =
      AddCommand(*consent, "off", "Withdraw the consent and remove every log",
                 "Logs of pending/ and outbox/ are removed. Said again, it finishes the\n"
                 "removal.",
                 "quorletctl consent off");
  off->callback([&session] { session.command = [&session] { Change(session, withdrawConsent); }; });
  CLI::App* status =
      AddCommand(*consent, "status", "Say whether there is consent",
                 "Prints on, off, or what is wrong. The exit status is 0 for on, otherwise 1.",
                 "quorletctl consent status");
  AddJsonFlag(*status, arguments->json);
  status->callback([&session, arguments] {
    session.command = [&session, arguments] { Status(session, *arguments); };
  });
}

}  // namespace quorlet
