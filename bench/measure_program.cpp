// measure_program RUNS COMMAND [ARGUMENT...]
//
// Runs a program so many times with its output thrown away, and prints the medians of its wall time
// and its processor time in microseconds, and the highest peak of resident memory in KiB.
#include <fcntl.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/wait.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <vector>

extern char** environ;

namespace {

long Microseconds(const timeval& time) { return time.tv_sec * 1'000'000 + time.tv_usec; }

long Median(std::vector<long> values) {
  std::ranges::sort(values);
  return values[values.size() / 2];
}

}  // namespace

int main(int argumentCount, char** arguments) {
  const int runs = argumentCount < 3 ? 0 : std::atoi(arguments[1]);
  if (runs < 1) {
    std::fprintf(stderr, "usage: measure_program RUNS COMMAND [ARGUMENT...]\n");
    return 2;
  }
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 1, "/dev/null", O_WRONLY, 0);

  std::vector<long> wallTimes;
  std::vector<long> processorTimes;
  long peak = 0;
  for (int run = 0; run < runs; ++run) {
    const auto start = std::chrono::steady_clock::now();
    pid_t child = 0;
    if (posix_spawnp(&child, arguments[2], &actions, nullptr, arguments + 2, environ) != 0) {
      std::perror(arguments[2]);
      return 1;
    }
    int status = 0;
    rusage usage{};
    wait4(child, &status, 0, &usage);
    const auto taken = std::chrono::steady_clock::now() - start;
    if (status != 0) {
      std::fprintf(stderr, "measure_program: %s failed\n", arguments[2]);
      return 1;
    }
    wallTimes.push_back(std::chrono::duration_cast<std::chrono::microseconds>(taken).count());
    processorTimes.push_back(Microseconds(usage.ru_utime) + Microseconds(usage.ru_stime));
    peak = std::max(peak, usage.ru_maxrss);
  }
  std::printf("%ld %ld %ld\n", Median(wallTimes), Median(processorTimes), peak);
  return 0;
}
