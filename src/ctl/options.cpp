#include "ctl/options.h"

#include <CLI/CLI.hpp>
#include <chrono>

#include "values/text.h"

namespace quorlet {

std::int32_t Today() {
  using std::chrono::days;
  const auto now = std::chrono::system_clock::now().time_since_epoch();
  return static_cast<std::int32_t>(std::chrono::floor<days>(now).count());
}

std::optional<std::int32_t> ParseDayNumber(std::string_view text) {
  const auto day = ParseNumber<std::int32_t>(text);
  return day && *day >= kFirstDay && *day <= Today() ? day : std::nullopt;
}

std::int32_t ParseDay(const std::string& option, const std::string& text) {
  const std::int32_t today = Today();
  if (text == "today") return today;
  if (text == "yesterday") return today - 1;
  const auto number = ParseNumber<std::int32_t>(text);
  const auto day = number ? number : ParseDate(text);
  if (!day) {
    throw CLI::ValidationError(option,
                               "not a day number, YYYY-MM-DD, \"today\" or \"yesterday\": " + text);
  }
  if (*day < 0) throw CLI::ValidationError(option, "a day before 1970: " + text);
  if (*day > today) throw CLI::ValidationError(option, "a day in the future: " + text);
  return *day;
}

std::string DayText(std::int32_t day) {
  return Rfc3339({day * 86400.0}).substr(0, 10) + " (day " + std::to_string(day) + ")";
}

std::optional<std::int32_t> ParseSecond(std::string_view text) {
  const auto second = ParseNumber<std::int32_t>(text);
  return second && *second >= 0 && *second <= kLastSecond ? second : std::nullopt;
}

void AddDayOption(CLI::App& command, std::optional<std::int32_t>& day, const std::string& meaning) {
  const auto parse = [&day](const std::string& text) { day = ParseDay("--day", text); };
  command.add_option_function<std::string>("--day", parse, meaning)->type_name("DAY");
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
