// quorletctl channels: what the reporting channels of drivers and of the machine say.
#include <CLI/CLI.hpp>
#include <algorithm>
#include <chrono>
#include <cmath>
#include <map>
#include <memory>

#include "ctl/channel_view.h"
#include "ctl/json_value.h"
#include "ctl/metrics_text.h"
#include "ctl/options.h"
#include "ctl/session.h"
#include "ctl/terminal.h"
#include "drvreport/drvreport.h"
#include "platform/linux/base/paths.h"
#include "values/digits.h"

namespace quorlet {
namespace {

using SteadyClock = std::chrono::steady_clock;

constexpr double kShortestInterval = 0.01;
constexpr double kLongestInterval = 86400;
constexpr std::size_t kSampleBarWidth = 20;

// What a channel must be to be shown; what is not given does not matter.
struct Selection {
  std::optional<std::uint16_t> categories;
  std::optional<std::uint8_t> format;
  std::optional<std::string> group;
  std::optional<std::string> subgroup;
  std::optional<std::uint64_t> unit;
  std::optional<std::string> unitLabel;
  std::optional<std::uint64_t> id;

  bool matches(Dictionary& channel) const {
    const auto is = [](const std::string* text, const std::optional<std::string>& wanted) {
      return !wanted || (text != nullptr && *text == *wanted);
    };
    return (!categories || (DrvReportChannelGetCategories(channel) & *categories) != 0) &&
           (!format || DrvReportChannelGetFormat(channel) == *format) &&
           is(DrvReportChannelGetGroup(channel), group) &&
           is(DrvReportChannelGetSubGroup(channel), subgroup) &&
           (!unit || DrvReportChannelGetUnit(channel) == *unit) &&
           is(unitLabel ? DrvReportChannelGetUnitLabel(channel) : nullptr, unitLabel) &&
           (!id || static_cast<std::uint64_t>(DrvReportChannelGetChannelID(channel)) == *id);
  }
};

struct ChannelsArguments {
  Selection selection;
  bool json = false;
  std::optional<MetricsFormat> metrics;
  double interval = 1;
  std::optional<std::uint64_t> count;
};
using Arguments = std::shared_ptr<ChannelsArguments>;

[[noreturn]] void Fail(std::string_view what, const std::optional<ErrorValue>& error) {
  std::string text(what);
  if (error) {
    text +=
        ": " + error->reason + " (" + Hexadecimal(static_cast<std::uint32_t>(error->code)) + ")";
  }
  throw Failure(text);
}

Dictionary Select(DriverRegistry& registry, const Selection& selection) {
  std::optional<ErrorValue> error;
  auto channels = DrvReportCopyAllChannels(registry, kDrvReportLogFailures, &error);
  if (!channels) Fail("cannot look for channels", error);
  const int pruned = DrvReportPrune(*channels, [&](Dictionary& channel) {
    return selection.matches(channel) ? 0 : kDrvReportLeaveOut;
  });
  if ((pruned & 1) != 0) Fail("cannot look through the channels", error);
  return *channels;
}

// In the order of the walk; what is done to one is done to the collection's.
std::vector<Dictionary> InOrder(const Dictionary& channels) {
  std::vector<Dictionary> all;
  DrvReportIterate(channels, [&](const Dictionary& channel) {
    all.push_back(channel);
    return 0;
  });
  return all;
}

// The values of the selected channels at one moment.
struct Moment {
  SteadyClock::time_point time;
  std::vector<Dictionary> samples;
};

class Sampler {
 public:
  Sampler(Session& session, const Selection& selection)
      : platform_(session.open(Access::kReadOnly)),
        registry_(platform_->services().driverRegistry) {
    const Dictionary channels = Select(registry_, selection);
    if (InOrder(channels).empty()) throw Failure("no channel matches");
    std::optional<ErrorValue> error;
    subscription_ =
        DrvReportCreateSubscription(registry_, nullptr, &channels, &subscribed_, 0, &error);
    if (!subscription_) Fail("cannot subscribe to the channels", error);
  }

  Moment take() {
    std::optional<ErrorValue> error;
    const auto samples = DrvReportCreateSamples(subscription_.get(), &subscribed_, &error);
    if (!samples) Fail("cannot sample the channels", error);
    return {SteadyClock::now(), InOrder(*samples)};
  }

  std::string timeText() { return Rfc3339(platform_->services().clock.now()); }

 private:
  const std::unique_ptr<LinuxPlatform> platform_;
  DriverRegistry& registry_;
  Dictionary subscribed_;
  std::shared_ptr<DrvReportSubscription> subscription_;
};

// One object, a channel a line.
class JsonChannels {
 public:
  explicit JsonChannels(Output& out) : out_(out) { out_.write("{\"channels\":["); }
  void add(const Dictionary& channel) {
    out_.write(isFirst_ ? "\n" : ",\n");
    isFirst_ = false;
    out_.write(JsonText(channel, JsonForm::kPlain));
  }
  void finish() { out_.line("]}"); }

 private:
  Output& out_;
  bool isFirst_ = true;
};

void Merge(const Dictionary& from, Dictionary& into) {
  for (const auto& [key, value] : from) into[key] = value;
}

void List(Session& session, const ChannelsArguments& arguments) {
  const auto platform = session.open(Access::kReadOnly);
  // The registry takes a directory that it cannot read for an empty one.
  static_cast<void>(NamesIn(platform->root().path(kDriversDirectory)));
  const Dictionary channels = Select(platform->services().driverRegistry, arguments.selection);
  if (channels.empty() && !session.messages.errors().empty()) {
    throw Failure(session.messages.lastErrorOr(""));
  }
  if (!arguments.json && IsTerminal()) {
    std::vector<std::vector<std::string>> rows = {
        {"CHANNEL", "GROUP", "FORMAT", "UNIT", "ELEMENTS", "DRIVER"}};
    for (Dictionary& channel : InOrder(channels)) rows.push_back(ListRow(channel));
    if (rows.size() == 1) return;
    for (const std::string& line : TableLines(rows, {false, false, false, false, true, false}, 0,
                                              GetTerminalSize().columns)) {
      session.out.line(line);
    }
    return;
  }
  std::optional<JsonChannels> json;
  if (arguments.json) json.emplace(session.out);
  for (Dictionary& channel : InOrder(channels)) {
    if (json) {
      json->add(DescribeChannel(channel));
    } else if (auto line = DrvReportChannelCopyDescription(channel)) {
      if (line->ends_with('\n')) line->pop_back();
      session.out.line(Escape(*line));
    }
  }
  if (json) json->finish();
}

void Sample(Session& session, const ChannelsArguments& arguments) {
  Sampler sampler(session, arguments.selection);
  Moment moment = sampler.take();
  if (arguments.metrics) {
    MetricsText metrics(*arguments.metrics);
    for (Dictionary& sample : moment.samples) metrics.add(sample);
    return session.out.write(metrics.text());
  }
  std::optional<JsonChannels> json;
  if (arguments.json) json.emplace(session.out);
  const std::size_t barWidth = IsTerminal() ? kSampleBarWidth : 0;
  for (Dictionary& sample : moment.samples) {
    if (json) {
      Dictionary described = DescribeChannel(sample);
      Merge(DescribeValues(sample), described);
      json->add(described);
    } else {
      for (const std::string& line : SampleLines(sample, "", barWidth)) session.out.line(line);
    }
  }
  if (json) json->finish();
}

// A sample and what has changed since the one before.
struct Change {
  Dictionary now;
  Dictionary delta;
  bool hasRestarted = false;
};

// Pair by pair: one that cannot be subtracted costs no other. What was not there before has not
// changed yet.
std::vector<Change> Changes(const Moment& earlier, const Moment& later) {
  const auto key = [](const Dictionary& sample) {
    return std::pair(DrvReportChannelGetDriverID(sample), DrvReportChannelGetChannelID(sample));
  };
  std::map<std::pair<std::int64_t, std::int64_t>, Dictionary> before;
  for (const Dictionary& sample : earlier.samples) before.emplace(key(sample), sample);
  std::vector<Change> changes;
  for (const Dictionary& sample : later.samples) {
    const auto partner = before.find(key(sample));
    if (partner == before.end()) continue;
    auto delta = DrvReportSampleCreateDelta(partner->second, sample);
    if (!delta) continue;
    const bool hasRestarted = HasRestarted(*delta);
    changes.push_back({sample, *std::move(delta), hasRestarted});
  }
  return changes;
}

class Watch {
 public:
  Watch(Session& session, const ChannelsArguments& arguments)
      : out_(session.out),
        arguments_(arguments),
        sampler_(session, arguments.selection),
        isTable_(!arguments.json && IsTerminal()) {}

  void run() {
    Interruption interruption;
    std::optional<LeaveKey> leaveKey;
    if (isTable_) leaveKey.emplace();
    const auto interval = std::chrono::duration_cast<SteadyClock::duration>(
        std::chrono::duration<double>(arguments_.interval));
    Moment earlier = sampler_.take();
    SteadyClock::time_point end = earlier.time + interval;
    if (isTable_) out_.write("\x1b[H\x1b[2J");
    for (std::uint64_t shown = 0; !arguments_.count || shown < *arguments_.count; ++shown) {
      if (!out_.finish() || !interruption.waitUntil(end)) return;
      Moment later = sampler_.take();
      show(Changes(earlier, later),
           std::chrono::duration<double>(later.time - earlier.time).count());
      // One that took too long does not make the next ones short.
      end = std::max(end + interval, later.time);
      earlier = std::move(later);
    }
  }

 private:
  void show(std::vector<Change> changes, double seconds) {
    if (arguments_.json) {
      showJson(changes, seconds);
    } else if (isTable_) {
      showTable(changes, seconds);
    } else {
      const std::string prefix = sampler_.timeText() + " ";
      for (Change& change : changes) {
        for (const std::string& line : lines(change, prefix)) out_.line(line);
      }
    }
  }

  static std::vector<std::string> lines(Change& change, std::string_view prefix) {
    if (change.hasRestarted) return {NoteLine(change.now, prefix, "restarted")};
    return SampleLines(change.delta, prefix, 0);
  }

  void showJson(std::vector<Change>& changes, double seconds) {
    Array channels;
    for (Change& change : changes) {
      Dictionary described = DescribeChannel(change.now);
      Merge(DescribeValues(change.now), described);
      if (change.hasRestarted) {
        described["restarted"] = true;
      } else {
        described["delta"] = DescribeValues(change.delta);
      }
      channels.push_back(described);
    }
    out_.line(JsonText(
        Dictionary{
            {"time", sampler_.timeText()}, {"seconds", Double(seconds)}, {"channels", channels}},
        JsonForm::kPlain));
  }

  static std::vector<std::string> table(std::vector<Change>& changes, double seconds,
                                        std::size_t columns) {
    std::vector<std::string> rows = {TableHeader(columns)};
    for (Change& change : changes) {
      if (change.hasRestarted) {
        rows.emplace_back(FitColumns(NoteLine(change.now, "", "restarted"), columns));
        continue;
      }
      std::ranges::move(TableRows(change.now, change.delta, seconds, columns),
                        std::back_inserter(rows));
    }
    return rows;
  }

  // Writes over the table before, so that nothing flickers. What has not changed makes way for the
  // rest when there is not enough room.
  void showTable(std::vector<Change>& changes, double seconds) {
    const TerminalSize size = GetTerminalSize();
    const std::size_t room = std::max<std::size_t>(size.rows, 3) - 1;
    std::vector<std::string> rows = table(changes, seconds, size.columns);
    if (rows.size() > room) {
      std::erase_if(changes, [](const Change& change) {
        return DrvReportSimpleGetIntegerValue(change.delta) == 0;
      });
      rows = table(changes, seconds, size.columns);
    }
    if (rows.size() > room) {
      const std::size_t left = rows.size() - room + 1;
      rows.resize(room - 1);
      rows.emplace_back(
          FitColumns("and " + Counted(left, "more line") + "; choose a --group", size.columns));
    }
    out_.write("\x1b[H");
    for (const std::string& row : rows) {
      out_.write(row);
      out_.write("\x1b[K\n");
    }
    out_.write("\x1b[J");
  }

  Output& out_;
  const ChannelsArguments& arguments_;
  Sampler sampler_;
  const bool isTable_;
};

// Decimal, or hexadecimal after "0x".
template <std::unsigned_integral T>
std::optional<T> ParseCode(std::string_view text) {
  if (!text.starts_with("0x") && !text.starts_with("0X")) return ParseNumber<T>(text);
  return ParseNumber<T>(text.substr(2), 16);
}

// What is meant as a number, and so no text.
bool LooksLikeNumber(std::string_view text) {
  return text.empty() || text.starts_with('-') || text.starts_with("0x") || text.starts_with("0X");
}

// A number, or up to eight characters, which are its bytes.
std::optional<std::uint64_t> ParseID(const std::string& text) {
  if (const auto code = ParseCode<std::uint64_t>(text)) return code;
  const bool isText = text.size() <= 8 && PrintableAsciiPrefix(text) == text.size();
  if (!isText || LooksLikeNumber(text)) return std::nullopt;
  std::uint64_t id = 0;
  for (const char c : text) id = id << 8 | static_cast<unsigned char>(c);
  return id;
}

std::optional<std::uint8_t> ParseFormat(const std::string& text) {
  for (std::uint8_t format = 1; format <= 4; ++format) {
    if (text == FormatName(format)) return format;
  }
  return ParseCode<std::uint8_t>(text);
}

// An option whose text `parse` turns into a value, or into nothing when it is wrong.
template <typename T, typename Parse>
void AddParsed(CLI::App& command, const std::string& name, const std::string& type,
               const std::string& meaning, T& value, Parse parse) {
  const auto take = [&value, name, parse](const std::string& text) {
    const auto parsed = parse(text);
    if (!parsed) throw CLI::ValidationError(name, "not a value for it: " + text);
    value = *parsed;
  };
  command.add_option_function<std::string>(name, take, meaning)->type_name(type);
}

void AddSelection(CLI::App& command, Selection& selection) {
  AddParsed(command, "--category", "MASK", "Only channels of any of these categories (0x100)",
            selection.categories, ParseCode<std::uint16_t>);
  AddParsed(command, "--format", "F", "Only simple, state, histogram or array channels",
            selection.format, ParseFormat);
  command.add_option("--group", selection.group, "Only channels of this group")->type_name("G");
  command.add_option("--subgroup", selection.subgroup, "Only channels of this subgroup")
      ->type_name("S");
  command
      .add_option_function<std::string>(
          "--unit",
          [&selection](const std::string& text) {
            selection.unit = ParseCode<std::uint64_t>(text);
            if (selection.unit) return;
            if (LooksLikeNumber(text)) throw CLI::ValidationError("--unit", "not a unit: " + text);
            selection.unitLabel = text;
          },
          "Only channels with this unit: a label, such as ms, or a code")
      ->type_name("U");
  AddParsed(command, "--id", "N",
            "Only channels with this ID: a number, or the text that it prints", selection.id,
            ParseID);
}

constexpr char kSelectionNotes[] =
    "Several of these options narrow each other down. Numbers may be written as 0x...";

CLI::App* AddChannelsCommand(CLI::App& channels, Session& session, const Arguments& arguments,
                             const std::string& name, const std::string& description,
                             const std::string& example,
                             void (*run)(Session&, const ChannelsArguments&)) {
  CLI::App* command = AddCommand(channels, name, description, kSelectionNotes, example);
  AddSelection(*command, arguments->selection);
  AddJsonFlag(*command, arguments->json);
  command->callback([&session, arguments, run] {
    session.command = [&session, arguments, run] { run(session, *arguments); };
  });
  return command;
}

void AddSampleCommand(CLI::App& channels, Session& session) {
  const auto arguments = std::make_shared<ChannelsArguments>();
  CLI::App* command =
      AddChannelsCommand(channels, session, arguments, "sample", "Print what channels report now",
                         "quorletctl channels sample --group Temperatures", Sample);
  const auto set = [arguments](MetricsFormat format) {
    return [arguments, format] { arguments->metrics = format; };
  };
  CLI::Option* open = command->add_flag_callback("--openmetrics", set(MetricsFormat::kOpenMetrics),
                                                 "As text in the format OpenMetrics");
  CLI::Option* prometheus =
      command->add_flag_callback("--prometheus", set(MetricsFormat::kPrometheus),
                                 "As text in the format that the node exporter reads from files");
  open->excludes(prometheus)->excludes(command->get_option("--json"));
  prometheus->excludes(command->get_option("--json"));
}

void AddWatchCommand(CLI::App& channels, Session& session) {
  const auto arguments = std::make_shared<ChannelsArguments>();
  CLI::App* command = AddChannelsCommand(
      channels, session, arguments, "watch", "Print what changes, again and again",
      "quorletctl channels watch --group \"CPU Idle\" --interval 2",
      [](Session& s, const ChannelsArguments& a) { Watch(s, a).run(); });
  AddParsed(*command, "--interval", "SECONDS", "Time between samples (without it: 1)",
            arguments->interval, [](const std::string& text) {
              const auto seconds = ParseNumber<double>(text);
              return seconds && *seconds >= kShortestInterval && *seconds <= kLongestInterval
                         ? seconds
                         : std::nullopt;
            });
  AddParsed(*command, "--count", "N", "End after so many intervals (without it: never)",
            arguments->count, [](const std::string& text) {
              const auto count = ParseNumber<std::uint64_t>(text);
              return count && *count > 0 ? count : std::nullopt;
            });
}

}  // namespace

void AddChannelsCommands(CLI::App& app, Session& session) {
  CLI::App* channels =
      AddFamily(app, "channels", "Reporting channels of drivers and of the running machine",
                "quorletctl channels watch --group Pressure");
  AddChannelsCommand(*channels, session, std::make_shared<ChannelsArguments>(), "list",
                     "Print what channels there are, one a line",
                     "quorletctl channels list --category 0x100", List);
  AddSampleCommand(*channels, session);
  AddWatchCommand(*channels, session);
}

}  // namespace quorlet
