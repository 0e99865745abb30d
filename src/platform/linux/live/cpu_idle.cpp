// Where CPUs spend their idle time: cpu*/cpuidle/state*/{name,usage,time}, one state channel a CPU.
//
// The kernel counts the time asleep only. The channel's first state, "ACTIVE", is the time that
// /proc/stat says the CPU worked (or waited for its hypervisor), so that the shares are shares of
// all time; it has been entered as often as any idle state.
#include <unistd.h>

#include <algorithm>
#include <array>

#include "platform/linux/base/kernel_text.h"
#include "platform/linux/live/publishers.h"
#include "platform/linux/live/running_totals.h"

namespace quorlet {
namespace {

constexpr char kCpus[] = "/sys/devices/system/cpu";
constexpr char kActivity[] = "/proc/stat";
constexpr std::size_t kMaxActivityBytes = std::size_t{4} << 20;
constexpr std::uint64_t kActiveID = PackedID("ACTIVE");

// The state's name as an ID that prints: eight characters, of which the last makes way for a number
// when an earlier state has the same ones.
std::uint64_t StateID(std::string_view name, const std::vector<LiveValues>& earlier) {
  std::string text = CleanName(name);
  if (text.empty()) text = "state";
  text.resize(std::min<std::size_t>(text.size(), 8));
  const std::string stem = text.substr(0, 6);
  const auto isTaken = [&](std::uint64_t id) {
    return id == kActiveID || std::ranges::any_of(earlier, [id](const LiveValues& state) {
             return state[0] == static_cast<std::int64_t>(id);
           });
  };
  for (std::size_t number = earlier.size(); isTaken(PackedID(text)) && number < 100; ++number) {
    text = stem + std::to_string(number);
  }
  return PackedID(text);
}

// "cpu3 user nice system idle iowait irq softirq steal ...", in ticks: what is neither idle nor
// waiting for I/O.
std::map<std::uint64_t, std::uint64_t> BusyMicroseconds(std::string_view activity) {
  const long ticksPerSecond = sysconf(_SC_CLK_TCK);
  const std::uint64_t tick = 1'000'000 / static_cast<std::uint64_t>(std::max(ticksPerSecond, 1L));
  std::map<std::uint64_t, std::uint64_t> busy;
  while (activity.starts_with("cpu")) {
    const auto words = Words(TakeLine(activity));
    const auto cpu = NumberBehind("cpu", words.front());
    if (!cpu) continue;
    std::uint64_t ticks = 0;
    bool isWhole = words.size() > 8;
    for (const std::size_t i : {1u, 2u, 3u, 6u, 7u, 8u}) {
      const auto part = isWhole ? ParseCounter(words[i]) : std::nullopt;
      isWhole = part && !__builtin_add_overflow(ticks, *part, &ticks);
    }
    if (isWhole && ticks <= INT64_MAX / tick) busy.emplace(*cpu, ticks * tick);
  }
  return busy;
}

class CpuIdlePublisher : public LivePublisher {
 public:
  explicit CpuIdlePublisher(const LoggingRoot& root) : root_(root) {}

  LiveLegend describe() override {
    LiveLegend legend;
    cpus_.clear();
    const std::string cpus = root_.kernelPath(kCpus);
    // Idle times of a recorded machine say nothing about this one's activity, nor the other way.
    const bool isOneMachine = (root_.kernelPath(kCpus) == root_.path(kCpus)) ==
                              (root_.kernelPath(kActivity) == root_.path(kActivity));
    hasActivity_ = isOneMachine && access(root_.kernelPath(kActivity).c_str(), R_OK) == 0;
    for (const auto& [number, name] : NumberedNames(root_, cpus, "cpu")) {
      Cpu cpu{number, PackedID("CPU" + std::to_string(number)), {}};
      const std::string directory = JoinPath(cpus, name) + "/cpuidle";
      for (const auto& [stateNumber, state] : NumberedNames(root_, directory, "state")) {
        cpu.states.push_back({JoinPath(directory, state), 0});
      }
      if (cpu.states.empty()) continue;
      legend.add({.group = "CPU Idle", .subgroup = "", .unit = kMicroseconds},
                 {.id = cpu.id,
                  .name = "CPU" + std::to_string(number) + " idle",
                  .format = ReportFormat::kState,
                  .elements = cpu.states.size() + (hasActivity_ ? 1 : 0)});
      cpus_.push_back(std::move(cpu));
    }
    return legend;
  }

  void read(LiveRuns& runs) override {
    std::map<std::uint64_t, std::uint64_t> busy;
    if (hasActivity_) {
      const auto activity = ReadKernelText(root_.kernelPath(kActivity), kMaxActivityBytes);
      if (activity) busy = BusyMicroseconds(activity->substr(activity->find('\n') + 1));
    }
    for (Cpu& cpu : cpus_) {
      std::vector<LiveValues> records;
      if (hasActivity_) {
        const auto found = busy.find(cpu.number);
        if (found == busy.end()) continue;  // it is offline
        const std::int64_t time = totals_.add(cpu.id, kActiveSlot, found->second);
        records.push_back({static_cast<std::int64_t>(kActiveID), 0, time, 0});
      }
      if (addStates(cpu, records)) runs.add(cpu.id, records);
    }
  }

 private:
  static constexpr std::size_t kActiveSlot = SIZE_MAX;

  struct State {
    std::string directory;
    std::uint64_t id = 0;  // 0 until its name has been read
  };
  struct Cpu {
    std::uint64_t number = 0;
    std::uint64_t id = 0;
    std::vector<State> states;
  };

  // False when a state cannot be read.
  bool addStates(Cpu& cpu, std::vector<LiveValues>& records) {
    std::uint64_t entered = 0;
    for (std::size_t i = 0; i < cpu.states.size(); ++i) {
      State& state = cpu.states[i];
      if (state.id == 0) {
        const auto name = ReadKernelText(state.directory + "/name");
        if (!name) return false;
        state.id = StateID(*name, records);
      }
      const auto usage = ReadCounter(state.directory + "/usage");
      const auto time = ReadCounter(state.directory + "/time");
      if (!usage || !time) return false;
      const std::int64_t transitions = totals_.add(cpu.id, 2 * i, *usage);
      entered += static_cast<std::uint64_t>(transitions);
      records.push_back({static_cast<std::int64_t>(state.id), transitions,
                         totals_.add(cpu.id, 2 * i + 1, *time), 0});
    }
    if (hasActivity_) {
      records.front()[1] = static_cast<std::int64_t>(std::min<std::uint64_t>(entered, INT64_MAX));
    }
    return true;
  }

  const LoggingRoot root_;
  bool hasActivity_ = false;
  std::vector<Cpu> cpus_;
  RunningTotals totals_;
};

}  // namespace

std::unique_ptr<LivePublisher> MakeCpuIdlePublisher(const LoggingRoot& root) {
  return std::make_unique<CpuIdlePublisher>(root);
}

}  // namespace quorlet
