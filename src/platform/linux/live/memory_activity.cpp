// Paging, swapping, faults and reclaim: /proc/vmstat, lines "name number", one simple channel each.
#include <unistd.h>

#include <array>

#include "platform/linux/base/kernel_text.h"
#include "platform/linux/live/publishers.h"
#include "platform/linux/live/running_totals.h"

namespace quorlet {
namespace {

constexpr char kStatistics[] = "/proc/vmstat";

enum class Counted { kEvents, kKibibytes, kPages };

struct Row {
  std::string_view key;  // of the file
  const char* id;
  const char* name;
  Counted counted;
  bool isDaily;
};
// clang-format off
constexpr auto kRows = std::to_array<Row>({
    {"pgpgin",         "pgpgin",   "memory.paged.in",             Counted::kKibibytes, false},
    {"pgpgout",        "pgpgout",  "memory.paged.out",            Counted::kKibibytes, false},
    {"pswpin",         "pswpin",   "memory.swapped.in",           Counted::kPages,     true},
    {"pswpout",        "pswpout",  "memory.swapped.out",          Counted::kPages,     true},
    {"pgsteal_kswapd", "pgstealk", "memory.reclaimed.background", Counted::kPages,     false},
    {"pgsteal_direct", "pgsteald", "memory.reclaimed.direct",     Counted::kPages,     false},
    {"pgfault",        "pgfault",  "memory.faults",               Counted::kEvents,    false},
    {"pgmajfault",     "pgmajflt", "memory.faults.major",         Counted::kEvents,    true},
    {"oom_kill",       "oomkill",  "memory.oom.kills",            Counted::kEvents,    true},
});
// clang-format on

std::uint64_t Factor(Counted counted) {
  switch (counted) {
    case Counted::kEvents:
      return 1;
    case Counted::kKibibytes:
      return 1024;
    case Counted::kPages:
      break;
  }
  const long bytes = sysconf(_SC_PAGESIZE);
  return bytes > 0 ? static_cast<std::uint64_t>(bytes) : 4096;
}

class MemoryActivityPublisher : public LivePublisher {
 public:
  explicit MemoryActivityPublisher(const LoggingRoot& root) : root_(root) {}

  LiveLegend describe() override {
    const auto found = readings();
    LiveLegend legend;
    for (std::size_t i = 0; i < kRows.size(); ++i) {
      if (!found[i]) continue;
      const std::uint64_t unit = kRows[i].counted == Counted::kEvents ? kEvents : kBytes;
      legend.add({.group = "Memory", .subgroup = "", .unit = unit},
                 {.id = PackedID(kRows[i].id), .name = kRows[i].name, .isDaily = kRows[i].isDaily});
    }
    return legend;
  }

  void read(LiveRuns& runs) override {
    const auto found = readings();
    for (std::size_t i = 0; i < kRows.size(); ++i) {
      const std::uint64_t id = PackedID(kRows[i].id);
      if (found[i]) runs.addSimple(id, totals_.add(id, 0, *found[i]));
    }
  }

 private:
  std::array<std::optional<std::uint64_t>, kRows.size()> readings() const {
    std::array<std::optional<std::uint64_t>, kRows.size()> found;
    const auto text = ReadKernelText(root_.kernelPath(kStatistics));
    std::string_view rest = text ? std::string_view(*text) : std::string_view();
    while (!rest.empty()) {
      const std::string_view line = TakeLine(rest);
      const std::size_t blank = std::min(line.find(' '), line.size());
      for (std::size_t i = 0; i < kRows.size(); ++i) {
        if (line.substr(0, blank) != kRows[i].key) continue;
        const auto count = ParseCounter(line.substr(std::min(blank + 1, line.size())));
        const std::uint64_t factor = Factor(kRows[i].counted);
        if (count && *count <= INT64_MAX / factor) found[i] = *count * factor;
        break;
      }
    }
    return found;
  }

  const LoggingRoot root_;
  RunningTotals totals_;
};

}  // namespace

std::unique_ptr<LivePublisher> MakeMemoryActivityPublisher(const LoggingRoot& root) {
  return std::make_unique<MemoryActivityPublisher>(root);
}

}  // namespace quorlet
