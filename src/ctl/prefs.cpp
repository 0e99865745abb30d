// quorletctl prefs: preferences in and out, as JSON.
#include <CLI/CLI.hpp>
#include <memory>

#include "ctl/json_value.h"
#include "ctl/options.h"
#include "ctl/session.h"
#include "platform/linux/base/paths.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr char kTags[] =
    "Dates and data, which JSON lacks, are {\"$date\": \"2026-03-04T05:06:07Z\"} and\n"
    "{\"$data\": \"AAEC\"} (base64).";

struct PrefsArguments {
  std::string domain;
  std::string key;
  PropertyValue value;
  bool json = false;
};
using Arguments = std::shared_ptr<PrefsArguments>;

void CheckDomain(const std::string& domain) {
  if (!IsSafeName(domain)) throw Failure("not a preference domain: " + domain);
}

void Get(Session& session, const PrefsArguments& arguments) {
  CheckDomain(arguments.domain);
  const auto platform = session.open(Access::kReadOnly);
  const auto value =
      platform->services().preferences.DGWPreferencesGetValue(arguments.key, arguments.domain);
  if (!value) {
    throw Failure(
        session.messages.lastErrorOr(arguments.domain + " has no value for " + arguments.key));
  }
  session.out.line(JsonText(*value, JsonForm::kTagged));
}

// Preferences are property lists: what those cannot hold unchanged is refused before it is stored.
void CheckRepresentable(const PrefsArguments& arguments) {
  const Dictionary domain{{arguments.key, arguments.value}};
  const auto document = WriteXmlPropertyList(domain);
  if (const auto* error = std::get_if<PropertyListError>(&document)) {
    throw Failure("the value cannot be stored: " + error->description);
  }
  const auto back = ReadPropertyList(std::get<std::string>(document));
  if (const auto* error = std::get_if<PropertyListError>(&back)) {
    throw Failure("the value cannot be stored: " + error->description);
  }
  if (std::get<PropertyValue>(back) != PropertyValue(domain)) {
    throw Failure("the key or value holds what a property list cannot hold (a control byte?)");
  }
}

void Store(Session& session, const PrefsArguments& arguments,
           const std::optional<PropertyValue>& value) {
  session.open(Access::kReadWrite)
      ->services()
      .preferences.DGWPreferencesSetValue(arguments.key, value, arguments.domain);
  // The services are gone, which made the change durable or not: a fresh look tells.
  const auto stored = session.open(Access::kReadOnly)
                          ->services()
                          .preferences.DGWPreferencesGetValue(arguments.key, arguments.domain);
  if (stored != value) {
    throw Failure(session.messages.lastErrorOr("the preference could not be stored"));
  }
}

void Set(Session& session, const PrefsArguments& arguments) {
  CheckDomain(arguments.domain);
  CheckRepresentable(arguments);
  Store(session, arguments, arguments.value);
}

void Remove(Session& session, const PrefsArguments& arguments) {
  CheckDomain(arguments.domain);
  Store(session, arguments, std::nullopt);
}

void List(Session& session, const PrefsArguments& arguments) {
  CheckDomain(arguments.domain);
  const std::string path = Root::FromEnvironment().path(std::string(kPreferencesDirectory) + "/" +
                                                        arguments.domain + ".plist");
  const auto bytes = ReadWholeFile(path, kMaxPropertyListBytes);
  Dictionary values;
  if (const int* error = std::get_if<int>(&bytes)) {
    if (*error != ENOENT) throw Failure("cannot read " + path + ": " + ErrnoText(*error));
  } else {
    const auto parsed = ReadPropertyList(std::get<std::string>(bytes));
    if (const auto* error = std::get_if<PropertyListError>(&parsed)) {
      throw Failure(path + " is damaged: " + error->description);
    }
    const Dictionary* dictionary = std::get<PropertyValue>(parsed).asDictionary();
    if (dictionary == nullptr) throw Failure(path + " is damaged: not a dictionary");
    values = *dictionary;
  }
  if (arguments.json) {
    session.out.line(JsonText(values, JsonForm::kTagged));
    return;
  }
  for (const auto& [key, value] : values) {
    session.out.line(Escape(key) + ": " + JsonText(value, JsonForm::kTagged));
  }
}

CLI::App* AddPrefsCommand(CLI::App& prefs, const std::string& name, const std::string& description,
                          const std::string& example, const Arguments& arguments, bool hasKey) {
  CLI::App* command = AddCommand(prefs, name, description, kTags, example);
  command->add_option("DOMAIN", arguments->domain, "The preference domain")->required();
  if (hasKey) command->add_option("KEY", arguments->key, "The key")->required();
  return command;
}

}  // namespace

void AddPrefsCommands(CLI::App& app, Session& session) {
  CLI::App* prefs = AddFamily(app, "prefs", "Preferences: read and change them",
                              "quorletctl prefs set nuvex.diagwell SubmissionEnabled true");
  const auto arguments = std::make_shared<PrefsArguments>();
  const auto select = [&session, arguments](CLI::App* command, auto run) {
    command->callback([&session, arguments, run] {
      session.command = [&session, arguments, run] { run(session, *arguments); };
    });
  };

  CLI::App* get =
      AddPrefsCommand(*prefs, "get", "Print a value as JSON",
                      "quorletctl prefs get nuvex.diagwell SubmissionEnabled", arguments, true);
  AddJsonFlag(*get, arguments->json);
  select(get, Get);

  CLI::App* set =
      AddPrefsCommand(*prefs, "set", "Store a value, at once",
                      "quorletctl prefs set nuvex.demo name '\"text\"'", arguments, true);
  const auto parse = [arguments](const std::string& text) {
    auto parsed = ParseJson(text, JsonForm::kTagged);
    if (const auto* why = std::get_if<std::string>(&parsed)) {
      throw CLI::ValidationError("VALUE", "not a JSON value: " + *why);
    }
    arguments->value = std::get<PropertyValue>(parsed);
  };
  set->add_option_function<std::string>("VALUE", parse, "JSON, but not null")->required();
  select(set, Set);

  select(AddPrefsCommand(*prefs, "remove", "Remove a value, at once",
                         "quorletctl prefs remove nuvex.demo name", arguments, true),
         Remove);

  CLI::App* list = AddPrefsCommand(*prefs, "list", "Print a domain's keys and values",
                                   "quorletctl prefs list nuvex.diagwell", arguments, false);
  AddJsonFlag(*list, arguments->json);
  select(list, List);
}

}  // namespace quorlet
