// The child's answer: one byte with the errno, or 0, then the health page and, if the drive has it,
// the datacenter page.
#include "platform/linux/drives/nvme_pages.h"

#include <fcntl.h>
#include <linux/nvme_ioctl.h>
#include <sys/ioctl.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <span>

#include "platform/linux/drives/bounded_answer.h"

namespace quorlet {
namespace {

constexpr std::uint8_t kGetLogPage = 0x02;
constexpr std::uint8_t kIdentify = 0x06;
constexpr std::uint32_t kIdentifyController = 1;
constexpr std::uint32_t kAllNamespaces = 0xFFFFFFFF;

enum Page : std::uint8_t { kSupportedPages = 0x00, kHealth = 0x02, kDatacenter = 0xC0 };

constexpr std::size_t kIdentifyBytes = 4096;
constexpr std::size_t kLogPageAttributes = 261;
constexpr std::byte kListsItsPages{1 << 5};
constexpr std::size_t kSupportedPagesBytes = 1024;
constexpr std::byte kIsSupported{1};

// 0, an errno, or EIO for what the drive refuses. All of these run between fork and the end.
int Command(int drive, nvme_admin_cmd command, std::span<std::byte> buffer) {
  command.addr = reinterpret_cast<std::uintptr_t>(buffer.data());
  command.data_len = static_cast<std::uint32_t>(buffer.size());
  const int status = ioctl(drive, NVME_IOCTL_ADMIN_CMD, &command);
  return status == 0 ? 0 : status < 0 ? errno : EIO;
}

int ReadPage(int drive, Page page, std::span<std::byte> buffer) {
  nvme_admin_cmd command{};
  command.opcode = kGetLogPage;
  command.nsid = kAllNamespaces;
  // The number of 32-bit words less one, and the page.
  command.cdw10 = static_cast<std::uint32_t>(buffer.size() / 4 - 1) << 16 | page;
  return Command(drive, command, buffer);
}

bool HasDatacenterPage(int drive) {
  alignas(4096) std::byte identity[kIdentifyBytes] = {};
  nvme_admin_cmd command{};
  command.opcode = kIdentify;
  command.cdw10 = kIdentifyController;
  if (Command(drive, command, identity) != 0) return false;
  if ((identity[kLogPageAttributes] & kListsItsPages) == std::byte{0}) return false;
  alignas(4096) std::byte pages[kSupportedPagesBytes] = {};
  return ReadPage(drive, kSupportedPages, pages) == 0 &&
         (pages[std::size_t{4} * kDatacenter] & kIsSupported) != std::byte{0};
}

ssize_t Ask(const char* device, std::span<std::byte> answer) {
  const int drive = open(device, O_RDONLY | O_NONBLOCK | O_CLOEXEC);
  int error = drive < 0 ? errno : 0;
  if (error == 0) error = ReadPage(drive, kHealth, answer.subspan(1, kNvmePageBytes));
  answer[0] = static_cast<std::byte>(std::min(error, 255));
  if (error != 0) return 1;
  const bool hasBoth =
      HasDatacenterPage(drive) &&
      ReadPage(drive, kDatacenter, answer.subspan(1 + kNvmePageBytes, kNvmePageBytes)) == 0;
  return 1 + static_cast<ssize_t>(kNvmePageBytes) * (hasBoth ? 2 : 1);
}

}  // namespace

NvmePages ReadNvmePages(const std::string& device, std::chrono::milliseconds limit) {
  const BoundedAnswer told =
      AskWithin(limit, 1 + 2 * kNvmePageBytes,
                [&](std::span<std::byte> answer) { return Ask(device.c_str(), answer); });
  NvmePages pages;
  pages.isLate = told.isLate;
  if (told.bytes.empty()) return pages;
  pages.error = std::to_integer<int>(told.bytes[0]);
  if (pages.error == EACCES || pages.error == EPERM) pages.answer = DriveAnswer::kDenied;
  const auto body = std::span(told.bytes).subspan(1);
  if (body.size() < kNvmePageBytes) return pages;
  pages.answer = DriveAnswer::kTold;
  pages.health.assign(body.begin(), body.begin() + kNvmePageBytes);
  if (body.size() == 2 * kNvmePageBytes) {
    pages.datacenter.assign(body.begin() + kNvmePageBytes, body.end());
  }
  return pages;
}

}  // namespace quorlet
