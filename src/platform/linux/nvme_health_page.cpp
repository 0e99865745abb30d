// A drive that does not answer keeps whoever asks it in the kernel, where no signal reaches. A time
// limit on the command itself would make the kernel reset the controller. So a child asks, and is
// left behind when it takes too long.
#include "platform/linux/nvme_health_page.h"

#include <fcntl.h>
#include <linux/nvme_ioctl.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <csignal>
#include <cstdint>

#include "platform/linux/descriptor.h"
#include "platform/linux/nvme_statistics.h"

namespace quorlet {
namespace {

constexpr std::uint8_t kGetLogPage = 0x02;
constexpr std::uint32_t kHealthPage = 0x02;
constexpr std::uint32_t kAllNamespaces = 0xFFFFFFFF;

int AskDrive(int device, std::array<std::byte, kNvmeHealthPageBytes>& page) {
  nvme_admin_cmd command{};
  command.opcode = kGetLogPage;
  command.nsid = kAllNamespaces;
  command.addr = reinterpret_cast<std::uintptr_t>(page.data());
  command.data_len = kNvmeHealthPageBytes;
  // The number of 32-bit words less one, and the page.
  command.cdw10 = (std::uint32_t{kNvmeHealthPageBytes / 4 - 1} << 16) | kHealthPage;
  return ioctl(device, NVME_IOCTL_ADMIN_CMD, &command);
}

// In the child: only what may be called between fork and the end.
[[noreturn]] void AnswerFromChild(const char* path, int answer) {
  // Whatever else is open, a lock or somebody's pipe, must not stay open with a child that hangs.
  if (dup2(answer, 0) < 0 || close_range(1, ~0U, 0) != 0) _exit(1);
  std::array<std::byte, kNvmeHealthPageBytes> page{};
  const int device = open(path, O_RDONLY | O_NONBLOCK | O_CLOEXEC);
  if (device >= 0 && AskDrive(device, page) == 0) {
    // A pipe takes a page in one go.
    if (write(0, page.data(), page.size()) < 0) _exit(1);
  }
  _exit(0);
}

}  // namespace

std::optional<Data> ReadNvmeHealthPage(const std::string& device, std::chrono::milliseconds limit) {
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) return std::nullopt;
  const Descriptor answer(ends[0]);
  Descriptor written(ends[1]);
  const pid_t child = fork();
  if (child == 0) AnswerFromChild(device.c_str(), written.get());
  written = Descriptor();
  if (child < 0) return std::nullopt;

  const auto deadline = std::chrono::steady_clock::now() + limit;
  pollfd waiting{answer.get(), POLLIN, 0};
  const int ready = Uninterrupted([&] {
    const auto left =
        std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
    return poll(&waiting, 1, static_cast<int>(std::max<std::int64_t>(left.count(), 0)));
  });
  Data page(kNvmeHealthPageBytes);
  const ssize_t size =
      ready > 0 ? Uninterrupted([&] { return read(answer.get(), page.data(), page.size()); }) : 0;
  kill(child, SIGKILL);
  // One that has answered is gone in no time; one that hangs is not waited for.
  waitpid(child, nullptr, ready > 0 ? 0 : WNOHANG);
  if (size != static_cast<ssize_t>(page.size())) return std::nullopt;
  return page;
}

}  // namespace quorlet
