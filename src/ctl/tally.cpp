// quorletctl tally: counters in and out of the counter store.
#include <fcntl.h>
#include <sys/stat.h>

#include <CLI/CLI.hpp>
#include <array>
#include <cerrno>
#include <cmath>
#include <cstdio>
#include <memory>
#include <span>
#include <vector>

#include "ctl/json_value.h"
#include "ctl/options.h"
#include "ctl/session.h"
#include "ctl/tally_import.h"
#include "ctl/tally_lines.h"
#include "ctl/tally_listen.h"
#include "ctl/whitelist.h"
#include "platform/linux/base/descriptor.h"
#include "platform/linux/base/paths.h"

namespace quorlet {
namespace {

constexpr char kStoreSilent[] = "the counter store could not be written";

struct TallyArguments {
  std::string key;
  std::int64_t scalar = 0;
  std::vector<double> numbers;
  std::optional<std::int32_t> day;
  std::optional<std::int32_t> second;
  std::string file = "-";
  bool json = false;
};
using Arguments = std::shared_ptr<TallyArguments>;

std::int32_t DayOrToday(const TallyArguments& arguments, LinuxPlatform& platform) {
  return arguments.day ? *arguments.day : platform.services().counterStore.TLDaysSince1970();
}

std::int32_t SecondOfToday(LinuxPlatform& platform) {
  const double now = std::floor(platform.services().clock.now().secondsSince1970);
  return static_cast<std::int32_t>(now - std::floor(now / 86400) * 86400);
}

// All or, after a Failure, nothing.
void Write(Session& session, CounterStore& store, const std::string& key,
           const StoreChanges& changes) {
  if (!store.takesKey(key) || !store.write(changes)) {
    throw Failure(session.messages.lastErrorOr(kStoreSilent));
  }
}

void ChangeScalar(Session& session, const TallyArguments& arguments, bool add) {
  const auto platform = session.open(Access::kReadWrite);
  const auto kind = add ? ScalarChange::Kind::kAdd : ScalarChange::Kind::kSet;
  StoreChanges changes;
  changes.scalars = {{kind, arguments.key, arguments.scalar, DayOrToday(arguments, *platform)}};
  Write(session, platform->services().counterStore, arguments.key, changes);
  NoteUnlisted(session, arguments.key, KeyKind::kScalar);
}

void Record(Session& session, const TallyArguments& arguments) {
  const auto platform = session.open(Access::kReadWrite);
  const std::int32_t second = arguments.second ? *arguments.second : SecondOfToday(*platform);
  StoreChanges changes;
  RecordedValues& recorded = changes.values.emplace_back();
  recorded.key = arguments.key;
  recorded.day = DayOrToday(arguments, *platform);
  for (const double number : arguments.numbers) recorded.add(number, second);
  Write(session, platform->services().counterStore, arguments.key, changes);
  NoteUnlisted(session, arguments.key, KeyKind::kDistribution);
}

void Import(Session& session, const TallyArguments& arguments) {
  const auto platform = session.open(Access::kReadWrite);
  const ImportCounts counts =
      ImportTallies(arguments.file, platform->services().counterStore, session.messages);
  session.out.line("imported " + Counted(counts.scalars, "scalar") + " and " +
                   Counted(counts.values, "value"));
}

// Bytes on their way to standard output, which may be a pipe that nobody empties: while the store
// is being read they are only kept, in memory or, when there are many, in an unnamed file.
class KeptOutput {
 public:
  void write(std::string_view bytes) {
    if (error_ != 0) return;
    memory_ += bytes;
    if (memory_.size() >= kMostInMemory) spill();
  }

  bool ok() const { return error_ == 0; }

  // Hands everything on, in order.
  void writeTo(Output& out) {
    if (file_ && error_ == 0) copyFile(out);
    if (error_ != 0) throw Failure("cannot use a temporary file: " + ErrnoText(error_));
    out.write(memory_);
  }

 private:
  static constexpr std::size_t kMostInMemory = 8 << 20;
  struct Close {
    void operator()(std::FILE* file) const { std::fclose(file); }
  };

  void spill() {
    if (!file_) file_.reset(std::tmpfile());
    if (!file_ || std::fwrite(memory_.data(), 1, memory_.size(), file_.get()) != memory_.size()) {
      error_ = errno;
    }
    memory_.clear();
  }

  void copyFile(Output& out) {
    if (std::fflush(file_.get()) != 0) error_ = errno;
    std::rewind(file_.get());
    std::array<char, 1 << 16> block;
    while (error_ == 0 && out.ok()) {
      const std::size_t size = std::fread(block.data(), 1, block.size(), file_.get());
      if (size == 0) break;
      out.write({block.data(), size});
    }
    if (error_ == 0 && std::ferror(file_.get())) error_ = errno;
  }

  std::string memory_;
  std::unique_ptr<std::FILE, Close> file_;
  int error_ = 0;
};

// Writes the rows of the store as lines or as one JSON object, row by row.
class Dump {
 public:
  Dump(KeptOutput& out, bool json) : out_(out), json_(json) {}

  void run(TLHistory* history, std::optional<std::int32_t> day) {
    const std::int32_t above = day ? *day - 1 : kFirstDay - 1;
    const std::int32_t upTo = day ? *day : kLastDay;
    if (json_) out_.write("{\"schema\":1,\"scalars\":[");
    if (history != nullptr) {
      history->scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
          "", above, upTo,
          [this](std::string_view key, std::int32_t rowDay, std::int64_t value, bool& stop) {
            scalar(key, rowDay, value);
            stop = !out_.ok();
          });
    }
    if (json_) out_.write("],\"distributions\":[");
    isFirst_ = true;
    if (history != nullptr) {
      history->distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
          "", above, upTo,
          [this](std::string_view key, std::int32_t rowDay, TLHistoryDistributionEnumerator& values,
                 bool& stop) {
            distribution(key, rowDay, values);
            stop = !out_.ok();
          });
    }
    if (json_) out_.write("]}\n");
  }

 private:
  void scalar(std::string_view key, std::int32_t day, std::int64_t value) {
    buffer_.clear();
    if (json_) {
      openRow(key, day);
      buffer_ += "\"value\":" + std::to_string(value) + "}";
    } else {
      AppendScalarLine(day, Escape(key), value, buffer_);
    }
    out_.write(buffer_);
  }

  void distribution(std::string_view key, std::int32_t day,
                    TLHistoryDistributionEnumerator& values) {
    const std::string escapedKey = Escape(key);
    buffer_.clear();
    if (json_) {
      openRow(key, day);
      buffer_ += "\"values\":[";
    }
    bool isFirstValue = true;
    DistributionSample sample;
    while (out_.ok() && values.getNextValueSecondsInDayOffset(sample.value, sample.secondsInDay)) {
      if (json_) {
        appendPair(sample, isFirstValue);
        isFirstValue = false;
      } else {
        AppendSampleLine(day, escapedKey, sample, buffer_);
      }
      out_.write(buffer_);
      buffer_.clear();
    }
    if (json_) buffer_ += "]}";
    out_.write(buffer_);
  }

  void openRow(std::string_view key, std::int32_t day) {
    buffer_ += isFirst_ ? "\n" : ",\n";
    isFirst_ = false;
    buffer_ += "{\"day\":" + std::to_string(day) + ",\"key\":" + keyJson(key) + ",";
  }

  // A key that is not text stands as its bytes, so that different keys stay different.
  static std::string keyJson(std::string_view key) {
    if (IsValidUtf8(key)) return JsonText(key, JsonForm::kPlain);
    const auto bytes = std::as_bytes(std::span(key));
    return JsonText(Data(bytes.begin(), bytes.end()), JsonForm::kTagged);
  }

  void appendPair(const DistributionSample& sample, bool isFirstValue) {
    if (!isFirstValue) buffer_ += ',';
    buffer_ += '[' + std::to_string(sample.secondsInDay) + ',';
    buffer_ += std::isfinite(sample.value) ? RealText(sample.value) : "null";
    buffer_ += ']';
  }

  KeptOutput& out_;
  bool json_;
  bool isFirst_ = true;
  std::string buffer_;
};

// Whether there is a store. One that is there but cannot be opened is a failure, not emptiness.
bool StoreExists(LinuxPlatform& platform, const Messages& messages) {
  const auto home = platform.services().queries.dataHomePath();
  if (!home) throw Failure(messages.lastErrorOr("there is no place for the counters"));
  const std::string path = platform.root().path(*home + kCounterStorePath);
  const Descriptor store(::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
  if (!store.isOpen() && errno == ENOENT) return false;
  struct stat status {};
  if (!store.isOpen() || ::fstat(store.get(), &status) != 0) {
    throw Failure("cannot read " + path + ": " + ErrnoText(errno));
  }
  if (!S_ISREG(status.st_mode)) throw Failure("cannot read " + path + ": it is not a file");
  return true;
}

void DumpTallies(Session& session, const TallyArguments& arguments) {
  KeptOutput kept;
  {
    const auto platform = session.open(Access::kReadOnly);
    const bool exists = StoreExists(*platform, session.messages);
    const auto history = exists ? platform->services().counterStore.initWithDefaultPath() : nullptr;
    if (exists && history == nullptr) {
      throw Failure(session.messages.lastErrorOr("the counter store cannot be read"));
    }
    Dump(kept, arguments.json).run(history.get(), arguments.day);
    if (!session.messages.errors().empty()) throw Failure(session.messages.lastErrorOr(""));
  }  // The store is free for others while standard output takes its time.
  kept.writeTo(session.out);
}

void AddKey(CLI::App& command, TallyArguments& arguments) {
  command.add_option("KEY", arguments.key, "The counter's key, any bytes")->required();
}

void AddScalarCommand(CLI::App& tally, Session& session, bool add) {
  const auto arguments = std::make_shared<TallyArguments>();
  const std::string name = add ? "add" : "set";
  CLI::App* command =
      AddCommand(tally, name, add ? "Add to a scalar (a missing one counts as 0)" : "Set a scalar",
                 "", "quorletctl tally " + name + " nuvex.demo.launches 5");
  AddKey(*command, *arguments);
  const auto parse = [arguments](const std::string& text) {
    const auto value = ParseNumber<std::int64_t>(text);
    if (!value) throw CLI::ValidationError("VALUE", "not a whole number of 64 bits: " + text);
    arguments->scalar = *value;
  };
  command->add_option_function<std::string>("VALUE", parse, "A whole number")->required();
  AddDayOption(*command, arguments->day, "The day (without it: today)");
  command->callback([&session, arguments, add] {
    session.command = [&session, arguments, add] { ChangeScalar(session, *arguments, add); };
  });
}

void AddRecordCommand(CLI::App& tally, Session& session) {
  const auto arguments = std::make_shared<TallyArguments>();
  CLI::App* command =
      AddCommand(tally, "record", "Record values of a distribution",
                 "Values like -inf and -.5, and keys with a \"-\" in front, go after \"--\".",
                 "quorletctl tally record nuvex.demo.latency 12.5 -3 80 --second 43200");
  AddKey(*command, *arguments);
  const auto parse = [arguments](const std::vector<std::string>& texts) {
    for (const std::string& text : texts) {
      const auto number = ParseNumber<double>(text);
      if (!number) throw CLI::ValidationError("VALUE", "not a number: " + text);
      arguments->numbers.push_back(*number);
    }
  };
  command
      ->add_option_function<std::vector<std::string>>("VALUE", parse,
                                                      "Numbers, also inf and nan, in order")
      ->required();
  AddDayOption(*command, arguments->day, "The day (without it: today)");
  const auto parseSecond = [arguments](const std::string& text) {
    arguments->second = ParseSecond(text);
    if (!arguments->second) {
      throw CLI::ValidationError("--second", "not a second of the day: " + text);
    }
  };
  command
      ->add_option_function<std::string>("--second", parseSecond,
                                         "Second of the day, 0 to 86399 (without it: now)")
      ->type_name("S");
  command->callback([&session, arguments] {
    session.command = [&session, arguments] { Record(session, *arguments); };
  });
}

void AddImportCommand(CLI::App& tally, Session& session) {
  const auto arguments = std::make_shared<TallyArguments>();
  CLI::App* command = AddCommand(
      tally, "import", "Import lines, all of them or none",
      "The fields of a line are separated by one tab:\n"
      "  scalar DAY KEY VALUE\n"
      "  value DAY KEY SECOND NUMBER\n"
      "In a KEY, \\t \\n \\r \\\\ and \\xNN stand for a tab, line feed, carriage return,\n"
      "backslash and the byte NN (hexadecimal).",
      "quorletctl tally dump | QUORLET_ROOT=/tmp/copy quorletctl tally import");
  command->add_option("FILE", arguments->file, "The file (without it, or \"-\": standard input)");
  command->callback([&session, arguments] {
    session.command = [&session, arguments] { Import(session, *arguments); };
  });
}

void AddDumpCommand(CLI::App& tally, Session& session) {
  const auto arguments = std::make_shared<TallyArguments>();
  CLI::App* command =
      AddCommand(tally, "dump", "Print counters as lines that \"tally import\" reads",
                 "Scalars come first; both are ordered by key, then day.",
                 "quorletctl tally dump --day 20516");
  AddDayOption(*command, arguments->day, "The day (without it: every day)");
  AddJsonFlag(*command, arguments->json);
  command->callback([&session, arguments] {
    session.command = [&session, arguments] { DumpTallies(session, *arguments); };
  });
}

}  // namespace

void AddTallyCommands(CLI::App& app, Session& session) {
  CLI::App* tally = AddFamily(app, "tally", "Counters: put them in, get them out",
                              "quorletctl tally add nuvex.demo.launches 1");
  AddScalarCommand(*tally, session, false);
  AddScalarCommand(*tally, session, true);
  AddRecordCommand(*tally, session);
  AddImportCommand(*tally, session);
  AddDumpCommand(*tally, session);
  AddListenCommand(*tally, session);
}

}  // namespace quorlet
