// quorletctl whitelist: what a whitelist allows, and what in it will not work.
#include <CLI/CLI.hpp>
#include <array>
#include <memory>
#include <vector>

#include "ctl/json_value.h"
#include "ctl/options.h"
#include "ctl/session.h"
#include "report/config.h"
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
    group.isEnabled = IsGroupEnabled(name, isInternal, platform->services());
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

}  // namespace

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
}

}  // namespace quorlet
