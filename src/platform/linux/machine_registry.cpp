#include "drvreport/machine_registry.h"

#include <utility>
#include <vector>

#include "platform/linux/live/live_source.h"
#include "platform/linux/registry/driver_files.h"
#include "platform/linux/registry/services.h"

namespace quorlet {
namespace {

class ReportingLog : public SystemLog {
 public:
  explicit ReportingLog(std::function<void(std::string_view)> report)
      : report_(std::move(report)) {}
  void write(LogLevel level, std::string_view text) override {
    if (level == LogLevel::kError && report_) report_(text);
  }

 private:
  const std::function<void(std::string_view)> report_;
};

// The registry, after the log that its sources use.
struct Machine {
  Machine(const Root& root, std::function<void(std::string_view)> report)
      : log(std::move(report)), registry(MakeLinuxDriverRegistry(Sources(root, log))) {}

  static std::vector<std::unique_ptr<EntrySource>> Sources(const Root& root, SystemLog& log) {
    std::vector<std::unique_ptr<EntrySource>> sources;
    sources.push_back(MakeDriverFiles(root, log));
    sources.push_back(MakeLiveChannels(LoggingRoot(root, log)));
    return sources;
  }

  ReportingLog log;
  const std::unique_ptr<DriverRegistry> registry;
};

}  // namespace

std::shared_ptr<DriverRegistry> MakeMachineDriverRegistry(
    const std::string& root, std::function<void(std::string_view)> report) {
  const auto machine = std::make_shared<Machine>(Root(root), std::move(report));
  return {machine, machine->registry.get()};
}

}  // namespace quorlet
