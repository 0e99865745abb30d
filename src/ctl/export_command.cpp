// quorletctl logs export: logs as rows for other programs.
#include "ctl/export_command.h"

#include <unistd.h>

#include <CLI/CLI.hpp>
#include <memory>
#include <vector>

#include "ctl/export_format.h"
#include "ctl/export_sources.h"
#include "ctl/file_output.h"
#include "ctl/options.h"
#include "ctl/progress.h"
#include "ctl/session.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr char kNdjson[] = "ndjson";
constexpr char kOtlpJson[] = "otlp-json";
constexpr char kAutomatic[] = "auto";
constexpr char kNone[] = "none";

struct ExportArguments {
  std::string format = kNdjson;
  std::string device = kAutomatic;
  std::string output;  // empty: standard output
  std::vector<std::string> paths;
};

// Different bytes stay different in a text of a row.
std::string AsText(const std::string& bytes) { return IsValidUtf8(bytes) ? bytes : Escape(bytes); }

class Exporter final : public LogVisitor {
 public:
  Exporter(Session& session, const ExportArguments& arguments)
      : session_(session),
        arguments_(arguments),
        output_(session.out, arguments.output),
        progress_("log", output_.isFile() || ::isatty(STDOUT_FILENO) == 0) {}

  // Whether every log could be read.
  [[nodiscard]] bool run() {
    if (arguments_.paths.empty()) VisitSpool(Root::FromEnvironment(), *this);
    for (const std::string& path : arguments_.paths) {
      if (wantsMore()) VisitPath(path, *this);
    }
    progress_.clear();
    output_.finish();
    return allRead_;
  }

  void visit(const std::string& path, const std::string& bytes,
             const std::optional<std::string>& device) override {
    if (output_.replaces(path)) return;
    auto read = ReadExportedLog(bytes);
    if (const auto* why = std::get_if<std::string>(&read)) {
      refuse(path, *why);
      return;
    }
    auto& log = std::get<ExportedLog>(read);
    nameDevice(log, device);
    lines_.clear();
    if (arguments_.format == kNdjson) {
      AppendNdjson(log, lines_);
    } else if (!AppendOtlpJson(log, lines_)) {
      refuse(path, "its day " + log.dayText + " does not fit OTLP");
    }
    output_.write(lines_);
    progress_.advance(bytes.size());
  }

  void refuse(const std::string& path, const std::string& why) override {
    progress_.clear();
    PrintErrorLine("cannot read " + path + ": " + why);
    allRead_ = false;
  }

  bool wantsMore() const override { return output_.ok(); }

 private:
  void nameDevice(ExportedLog& log, const std::optional<std::string>& inPath) {
    if (arguments_.device == kNone) {
      log.device.reset();
    } else if (arguments_.device != kAutomatic) {
      log.device = AsText(arguments_.device);
    } else if (!log.device && inPath) {
      log.device = AsText(*inPath);
    } else if (!log.device && arguments_.paths.empty()) {
      log.device = ownDevice();
    }
  }

  // Nothing when this device does not tell.
  std::optional<std::string> ownDevice() {
    if (ownDevice_) return *ownDevice_;
    const auto platform = session_.open(Access::kReadOnly);
    const auto answer = platform->services().deviceInfo.DQCopyAnswer("InverseDeviceID");
    const std::string* name = answer ? answer->asString() : nullptr;
    ownDevice_ = name != nullptr ? std::optional(AsText(*name)) : std::nullopt;
    return *ownDevice_;
  }

  Session& session_;
  const ExportArguments& arguments_;
  FileOutput output_;
  Progress progress_;
  std::string lines_;
  // Empty until it was asked for.
  std::optional<std::optional<std::string>> ownDevice_;
  bool allRead_ = true;
};

void Export(Session& session, const ExportArguments& arguments) {
  // What could not be read has been said, file by file.
  if (!Exporter(session, arguments).run()) throw AnswerIsNo();
}

}  // namespace

void AddExportCommand(CLI::App& logs, Session& session) {
  const auto arguments = std::make_shared<ExportArguments>();
  CLI::App* command = AddCommand(
      logs, "export", "Print logs as rows for other programs",
      "ndjson: a JSON object for each figure. otlp-json: an OTLP metrics request for each log.\n"
      "A log that cannot be read gives an error line and no rows; the others are exported, and\n"
      "the exit status is 1.",
      "quorletctl logs export --output day.ndjson fleet/");
  command->add_option("--format", arguments->format, "ndjson (without it) or otlp-json")
      ->type_name("FORMAT")
      ->check(CLI::IsMember({kNdjson, kOtlpJson}));
  command
      ->add_option("--device", arguments->device,
                   "The device's name; \"none\" leaves it out, \"auto\" (without it) takes the\n"
                   "log's, else the one in NAME/outbox/ or NAME/pending/, else this device's")
      ->type_name("auto|none|TEXT");
  command->add_option("--output", arguments->output, "Write to this file instead")
      ->type_name("FILE");
  command->add_option("FILE", arguments->paths,
                      "Log files, and directories of them (without any: pending and outbox)");
  command->callback([&session, arguments] {
    session.command = [&session, arguments] { Export(session, *arguments); };
  });
}

}  // namespace quorlet
