// How long CPUs ran at which frequency: cpu*/cpufreq/stats/time_in_state, a line "kHz time" for
// each frequency, the time in 10 ms; one state channel a CPU.
//
// How often a frequency was entered is what the columns of trans_table add up to:
//      From  :    To
//            :   2400000   1200000
//     2400000:         0         7
//     1200000:         8         0
// The kernel has no such table where it would be longer than a page; the count is 0 then.
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <variant>

#include "platform/linux/base/kernel_text.h"
#include "platform/linux/live/publishers.h"
#include "platform/linux/live/running_totals.h"

namespace quorlet {
namespace {

constexpr char kCpus[] = "/sys/devices/system/cpu";
constexpr std::uint64_t kTickMilliseconds = 10;

struct Frequency {
  std::uint64_t kilohertz = 0;
  std::uint64_t milliseconds = 0;
  std::uint64_t entered = 0;
};

// "2400MHz", or "1190400k" for what is not whole megahertz; 0 for a frequency of too many digits.
std::uint64_t FrequencyID(std::uint64_t kilohertz) {
  const std::string text = kilohertz % 1000 == 0 ? std::to_string(kilohertz / 1000) + "MHz"
                                                 : std::to_string(kilohertz) + "k";
  return text.size() <= 8 ? PackedID(text) : 0;
}

// Empty when a line is anything else than two numbers.
std::vector<Frequency> ParseTimes(std::string_view text) {
  std::vector<Frequency> frequencies;
  while (!text.empty()) {
    const auto words = Words(TakeLine(text));
    const auto kilohertz = words.size() == 2 ? ParseCounter(words[0]) : std::nullopt;
    const auto ticks = words.size() == 2 ? ParseCounter(words[1]) : std::nullopt;
    if (!kilohertz || !ticks || *ticks > INT64_MAX / kTickMilliseconds) return {};
    const bool isTwice =
        std::ranges::find(frequencies, *kilohertz, &Frequency::kilohertz) != frequencies.end();
    if (isTwice) return {};
    frequencies.push_back({*kilohertz, *ticks * kTickMilliseconds, 0});
  }
  return frequencies;
}

// False when the table is not one of these frequencies.
bool AddTransitions(std::string_view table, std::vector<Frequency>& frequencies) {
  TakeLine(table);
  const auto header = Words(TakeLine(table));
  if (header.size() != frequencies.size() + 1) return false;
  for (std::size_t i = 0; i < frequencies.size(); ++i) {
    if (ParseCounter(header[i + 1]) != frequencies[i].kilohertz) return false;
  }
  for (std::size_t row = 0; row < frequencies.size(); ++row) {
    const auto words = Words(TakeLine(table));
    if (words.size() != header.size()) return false;
    for (std::size_t i = 0; i < frequencies.size(); ++i) {
      const auto count = ParseCounter(words[i + 1]);
      std::uint64_t& entered = frequencies[i].entered;
      if (!count || __builtin_add_overflow(entered, *count, &entered)) return false;
    }
  }
  return true;
}

std::vector<Frequency> ReadTimes(const std::string& directory) {
  const auto times = ReadKernelText(directory + "/time_in_state");
  return times ? ParseTimes(*times) : std::vector<Frequency>();
}

class CpuFrequencyPublisher : public LivePublisher {
 public:
  explicit CpuFrequencyPublisher(const LoggingRoot& root) : root_(root) {}

  LiveLegend describe() override {
    LiveLegend legend;
    cpus_.clear();
    const std::string cpus = root_.kernelPath(kCpus);
    for (const auto& [number, name] : NumberedNames(root_, cpus, "cpu")) {
      const std::string title = "CPU" + std::to_string(number);
      const Cpu cpu{PackedID(title), JoinPath(cpus, name) + "/cpufreq/stats"};
      const std::size_t states = ReadTimes(cpu.directory).size();
      if (states == 0) continue;
      legend.add({.group = "CPU Frequency", .subgroup = "", .unit = kMilliseconds},
                 {.id = cpu.id,
                  .name = title + " frequency",
                  .format = ReportFormat::kState,
                  .elements = states});
      cpus_.push_back(cpu);
    }
    return legend;
  }

  void read(LiveRuns& runs) override {
    for (const Cpu& cpu : cpus_) {
      auto frequencies = ReadTimes(cpu.directory);
      const auto table = ReadWholeFile(cpu.directory + "/trans_table", kMaxAttributeBytes);
      if (const auto* text = std::get_if<std::string>(&table)) {
        if (!AddTransitions(*text, frequencies)) continue;
      } else if (const int error = std::get<int>(table); error != ENOENT && error != EFBIG) {
        continue;
      }
      std::vector<LiveValues> records;
      for (const Frequency& frequency : frequencies) {
        const std::uint64_t id = FrequencyID(frequency.kilohertz);
        if (id == 0) break;  // the channel is left out: it has too few records
        // Slots are named by frequency, so that a table that changes does not mix up totals.
        const std::size_t slot = 2 * static_cast<std::size_t>(frequency.kilohertz);
        records.push_back({static_cast<std::int64_t>(id),
                           totals_.add(cpu.id, slot, frequency.entered),
                           totals_.add(cpu.id, slot + 1, frequency.milliseconds), 0});
      }
      runs.add(cpu.id, records);
    }
  }

 private:
  struct Cpu {
    std::uint64_t id = 0;
    std::string directory;
  };

  const LoggingRoot root_;
  std::vector<Cpu> cpus_;
  RunningTotals totals_;
};

}  // namespace

std::unique_ptr<LivePublisher> MakeCpuFrequencyPublisher(const LoggingRoot& root) {
  return std::make_unique<CpuFrequencyPublisher>(root);
}

}  // namespace quorlet
