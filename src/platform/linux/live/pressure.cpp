// How long tasks were held up for want of a resource: /proc/pressure/*, lines
//   some avg10=0.00 avg60=0.00 avg300=0.00 total=63157193
// one simple channel a line, the total in microseconds.
#include <array>

#include "platform/linux/base/kernel_text.h"
#include "platform/linux/live/publishers.h"
#include "platform/linux/live/running_totals.h"

namespace quorlet {
namespace {

struct Stall {
  const char* file;
  const char* line;
  const char* id;
  const char* name;
  bool isDaily;
};
// "full" of the CPU is not here: for a whole machine it is not defined, and 0.
// clang-format off
constexpr auto kStalls = std::to_array<Stall>({
    {"/proc/pressure/cpu",    "some", "cpu.some", "pressure.cpu.some",    true},
    {"/proc/pressure/io",     "some", "io.some",  "pressure.io.some",     true},
    {"/proc/pressure/io",     "full", "io.full",  "pressure.io.full",     true},
    {"/proc/pressure/memory", "some", "mem.some", "pressure.memory.some", true},
    {"/proc/pressure/memory", "full", "mem.full", "pressure.memory.full", true},
    {"/proc/pressure/irq",    "full", "irq.full", "pressure.irq.full",    false},
});
// clang-format on

std::optional<std::uint64_t> Total(std::string_view text, std::string_view wanted) {
  constexpr std::string_view kTotal = "total=";
  while (!text.empty()) {
    const auto words = Words(TakeLine(text));
    if (words.empty() || words.front() != wanted || !words.back().starts_with(kTotal)) continue;
    return ParseCounter(words.back().substr(kTotal.size()));
  }
  return std::nullopt;
}

class PressurePublisher : public LivePublisher {
 public:
  explicit PressurePublisher(const LoggingRoot& root) : root_(root) {}

  LiveLegend describe() override {
    LiveLegend legend;
    for (const auto& [stall, total] : totals()) {
      legend.add({.group = "Pressure", .subgroup = "", .unit = kMicroseconds},
                 {.id = PackedID(stall->id), .name = stall->name, .isDaily = stall->isDaily});
    }
    return legend;
  }

  void read(LiveRuns& runs) override {
    for (const auto& [stall, total] : totals()) {
      const std::uint64_t id = PackedID(stall->id);
      runs.addSimple(id, totals_.add(id, 0, total));
    }
  }

 private:
  std::vector<std::pair<const Stall*, std::uint64_t>> totals() const {
    std::vector<std::pair<const Stall*, std::uint64_t>> found;
    for (const Stall& stall : kStalls) {
      const auto text = ReadKernelText(root_.kernelPath(stall.file));
      const auto total = text ? Total(*text, stall.line) : std::nullopt;
      if (total) found.emplace_back(&stall, *total);
    }
    return found;
  }

  const LoggingRoot root_;
  RunningTotals totals_;
};

}  // namespace

std::unique_ptr<LivePublisher> MakePressurePublisher(const LoggingRoot& root) {
  return std::make_unique<PressurePublisher>(root);
}

}  // namespace quorlet
