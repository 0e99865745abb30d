// Options and arguments that several commands have, strictly read.
#ifndef QUORLET_CTL_OPTIONS_H_
#define QUORLET_CTL_OPTIONS_H_

#include <cstdint>
#include <limits>
#include <optional>
#include <string>
#include <string_view>

#include "values/digits.h"

namespace CLI {
class App;
class Option;
}  // namespace CLI

namespace quorlet {

// The lowest day is left out: a history query needs the day before.
inline constexpr std::int32_t kFirstDay = std::numeric_limits<std::int32_t>::min() + 1;
inline constexpr std::int32_t kLastDay = std::numeric_limits<std::int32_t>::max();
inline constexpr std::int32_t kLastSecond = 86399;

// The number of the day that it is, in UTC.
std::int32_t Today();
// A day number, kFirstDay to today.
std::optional<std::int32_t> ParseDayNumber(std::string_view text);
// A DAY of the command line: a day number, "YYYY-MM-DD", "today" or "yesterday"; not before 1970
// and not in the future. Throws CLI::ValidationError, which names `option`.
std::int32_t ParseDay(const std::string& option, const std::string& text);
// "2026-03-04 (day 20516)"
std::string DayText(std::int32_t day);
// A second of the day, 0 to kLastSecond.
std::optional<std::int32_t> ParseSecond(std::string_view text);

// Adds "--day DAY"; `meaning` says what it does and what holds without it.
void AddDayOption(CLI::App& command, std::optional<std::int32_t>& day, const std::string& meaning);

void AddJsonFlag(CLI::App& command, bool& json);

// A command. `description` fits a line; `notes`, lines of their own or nothing, and `example` end
// its help.
CLI::App* AddCommand(CLI::App& parent, const std::string& name, const std::string& description,
                     const std::string& notes, const std::string& example);

// A command that only holds further ones, of which one must be given.
CLI::App* AddFamily(CLI::App& parent, const std::string& name, const std::string& description,
                    const std::string& example);

}  // namespace quorlet

#endif  // QUORLET_CTL_OPTIONS_H_
