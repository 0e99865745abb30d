#include "ctl/options.h"

#include <CLI/CLI.hpp>

namespace quorlet {

std::optional<std::int32_t> ParseDay(std::string_view text) {
  const auto day = ParseNumber<std::int32_t>(text);
  return day && *day >= kFirstDay ? day : std::nullopt;
}

std::optional<std::int32_t> ParseSecond(std::string_view text) {
  const auto second = ParseNumber<std::int32_t>(text);
  return second && *second >= 0 && *second <= kLastSecond ? second : std::nullopt;
}

void AddDayOption(CLI::App& command, std::optional<std::int32_t>& day, const std::string& meaning) {
  const auto parse = [&day](const std::string& text) {
    day = ParseDay(text);
    if (!day) throw CLI::ValidationError("--day", "not a day number: " + text);
  };
  command.add_option_function<std::string>("--day", parse, meaning)->type_name("N");
}

void AddJsonFlag(CLI::App& command, bool& json) { command.add_flag("--json", json, "Print JSON"); }

CLI::App* AddCommand(CLI::App& parent, const std::string& name, const std::string& description,
                     const std::string& notes, const std::string& example) {
  CLI::App* command = parent.add_subcommand(name, description);
  command->footer((notes.empty() ? "" : notes + "\n") + "Example: " + example);
  return command;
}

CLI::App* AddFamily(CLI::App& parent, const std::string& name, const std::string& description,
                    const std::string& example) {
  CLI::App* family = AddCommand(parent, name, description, "", example);
  // Also keeps the words after the command from being taken for a further one.
  family->require_subcommand(1);
  return family;
}

}  // namespace quorlet
