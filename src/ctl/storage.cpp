// quorletctl storage: what the flash-storage controller tells.
#include <CLI/CLI.hpp>
#include <algorithm>
#include <memory>
#include <variant>

#include "ctl/json_value.h"
#include "ctl/options.h"
#include "ctl/session.h"
#include "ctl/storage_health.h"
#include "storage/exporters.h"
#include "storage/nand_info.h"
#include "storage/snapshot.h"
#include "storage/vm_freezer.h"

namespace quorlet {
namespace {

constexpr std::size_t kSmallestTextBytes = std::size_t{1} << 20;
constexpr std::size_t kLargestTextBytes = std::size_t{256} << 20;

struct StorageArguments {
  std::optional<std::string> file;
  std::optional<std::string> header;
  bool json = false;
};

// What the layers below say on standard error, kept until it is known whether the command failed.
class KeptErrors final : public StandardError {
 public:
  void write(std::string_view text) override { text_ += text; }
  // The first line, or `otherwise`.
  std::string firstLineOr(std::string_view otherwise) const {
    const std::string line = text_.substr(0, text_.find('\n'));
    return line.empty() ? std::string(otherwise) : line;
  }

 private:
  std::string text_;
};

// The services of the root, with standard error kept apart.
struct StorageServices {
  explicit StorageServices(Session& session)
      : linux(session.open(Access::kReadOnly)),
        platform(linux->services().with({.standardError = &errors})) {}

  KeptErrors errors;
  std::unique_ptr<LinuxPlatform> linux;
  Platform platform;
};

// Why a command got no answer, in words for people: what is below speaks to its own developers.
std::string WhyNoAnswer(StorageServices& services) {
  DriverRegistry& registry = services.platform.driverRegistry;
  const StorageExporter* row = nullptr;
  const RegistryHandle service = findNandExporter(registry, row);
  if (service == 0) return "there is no storage drive that can be asked";
  std::string name;
  if (registry.GetEntryName(service, name) != kKernelSuccess) name.clear();
  registry.ReleaseHandle(service);
  // A drive of the machine's own has that name; others are described in files.
  for (const Drive& drive : services.platform.drives.read()) {
    const std::string trouble = drive.name == name ? DriveTrouble(drive) : "";
    if (!trouble.empty()) return trouble;
  }
  return "the storage drive " + name + " does not answer";
}

void PrintDictionary(Session& session, const Dictionary& dictionary, bool json) {
  if (json) {
    session.out.line(JsonText(dictionary, JsonForm::kPlain));
    return;
  }
  for (const auto& [key, value] : dictionary) {
    session.out.line(Escape(key) + "\t" + Escape(value.description()));
  }
}

void PrintInfo(Session& session, const StorageArguments& arguments) {
  StorageServices services(session);
  const Dictionary info = CopyNANDInfo(services.platform);
  if (info.contains(kNANDInfoErrorKey)) {
    throw Failure(WhyNoAnswer(services));
  }
  PrintDictionary(session, info, arguments.json);
}

void PrintVMFreezer(Session& session, const StorageArguments& arguments) {
  StorageServices services(session);
  const Dictionary info =
      CopyVMFreezerNANDInfo(services.platform.taskSnapshot, services.platform.standardError);
  if (info.contains(kNANDInfoVMFreezerErrorKey)) {
    throw Failure(session.messages.lastErrorOr("this system has no memory freezer that tells"));
  }
  PrintDictionary(session, info, arguments.json);
}

void PrintAdvice(Session& session, const StorageArguments& arguments) {
  StorageServices services(session);
  const bool advice = NandRecommendsContentDeletion(services.platform);
  const std::string problem = services.errors.firstLineOr("");
  // The answer stands when only the connection could not be closed behind it.
  if (problem == kConnectionNotClosed) {
    session.messages.add(LogLevel::kError, problem);
  } else if (!problem.empty()) {
    throw Failure(WhyNoAnswer(services));
  }
  if (arguments.json) {
    session.out.line(JsonText(Dictionary{{"recommendsContentDeletion", advice}}, JsonForm::kPlain));
  } else {
    session.out.line(advice ? "yes" : "no");
  }
}

Data ReadExportFile(const std::string& path) {
  const auto bytes = ReadWholeFile(path, kMaxExportBytes);
  if (const int* error = std::get_if<int>(&bytes)) {
    throw Failure("cannot read " + path + ": " + ErrnoText(*error));
  }
  const auto content = std::as_bytes(std::span(std::get<std::string>(bytes)));
  return {content.begin(), content.end()};
}

// One export of the controller, or nothing when it has none. `name` is for errors.
std::optional<Data> FetchExport(ExporterConnection& exporter, const SelectorPair* selectors,
                                std::string_view name) {
  if (selectors == nullptr || selectors->sizeQuery == kNoSelector) return std::nullopt;
  std::uint32_t size = 0;
  const KernelReturn answer = exporter.querySize(selectors, ExportFlags(false, 0), size);
  if (answer == kKernelNotFound || answer == kKernelUnsupported) return std::nullopt;
  // Any other trouble does not mean that there is none.
  if (answer != kKernelSuccess) {
    throw Failure("the driver does not tell the size of its " + std::string(name) + ": status " +
                  Hexadecimal(answer));
  }
  if (size == 0) return std::nullopt;
  const auto buffer = ExportBuffer::Allocate(size);
  if (!buffer) {
    throw Failure("the driver's " + std::string(name) + " is too large: " + Counted(size, "byte"));
  }
  std::size_t written = 0;
  const KernelReturn status =
      exporter.fetch(selectors, ExportFlags(false, 0), buffer->bytes(), written);
  if (status != kKernelSuccess) {
    throw Failure("the driver does not give its " + std::string(name) + ": status " +
                  Hexadecimal(status));
  }
  const auto content = buffer->bytes().first(std::min(written, buffer->bytes().size()));
  return Data(content.begin(), content.end());
}

struct Snapshot {
  Data records;
  std::optional<Data> header;
};

Snapshot FetchSnapshot(Session& session) {
  StorageServices services(session);
  const StorageExporter* row = nullptr;
  const RegistryHandle service = findNandExporter(services.platform.driverRegistry, row);
  if (service == 0) throw Failure(WhyNoAnswer(services));
  ExporterConnection exporter(services.platform, service, *row);
  if (!exporter) throw Failure(WhyNoAnswer(services));
  auto records = FetchExport(exporter, row->getSnapshotSelectors(), "snapshot");
  if (!records) throw Failure("the driver has no snapshot");
  return {*std::move(records),
          FetchExport(exporter, row->getSnapshotHeaderSelectors(), "snapshot header")};
}

// The text as long as it needs to be; renderers only tell that a buffer was too small for it.
std::string Render(const Snapshot& snapshot) {
  if (snapshot.header && snapshot.header->size() < kSnapshotHeaderBytes) {
    throw Failure("the snapshot header is cut short");
  }
  for (std::size_t size = kSmallestTextBytes; size <= kLargestTextBytes; size *= 4) {
    std::string text(size, '\0');
    const auto length = snapshot.header ? FSPParseSnapshotBufferWithInplaceParser(
                                              snapshot.records, text, *snapshot.header)
                                        : FSPParseSnapshotBuffer(snapshot.records, text);
    if (!length) continue;
    text.resize(*length);
    return text;
  }
  throw Failure("the snapshot's text is too long");
}

void PrintSnapshot(Session& session, const StorageArguments& arguments) {
  Snapshot snapshot;
  if (arguments.file) {
    snapshot.records = ReadExportFile(*arguments.file);
    if (arguments.header) snapshot.header = ReadExportFile(*arguments.header);
  } else {
    snapshot = FetchSnapshot(session);
  }
  const std::string text = Render(snapshot);
  if (arguments.json) {
    session.out.line(JsonText(Dictionary{{"text", text}}, JsonForm::kPlain));
    return;
  }
  // The legend and the formats are the device's: nothing of them controls a terminal.
  for (std::string_view rest = text; !rest.empty();) {
    const std::size_t kept = std::min(rest.find_first_of("\n\t\\"), rest.size());
    session.out.write(Escape(rest.substr(0, kept)));
    rest.remove_prefix(kept);
    session.out.write(rest.substr(0, 1));
    rest.remove_prefix(std::min<std::size_t>(rest.size(), 1));
  }
  if (!text.ends_with('\n')) session.out.write("\n");
}

}  // namespace

void AddStorageCommands(CLI::App& app, Session& session) {
  CLI::App* storage = AddFamily(app, "storage", "Flash storage", "quorletctl storage info");
  const auto arguments = std::make_shared<StorageArguments>();
  const auto add = [&](const std::string& name, const std::string& description,
                       const std::string& notes, const std::string& example,
                       void (*run)(Session&, const StorageArguments&)) {
    CLI::App* command = AddCommand(*storage, name, description, notes, example);
    AddJsonFlag(*command, arguments->json);
    command->callback([&session, arguments, run] {
      session.command = [&session, arguments, run] { run(session, *arguments); };
    });
    return command;
  };
  add("health", "Print how worn every drive is, and how long it will last",
      "Days left come from the days that passes have recorded; what a drive does\n"
      "not tell, or what cannot be told from so few days, is \"unknown\".",
      "quorletctl storage health", [](Session& running, const StorageArguments& given) {
        PrintStorageHealth(running, given.json);
      });
  add("info", "Print the NAND dictionary", "One key and its value a line.",
      "quorletctl storage info --json", PrintInfo);
  CLI::App* snapshot = add("snapshot", "Print the controller's snapshot as text",
                           "Without --file, the snapshot of the driver.",
                           "quorletctl storage snapshot --file snapshot.bin", PrintSnapshot);
  CLI::Option* file = snapshot->add_option("--file", arguments->file, "Snapshot export to render");
  snapshot->add_option("--header", arguments->header, "Snapshot header that describes the file")
      ->needs(file);
  add("vmfreezer", "Print how much the memory freezer has written", "",
      "quorletctl storage vmfreezer", PrintVMFreezer);
  add("advice", "Print whether the drive recommends deleting content", "\"yes\" or \"no\".",
      "quorletctl storage advice", PrintAdvice);
}

}  // namespace quorlet
