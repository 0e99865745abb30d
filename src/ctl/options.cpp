#include "ctl/options.h"

#include <CLI/CLI.hpp>
#include <chrono>

namespace quorlet {

namespace {

// The day of a date such as 2026-03-04, which must be one of the calendar.
std::optional<std::int32_t> DayOfDate(std::string_view text) {
  if (text.size() != 10 || text[4] != '-' || text[7] != '-') return std::nullopt;
  const auto year = ParseNumber<std::uint16_t>(text.substr(0, 4));
  const auto month = ParseNumber<std::uint8_t>(text.substr(5, 2));
  const auto day = ParseNumber<std::uint8_t>(text.substr(8, 2));
  if (!year || !month || !day) return std::nullopt;
  const std::chrono::year_month_day date{std::chrono::year(*year), std::chrono::month(*month),
                                         std::chrono::day(*day)};
  if (!date.ok()) return std::nullopt;
  return static_cast<std::int32_t>(std::chrono::sys_days(date).time_since_epoch().count());
}

}  // namespace

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
  const auto day = number ? number : DayOfDate(text);
  if (!day) {
    throw CLI::ValidationError(option,
                               "not a day number, YYYY-MM-DD, \"today\" or \"yesterday\": " + text);
  }
  if (*day < 0) throw CLI::ValidationError(option, "a day before 1970: " + text);
  if (*day > today) throw CLI::ValidationError(option, "a day in the future: " + text);
  return *day;
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
