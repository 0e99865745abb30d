// quorletctl logs html: logs as one page.
#include "ctl/html_command.h"

#include <CLI/CLI.hpp>
#include <memory>
#include <set>
#include <vector>

#include "ctl/export_sources.h"
#include "ctl/file_output.h"
#include "ctl/log_page.h"
#include "ctl/options.h"
#include "ctl/session.h"
#include "report/config.h"

namespace quorlet {
namespace {

// More keys than a reader looks through; the rest is only counted.
constexpr std::size_t kMostUnreported = 1000;

struct HtmlArguments {
  std::string output;
  std::vector<std::string> files;
};

class PageMaker final : public LogVisitor {
 public:
  void visit(const std::string& path, const std::string& bytes,
             const std::optional<std::string>& device) override {
    auto read = ReadExportedLog(bytes);
    if (const auto* why = std::get_if<std::string>(&read)) return refuse(path, *why);
    auto& log = std::get<ExportedLog>(read);
    if (!log.device) log.device = device;
    if (!log.isStatusLog && (!lastDay_ || log.day > *lastDay_)) lastDay_ = log.day;
    if (log.day == lastDay_) noteKeys(log);
    page.add(log);
  }
  void refuse(const std::string& path, const std::string& why) override {
    PrintErrorLine("cannot read " + path + ": " + why);
    allRead = false;
  }
  bool wantsMore() const override { return true; }

  // What this device counted on the last day, and its logs do not hold.
  void addUnreported(Platform& services);

  LogPage page;
  bool allRead = true;

 private:
  void noteKeys(const ExportedLog& log) {
    for (const ScalarRow& row : log.scalars) reported_.insert(std::string(row.key));
    for (const DistributionRow& row : log.distributions) reported_.insert(std::string(row.key));
  }

  std::optional<std::int64_t> lastDay_;
  std::set<std::string> reported_;  // on the last day, or on days before it
};

std::string WhyNot(const std::optional<TLConfig>& config, std::string_view key, KeyKind kind) {
  if (!config) return "there is no whitelist that can be read";
  const auto match = config->matchForKey(key, kind);
  if (!match) return "no entry of the whitelist names it";
  return match->isExpired ? "its entry of the whitelist has expired"
                          : "it was counted, or allowed, after the log was written";
}

void PageMaker::addUnreported(Platform& services) {
  if (!lastDay_) return;
  const auto day = static_cast<std::int32_t>(*lastDay_);
  const auto history = services.counterStore.initWithDefaultPath();
  auto config = TLConfig::init(services);
  if (config) config->setReportedDay(day);
  if (history == nullptr) return;
  std::size_t count = 0;
  const auto note = [&](std::string_view key, KeyKind kind) {
    if (reported_.contains(std::string(key)) || ++count > kMostUnreported) return;
    page.addUnreported(key, WhyNot(config, key, kind));
  };
  history->scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      "", day - 1, day, [&](std::string_view key, std::int32_t, std::int64_t, bool&) {
        note(key, KeyKind::kScalar);
      });
  history->distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      "", day - 1, day,
      [&](std::string_view key, std::int32_t, TLHistoryDistributionEnumerator&, bool&) {
        note(key, KeyKind::kDistribution);
      });
  if (count > kMostUnreported) {
    page.addUnreported("and " + Counted(count - kMostUnreported, "more key"), "");
  }
}

void MakePage(Session& session, const HtmlArguments& arguments) {
  FileOutput output(session.out, arguments.output);
  PageMaker maker;
  const bool isOwn = arguments.files.empty();
  if (isOwn) VisitSpool(Root::FromEnvironment(), maker);
  for (const std::string& file : arguments.files) {
    const bool isPath = file.find('/') != std::string::npos;
    VisitPath(isPath ? file : PathOfLog(file), maker);
  }
  if (maker.page.empty()) {
    if (maker.allRead) throw Failure("there is no log yet");
    throw AnswerIsNo();
  }
  if (isOwn) {
    Messages unheard;  // the page itself says what the whitelist lacks
    LinuxPlatform platform(Root::FromEnvironment(), Access::kReadOnly,
                           unheard.makeLog(Access::kReadOnly));
    maker.addUnreported(platform.services());
  }
  output.write(maker.page.html());
  output.finish();
  // What could not be read has been said, file by file.
  if (!maker.allRead) throw AnswerIsNo();
}

}  // namespace

void AddHtmlCommand(CLI::App& logs, Session& session) {
  const auto arguments = std::make_shared<HtmlArguments>();
  CLI::App* command = AddCommand(
      logs, "html", "Make one page of logs for a browser",
      "FILE is a listed name, \"latest\", or a path with a \"/\"; without any the page has all\n"
      "logs of pending and outbox, and says what was counted but not reported.",
      "quorletctl logs html --output logs.html");
  command->add_option("FILE", arguments->files, "The logs");
  command->add_option("--output", arguments->output, "Write to this file instead")
      ->type_name("FILE");
  command->callback([&session, arguments] {
    session.command = [&session, arguments] { MakePage(session, *arguments); };
  });
}

}  // namespace quorlet
