#include "platform/linux/drives/bounded_answer.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <span>
#include <utility>

#include "platform/linux/base/descriptor.h"

namespace quorlet {
namespace {

constexpr std::size_t kMaxAttributeBytes = 64;

// The directory entries as the kernel writes them.
struct KernelEntry {
  std::uint64_t inode;
  std::int64_t offset;
  std::uint16_t length;
  std::uint8_t type;
  char name[1];
};

// A descriptor's number from its name, or -1 for "." and "..".
int DescriptorNumber(const char* name) {
  int number = -1;
  for (; *name >= '0' && *name <= '9' && number < 100'000'000; ++name) {
    number = (number < 0 ? 0 : number * 10) + (*name - '0');
  }
  return number;
}

// Closes what /proc lists of 1 and above. False when it cannot be read.
bool CloseListed() {
  const int directory = open("/proc/self/fd", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (directory < 0) return false;
  alignas(KernelEntry) char block[1024];
  long size = 0;
  while ((size = syscall(SYS_getdents64, directory, block, sizeof block)) > 0) {
    for (long at = 0; at < size;) {
      const auto* entry = reinterpret_cast<const KernelEntry*>(block + at);
      const int number = DescriptorNumber(block + at + offsetof(KernelEntry, name));
      if (number >= 1 && number != directory) close(number);
      at += entry->length;
    }
  }
  close(directory);
  return size == 0;
}

// Closes every descriptor from 1 on, with nothing but system calls: this runs between fork and the
// end. An old kernel has no close_range, and a sandbox may refuse it.
void CloseAllButFirst() {
  if (close_range(1, ~0U, 0) == 0 || CloseListed()) return;
  constexpr rlim_t kMostTried = 1 << 20;
  rlimit limit{};
  const rlim_t count = getrlimit(RLIMIT_NOFILE, &limit) == 0 ? limit.rlim_cur : kMostTried;
  for (rlim_t i = 1; i < std::min(count, kMostTried); ++i) close(static_cast<int>(i));
}

[[noreturn]] void AnswerFromChild(const BoundedQuestion& question, std::span<std::byte> answer,
                                  int pipe) {
  // Whatever else is open, a lock or somebody's pipe, must not stay open with a child that hangs.
  if (dup2(pipe, 0) < 0) _exit(1);
  CloseAllButFirst();
  const ssize_t size = question(answer);
  // A pipe takes as little as this in one go.
  if (size > 0 && write(0, answer.data(), static_cast<std::size_t>(size)) < 0) _exit(1);
  _exit(0);
}

}  // namespace

BoundedAnswer AskWithin(std::chrono::milliseconds limit, std::size_t capacity,
                        const BoundedQuestion& question) {
  Data answer(capacity);
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) return {};
  const Descriptor heard(ends[0]);
  Descriptor told(ends[1]);
  const pid_t child = fork();
  if (child == 0) AnswerFromChild(question, answer, told.get());
  told = Descriptor();
  if (child < 0) return {};

  const auto deadline = std::chrono::steady_clock::now() + limit;
  pollfd waiting{heard.get(), POLLIN, 0};
  const int ready = Uninterrupted([&] {
    const auto left =
        std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
    return poll(&waiting, 1, static_cast<int>(std::max<std::int64_t>(left.count(), 0)));
  });
  const ssize_t size =
      ready > 0 ? Uninterrupted([&] { return read(heard.get(), answer.data(), answer.size()); })
                : 0;
  kill(child, SIGKILL);
  // One that has answered is gone in no time; one that hangs is not waited for.
  waitpid(child, nullptr, ready > 0 ? 0 : WNOHANG);
  answer.resize(static_cast<std::size_t>(std::max<ssize_t>(size, 0)));
  return {std::move(answer), ready == 0};
}

std::string ReadAttributeWithin(const std::string& path, std::chrono::milliseconds limit) {
  const auto text = AskWithin(limit, kMaxAttributeBytes, [&](std::span<std::byte> answer) {
    const int file = open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    return file < 0 ? ssize_t{-1} : read(file, answer.data(), answer.size());
  });
  return {reinterpret_cast<const char*>(text.bytes.data()), text.bytes.size()};
}

}  // namespace quorlet
