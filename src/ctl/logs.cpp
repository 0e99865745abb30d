// quorletctl logs: the logs that were written for submission.
//
// A log is one line of JSON (the header), then the body.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <array>
#include <cerrno>
#include <memory>
#include <tuple>
#include <vector>

#include "ctl/export_command.h"
#include "ctl/html_command.h"
#include "ctl/json_value.h"
#include "ctl/log_summary.h"
#include "ctl/options.h"
#include "ctl/session.h"
#include "ctl/terminal.h"
#include "platform/linux/base/descriptor.h"
#include "platform/linux/base/paths.h"
#include "platform/names.h"
#include "values/property_list.h"
#include "values/text.h"

namespace quorlet {
namespace {

// In the order in which a log passes through them.
// All logs together take no more.
constexpr std::size_t kMaxLogBytes = 64 << 20;
constexpr std::size_t kMaxHeaderBytes = 1 << 20;
constexpr std::string_view kLatest = "latest";

struct LogsArguments {
  std::string file;
  bool raw = false;
  bool json = false;
};

struct StoredLog {
  std::string stage;
  std::string name;
  std::uint64_t size = 0;
  std::string created;  // RFC 3339
  std::string type;     // empty: the header cannot be read
};

std::string StageDirectory(std::string_view stage) {
  return Root::FromEnvironment().path(std::string(kSpoolDirectory).append("/").append(stage));
}

// The log's first line, or nothing when it is not a JSON object.
std::optional<Dictionary> ParseHeader(std::string_view log) {
  const std::string_view line = log.substr(0, std::min(log.find('\n'), kMaxHeaderBytes));
  const auto parsed = ParseJson(line, JsonForm::kPlain);
  const auto* value = std::get_if<PropertyValue>(&parsed);
  const Dictionary* header = value != nullptr ? value->asDictionary() : nullptr;
  return header != nullptr ? std::optional(*header) : std::nullopt;
}

std::string StringMember(const Dictionary& header, std::string_view name) {
  const std::string* text = StringEntry(header, name);
  return text != nullptr ? *text : std::string();
}

// The first bytes of an open file, up to the end of its first line or kMaxHeaderBytes.
std::string ReadFirstLine(int descriptor, const std::string& path) {
  std::string bytes;
  std::array<char, 4096> block;
  while (bytes.size() < kMaxHeaderBytes && bytes.find('\n') == std::string::npos) {
    const ssize_t size = ::read(descriptor, block.data(), block.size());
    if (size < 0) throw Failure("cannot read " + path + ": " + ErrnoText(errno));
    if (size == 0) break;
    bytes.append(block.data(), static_cast<std::size_t>(size));
  }
  return bytes;
}

[[noreturn]] void FailReading(const std::string& path, int error) {
  throw Failure("cannot read " + path + ": " + ErrnoText(error));
}

// Nothing for what is not a regular file, or has gone meanwhile.
std::optional<StoredLog> Examine(std::string_view stage, const std::string& name) {
  const std::string path = StageDirectory(stage) + "/" + name;
  const Descriptor file(::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_NOFOLLOW | O_CLOEXEC));
  if (!file.isOpen()) {
    const bool isNoLog = errno == ENOENT || errno == ELOOP || errno == ENXIO;
    if (!isNoLog) FailReading(path, errno);
    return std::nullopt;
  }
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) FailReading(path, errno);
  if (!S_ISREG(status.st_mode)) return std::nullopt;
  const Dictionary header = ParseHeader(ReadFirstLine(file.get(), path)).value_or(Dictionary());
  StoredLog log{std::string(stage), name, static_cast<std::uint64_t>(status.st_size),
                StringMember(header, "created"), StringMember(header, "type")};
  // A text of another form would upset the order of creation.
  if (log.created.size() != Rfc3339({}).size()) {
    log.created = Rfc3339({static_cast<double>(status.st_mtim.tv_sec)});
  }
  return log;
}

// The number at the end of "<log name>-<time>-<number>.log", or 0.
std::uint64_t NumberOf(std::string_view name) {
  constexpr std::string_view kSuffix = ".log";
  if (!name.ends_with(kSuffix)) return 0;
  name.remove_suffix(kSuffix.size());
  return ParseNumber<std::uint64_t>(name.substr(name.rfind('-') + 1)).value_or(0);
}

// Every log, the newest last.
std::vector<StoredLog> FindLogs() {
  std::vector<StoredLog> logs;
  for (const std::string_view stage : kSpoolStages) {
    for (const std::string& name : NamesIn(StageDirectory(stage))) {
      // Temporary files are hidden.
      if (name.starts_with('.')) continue;
      if (auto log = Examine(stage, name)) logs.push_back(std::move(*log));
    }
  }
  std::ranges::sort(logs, {}, [](const StoredLog& log) {
    return std::tuple(log.created, NumberOf(log.name), log.name);
  });
  return logs;
}

void List(Session& session, const LogsArguments& arguments) {
  const std::vector<StoredLog> logs = FindLogs();
  if (arguments.json) {
    Array list;
    for (const StoredLog& log : logs) {
      list.push_back(Dictionary{{"directory", log.stage},
                                {"name", log.name},
                                {"size", UInt64(log.size)},
                                {"created", log.created},
                                {"type", log.type}});
    }
    session.out.line(JsonText(list, JsonForm::kPlain));
    return;
  }
  if (IsTerminal()) {
    std::vector<std::vector<std::string>> rows;
    rows.reserve(logs.size());
    for (const StoredLog& log : logs) {
      rows.push_back({std::string(log.stage), Escape(log.created), std::to_string(log.size),
                      log.type.empty() ? "?" : Escape(log.type), Escape(log.name)});
    }
    for (const std::string& line :
         TableLines(rows, {false, false, true, true, false}, 4, GetTerminalSize().columns)) {
      session.out.line(line);
    }
    return;
  }
  for (const StoredLog& log : logs) {
    const std::string size = std::to_string(log.size);
    std::string line = log.stage == kSpoolStages[0] ? "pending  " : "outbox   ";
    line += Escape(log.created);
    line.append(size.size() < 9 ? 9 - size.size() : 1, ' ').append(size).append("  type ");
    line += log.type.empty() ? "?" : Escape(log.type);
    line.append("  ").append(Escape(log.name));
    session.out.line(line);
  }
}

std::string LogBytes(const std::string& path, std::variant<std::string, int> bytes) {
  if (const int* error = std::get_if<int>(&bytes)) FailReading(path, *error);
  return std::get<std::string>(std::move(bytes));
}

// Where the log of that name has got to.
std::string PathOfNamedLog(const std::string& name) {
  if (!IsSafeName(name)) throw Failure("not the name of a log: " + name);
  for (const std::string_view stage : kSpoolStages) {
    std::string path = StageDirectory(stage) + "/" + name;
    if (::access(path.c_str(), F_OK) == 0) return path;
    if (errno != ENOENT) FailReading(path, errno);
  }
  throw Failure("neither pending nor outbox has a log " + name);
}

std::string ReadRequestedLog(const std::string& file) {
  if (file.find('/') != std::string::npos) return LogBytes(file, ReadWholeFile(file, kMaxLogBytes));
  const std::string path = PathOfLog(file);
  return LogBytes(path, ReadOwnFile(path, kMaxLogBytes));
}

void Show(Session& session, const LogsArguments& arguments) {
  const std::string log = ReadRequestedLog(arguments.file);
  if (!arguments.json) {
    std::variant<ExportedLog, std::string> read = "not asked for";
    if (!arguments.raw && IsTerminal()) read = ReadExportedLog(log);
    const auto* summed = std::get_if<ExportedLog>(&read);
    session.out.write(summed != nullptr ? LogSummary(*summed, GetTerminalSize().columns) : log);
    return;
  }
  const auto header = ParseHeader(log);
  if (!header) throw Failure("the log does not start with a line of JSON");
  const std::size_t lineBreak = log.find('\n');
  const std::string_view body =
      lineBreak == std::string::npos ? "" : std::string_view(log).substr(lineBreak + 1);
  const auto document = ReadPropertyList(body, kLogLimits);
  const auto* value = std::get_if<PropertyValue>(&document);
  const Dictionary both{{"header", *header},
                        {"body", value != nullptr ? *value : PropertyValue(body)}};
  session.out.line(JsonText(both, JsonForm::kPlain));
}

// Under the pass lock, since a repeated pass replaces logs.
void Submit(Session& session) {
  const auto platform = session.open(Access::kReadWrite);
  Platform& services = platform->services();
  RequireConsent(services);
  const PassHold hold(services.passLock);
  if (hold.isHeld()) services.diagnostics.SubmitDiagnosticLogs();
  if (!session.messages.errors().empty()) throw Failure(session.messages.errors().front());
}

}  // namespace

std::string PathOfLog(const std::string& name) {
  if (name != kLatest) return PathOfNamedLog(name);
  const std::vector<StoredLog> logs = FindLogs();
  if (logs.empty()) throw Failure("there is no log yet");
  const auto last =
      std::ranges::find(logs.rbegin(), logs.rend(), kAggregatedLogType, &StoredLog::type);
  return PathOfNamedLog(last != logs.rend() ? last->name : logs.back().name);
}

void AddLogsCommands(CLI::App& app, Session& session) {
  CLI::App* logs = AddFamily(app, "logs", "Logs written for submission: pending and outbox",
                             "quorletctl logs show latest");
  const auto arguments = std::make_shared<LogsArguments>();
  CLI::App* list = AddCommand(*logs, "list", "List the logs, the newest last", "",
                              "quorletctl logs list --json");
  AddJsonFlag(*list, arguments->json);
  list->callback([&session, arguments] {
    session.command = [&session, arguments] { List(session, *arguments); };
  });

  AddExportCommand(*logs, session);
  AddHtmlCommand(*logs, session);

  CLI::App* submit = AddCommand(*logs, "submit", "Hand the pending logs to the uploader",
                                "They are moved to outbox/. Refused without the owner's consent.",
                                "quorletctl logs submit");
  submit->callback([&session] { session.command = [&session] { Submit(session); }; });

  CLI::App* show = AddCommand(
      *logs, "show", "Print a log",
      "In a terminal a summary of it. Into a pipe or file, and with --raw, its bytes: the\n"
      "header, one line of JSON, then the body.\n"
      "With --json: one object with \"header\" and \"body\" (a property list as JSON).",
      "quorletctl logs show latest");
  show->add_option("FILE", arguments->file, "A listed name, \"latest\", or a path with a \"/\"")
      ->required();
  show->add_flag("--raw", arguments->raw, "The log's bytes, in a terminal too");
  AddJsonFlag(*show, arguments->json);
  show->callback([&session, arguments] {
    session.command = [&session, arguments] { Show(session, *arguments); };
  });
}

}  // namespace quorlet
