// quorletctl init: lays out a root.
#include <sys/stat.h>

#include <CLI/CLI.hpp>
#include <array>
#include <memory>

#include "ctl/demo_data.h"
#include "ctl/options.h"
#include "ctl/session.h"
#include "platform/linux/base/paths.h"

namespace quorlet {
namespace {

// What the programs write to, and what they look into.
constexpr auto kDirectories = std::to_array<const char*>({
    "/Library/Application Support/TallyLedger",
    "/run/quorlet/notify",
    kDriversDirectory,
    "/var/db/kernel",
    "/var/db/vigil",
    "/var/lib/quorlet",
    kSystemLogDirectory,
    kSupportLogDirectory,
    kOutboxDirectory,
    kPendingDirectory,
    kStructuredLogDirectory,
    kPreferencesDirectory,
    "/var/mobile/Library/TallyLedger",
});

bool Exists(const std::string& path) {
  struct stat status {};
  return ::lstat(path.c_str(), &status) == 0;
}

void Say(Session& session, bool kept, const std::string& path) {
  session.out.line((kept ? "kept " : "made ") + Escape(path));
}

void MakeDirectory(Session& session, const std::string& path) {
  const bool existed = Exists(path);
  if (const int error = MakeDirectories(path)) {
    throw Failure("cannot make " + path + ": " + ErrnoText(error));
  }
  Say(session, existed, path);
}

void MakeFile(Session& session, const std::string& path, const std::string& bytes) {
  const bool existed = Exists(path);
  if (!existed) {
    if (const int error = WriteWholeFile(path, bytes)) {
      throw Failure("cannot write " + path + ": " + ErrnoText(error));
    }
  }
  Say(session, existed, path);
}

void MakeCounters(Session& session, LinuxPlatform& platform) {
  const auto home = platform.services().queries.dataHomePath();
  if (!home) throw Failure(session.messages.lastErrorOr("there is no place for the counters"));
  const std::string path = platform.root().path(*home + kCounterStorePath);
  const bool existed = Exists(path);
  if (!existed) {
    CounterStore& store = platform.services().counterStore;
    const std::int32_t today = store.TLDaysSince1970();
    StoreChanges changes;
    AddDemoCounters(today - 1, changes);
    AddDemoCounters(today, changes);
    if (!store.write(changes)) {
      throw Failure(session.messages.lastErrorOr("the counters could not be stored"));
    }
  }
  Say(session, existed, path);
}

void Init(Session& session, bool demo) {
  const auto platform = session.open(Access::kReadWrite);
  const Root& root = platform->root();
  if (demo && root.isMachine()) {
    throw Failure("sample data would go into this machine's own root: set QUORLET_ROOT");
  }
  for (const char* directory : kDirectories) MakeDirectory(session, root.path(directory));
  if (!demo) return;
  CounterStore& store = platform->services().counterStore;
  const Date startOfToday = store.dateForDaysSince1970(store.TLDaysSince1970());
  for (const DemoFile& file : MakeDemoFiles(startOfToday)) {
    MakeFile(session, root.path(file.path), file.bytes);
  }
  MakeCounters(session, *platform);
}

}  // namespace

void AddInitCommand(CLI::App& app, Session& session) {
  const auto demo = std::make_shared<bool>(false);
  CLI::App* init =
      AddCommand(app, "init", "Lay out a root",
                 "The root is the directory that QUORLET_ROOT names. What exists is kept.",
                 "QUORLET_ROOT=/tmp/demo quorletctl init --demo");
  init->add_flag("--demo", *demo,
                 "Add a sample whitelist, preferences, counters of yesterday and today, drivers\n"
                 "and usage records");
  init->callback(
      [&session, demo] { session.command = [&session, demo] { Init(session, *demo); }; });
}

}  // namespace quorlet
