// quorletctl whitelist: what a whitelist allows, what in it will not work, and what it makes of a
// value.
#include "ctl/whitelist.h"

#include <unistd.h>

#include <CLI/CLI.hpp>
#include <array>
#include <cerrno>
#include <memory>
#include <utility>
#include <vector>

#include "ctl/json_value.h"
#include "ctl/options.h"
#include "ctl/session.h"
#include "report/config.h"
#include "report/report.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

struct CheckArguments {
  std::string file;
  bool json = false;
};

struct Table {
  const char* name;  // in a group
  const char* noun;
  KeyKind kind;
  Dictionary KeyTables::*entries;
};
constexpr std::array<Table, 4> kTables = {{
    {"ScalarKeys", "scalar key", KeyKind::kScalar, &KeyTables::scalarKeys},
    {"ScalarKeyPrefixes", "scalar prefix", KeyKind::kScalar, &KeyTables::scalarPrefixes},
    {"DistributionKeys", "distribution key", KeyKind::kDistribution, &KeyTables::distributionKeys},
    {"DistributionKeyPrefixes", "distribution prefix", KeyKind::kDistribution,
     &KeyTables::distributionPrefixes},
}};

struct Group {
  std::string name;
  bool isEnabled = true;
  KeyTables tables;
  std::vector<WhitelistFault> faults;
};

Dictionary ReadWhitelist(const std::string& path) {
  const auto bytes = ReadWholeFile(path, kMaxPropertyListBytes);
  if (const int* error = std::get_if<int>(&bytes)) {
    if (*error == ENOENT && path.ends_with(kWhitelistPath)) {
      throw Failure("there is no whitelist at " + path);
    }
    throw Failure("cannot read " + path + ": " + ErrnoText(*error));
  }
  const auto parsed = ReadPropertyList(std::get<std::string>(bytes));
  if (const auto* error = std::get_if<PropertyListError>(&parsed)) {
    throw Failure("cannot parse " + path + ": " + error->description);
  }
  const Dictionary* root = std::get<PropertyValue>(parsed).asDictionary();
  if (root == nullptr) throw Failure("cannot parse " + path + ": the root is not a dictionary");
  return *root;
}

Group CheckGroup(const std::string& name, const PropertyValue& value) {
  Group group;
  group.name = name;
  // The same merge as the report's, for this group alone: whatever it skips, the report skips.
  group.faults = MergeWhitelist(
      Dictionary{{name, value}}, [](const std::string&) { return true; }, group.tables);
  if (const Dictionary* entries = value.asDictionary()) {
    for (const auto& [entry, ignored] : *entries) {
      const auto isEntry = [&entry = entry](const Table& table) { return entry == table.name; };
      if (!std::ranges::any_of(kTables, isEntry)) {
        group.faults.push_back({name, entry, "is not the name of a table and is ignored"});
      }
    }
  }
  for (const Table& table : kTables) {
    for (const auto& [key, options] : group.tables.*table.entries) {
      const Dictionary* dictionary = options.asDictionary();
      if (dictionary == nullptr) continue;
      for (const std::string& reason : KeyOptionFaults(*dictionary, table.kind)) {
        group.faults.push_back({name, key, reason});
      }
    }
  }
  return group;
}

Dictionary GroupJson(const Group& group) {
  Array faults;
  for (const WhitelistFault& fault : group.faults) {
    faults.push_back(Dictionary{{"key", fault.key}, {"reason", fault.reason}});
  }
  Dictionary json{{"name", group.name}, {"enabled", group.isEnabled}, {"faults", faults}};
  for (const Table& table : kTables) json[table.name] = group.tables.*table.entries;
  return json;
}

// " sig_fig=2 intervals=[1,2]"
std::string OptionsText(const PropertyValue& options) {
  std::string text;
  if (const Dictionary* dictionary = options.asDictionary()) {
    for (const auto& [name, value] : *dictionary) {
      text += "  " + Escape(name) + "=" + JsonText(value, JsonForm::kPlain);
    }
    const auto last = ExpiryOption(*dictionary);
    if (last && *last < Today()) text += "  EXPIRED";
  }
  return text;
}

void PrintGroup(Output& out, const Group& group) {
  std::string counts;
  for (const Table& table : kTables) {
    const std::size_t count = (group.tables.*table.entries).size();
    if (count != 0) counts += (counts.empty() ? "" : ", ") + Counted(count, table.noun);
  }
  out.line(Escape(group.name) + (group.isEnabled ? "" : " (switched off on this device)") + ": " +
           (counts.empty() ? "nothing" : counts));
  for (const Table& table : kTables) {
    for (const auto& [key, options] : group.tables.*table.entries) {
      out.line("  " + std::string(table.noun) + "  " + Escape(key) + OptionsText(options));
    }
  }
  for (const WhitelistFault& fault : group.faults) {
    out.line("  WILL NOT WORK: " + (fault.key.empty() ? "the group" : Escape(fault.key)) + ": " +
             Escape(fault.reason));
  }
}

void Check(Session& session, const CheckArguments& arguments) {
  // The output marks the groups that are switched off; messages need not say so again.
  session.messages.keepFrom(LogLevel::kError);
  const auto platform = session.open(Access::kReadOnly);
  const Dictionary root = ReadWhitelist(
      arguments.file.empty() ? platform->root().path(kWhitelistPath) : arguments.file);
  const bool isInternal = platform->services().queries.TLIsInternalDevice();
  std::size_t faults = 0;
  Array groups;
  for (const auto& [name, value] : root) {
    Group group = CheckGroup(name, value);
    group.isEnabled = IsGroupEnabled(name, isInternal, platform->services().preferences,
                                     platform->services().log);
    faults += group.faults.size();
    if (arguments.json) {
      groups.push_back(GroupJson(group));
    } else {
      PrintGroup(session.out, group);
    }
  }
  if (arguments.json) {
    const Dictionary all{{"groups", groups}, {"faults", UInt64(faults)}};
    session.out.line(JsonText(all, JsonForm::kPlain));
  }
  if (faults != 0) throw AnswerIsNo();
}

// The device's whitelist as today's report would use it. What is wrong elsewhere in it is for
// `whitelist check` to say.
struct DeviceWhitelist {
  DeviceWhitelist() {
    if (config) config->setReportedDay(platform.services().counterStore.TLDaysSince1970());
  }

  Messages messages;
  LinuxPlatform platform{Root::FromEnvironment(), Access::kReadOnly,
                         messages.makeLog(Access::kReadOnly)};
  std::optional<TLConfig> config = TLConfig::init(platform.services());
};

struct ExplainArguments {
  std::string key;
  std::optional<std::string> value;
  bool json = false;
};

// One recorded value.
class OneValue final : public TLHistoryDistributionEnumerator {
 public:
  explicit OneValue(double value) : sample_{value, 0} {}

 protected:
  std::span<const DistributionSample> nextBlock() override {
    return std::exchange(isRead_, true) ? std::span<const DistributionSample>()
                                        : std::span(&sample_, 1);
  }

 private:
  const DistributionSample sample_;
  bool isRead_ = false;
};

std::string_view KindWord(KeyKind kind) {
  return kind == KeyKind::kScalar ? "scalar" : "distribution";
}

// What the log would hold of the value.
PropertyValue Reported(TLReport& report, const KeyMatch& match, KeyKind kind, std::string_view key,
                       const std::string& text) {
  if (kind == KeyKind::kScalar) {
    const auto value = ParseNumber<std::int64_t>(text);
    return value ? Int64(report.addScalarForKeyWithOptions(*value, key, match.options))
                 : PropertyValue("not a whole number of 64 bits");
  }
  const auto value = ParseNumber<double>(text);
  if (!value) return "not a number";
  OneValue values(*value);
  report.computeAndAddDistributionForKeyWithOptions(values, key, match.options);
  if (const Dictionary* histogram = DictionaryEntry(report.histogramsOutput(), key)) {
    return FormatText("counted in %@, and summed up with the day's values",
                      histogram->begin()->first);
  }
  return "summed up with the day's values: minimum, maximum, mean, squared deviations, count";
}

std::string_view MatchWord(KeyMatch::Kind kind) {
  switch (kind) {
    case KeyMatch::Kind::kExact:
      return "key";
    case KeyMatch::Kind::kPrefix:
      return "prefix";
    case KeyMatch::Kind::kInternalDevice:
      break;
  }
  return "no entry, but the device is internal";
}

// The kinds for which the whitelist has an entry for the key.
Array Explanations(DeviceWhitelist& device, const ExplainArguments& arguments) {
  Array explanations;
  TLReport report(device.platform.services());
  for (const KeyKind kind : {KeyKind::kScalar, KeyKind::kDistribution}) {
    const auto match = device.config->matchForKey(arguments.key, kind);
    if (!match) continue;
    Dictionary explanation{{"kind", KindWord(kind)},
                           {"match", MatchWord(match->kind)},
                           {"entry", match->entry},
                           {"options", match->options},
                           {"expired", match->isExpired}};
    if (arguments.value && !match->isExpired) {
      explanation["reported"] = Reported(report, *match, kind, arguments.key, *arguments.value);
    }
    Array faults;
    for (const std::string& fault : KeyOptionFaults(match->options, kind)) faults.push_back(fault);
    explanation["faults"] = faults;
    explanations.push_back(explanation);
  }
  return explanations;
}

void Explain(Session& session, const ExplainArguments& arguments) {
  DeviceWhitelist device;
  if (!device.config) throw Failure(device.messages.lastErrorOr("there is no whitelist"));
  const Array explanations = Explanations(device, arguments);
  bool isReported = false;
  for (const PropertyValue& value : explanations) {
    const Dictionary& explanation = *value.asDictionary();
    const bool hasExpired = *explanation.find("expired") == PropertyValue(true);
    isReported |= !hasExpired;
    if (arguments.json) continue;
    session.out.line(*StringEntry(explanation, "kind") + ": " + *StringEntry(explanation, "match") +
                     " " + Escape(*StringEntry(explanation, "entry")) +
                     OptionsText(*explanation.find("options")));
    for (const PropertyValue& fault : *ArrayEntry(explanation, "faults")) {
      session.out.line("  WILL NOT WORK: " + Escape(*fault.asString()));
    }
    if (const PropertyValue* reported = explanation.find("reported")) {
      session.out.line("  reported: " + Escape(reported->description()));
    }
  }
  if (arguments.json) {
    session.out.line(
        JsonText(Dictionary{{"key", arguments.key}, {"entries", explanations}}, JsonForm::kPlain));
  } else if (explanations.empty()) {
    session.out.line("no entry names " + Escape(arguments.key) + ": it is not reported");
  }
  if (!isReported) throw AnswerIsNo();
}

void AddExplainCommand(CLI::App& whitelist, Session& session) {
  const auto arguments = std::make_shared<ExplainArguments>();
  CLI::App* explain = AddCommand(
      whitelist, "explain", "Say which entry applies to a key, and what it reports",
      "With VALUE: what a log would hold of that value. The exit status is 0 when the key\n"
      "is reported, otherwise 1.",
      "quorletctl whitelist explain nuvex.demo.launches 1234");
  explain->add_option("KEY", arguments->key, "The counter's key")->required();
  explain->add_option("VALUE", arguments->value, "A value that was counted or recorded");
  AddJsonFlag(*explain, arguments->json);
  explain->callback([&session, arguments] {
    session.command = [&session, arguments] { Explain(session, *arguments); };
  });
}

}  // namespace

void NoteUnlisted(Session& session, std::string_view key, KeyKind kind) {
  if (::isatty(STDERR_FILENO) == 0) return;
  const DeviceWhitelist device;
  const auto match = device.config ? device.config->matchForKey(key, kind) : std::nullopt;
  if (match && !match->isExpired) return;
  session.messages.add(LogLevel::kDefault,
                       "note: no entry of the whitelist names " + std::string(key) +
                           " (see: quorletctl whitelist explain), so no log will hold it");
}

WhitelistSummary SummariseWhitelist(const std::string& path) {
  WhitelistSummary summary;
  for (const auto& [name, value] : ReadWhitelist(path)) {
    const Group group = CheckGroup(name, value);
    for (const Table& table : kTables) summary.entries += (group.tables.*table.entries).size();
    summary.faults += group.faults.size();
  }
  return summary;
}

void AddWhitelistCommands(CLI::App& app, Session& session) {
  CLI::App* whitelist =
      AddFamily(app, "whitelist", "The keys that reports may hold", "quorletctl whitelist check");
  const auto arguments = std::make_shared<CheckArguments>();
  CLI::App* check = AddCommand(*whitelist, "check",
                               "Print what a whitelist allows, and every entry that will not work",
                               "The exit status is 0 when every entry works, otherwise 1.",
                               "quorletctl whitelist check draft.plist");
  check->add_option("FILE", arguments->file, "The whitelist (without it: the device's own)");
  AddJsonFlag(*check, arguments->json);
  check->callback([&session, arguments] {
    session.command = [&session, arguments] { Check(session, *arguments); };
  });
  AddExplainCommand(*whitelist, session);
}

}  // namespace quorlet
