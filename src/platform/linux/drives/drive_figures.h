// What a drive's own bytes and the kernel's texts about it mean.
#ifndef QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_FIGURES_H_
#define QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_FIGURES_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

#include "platform/drives.h"

namespace quorlet {

// Adds the figures of an NVMe SMART / Health log page. One of another length has none.
void AddNvmeHealth(std::span<const std::byte> page, DriveFigures& figures);

// Adds the figures of a datacenter page (C0h). One of another length, or without the page's own
// identifier at its end, is something else of the maker's and has none. Fields whose bits are all
// set are not told.
void AddNvmeDatacenter(std::span<const std::byte> page, DriveFigures& figures);

// A whole hexadecimal number of at most eight digits, with or without "0x".
std::optional<std::uint32_t> ParseHexadecimal(std::string_view text);

// The upper end, in percent, of the tenth of its life that an eMMC or UFS drive has used: code n
// stands for (n - 1) * 10 to n * 10, 11 for more than 100 (which gives 110). Nothing for 0, which
// says that it is not told, and for other codes.
std::optional<std::int64_t> LifeTimeUsed(std::string_view code);
inline constexpr std::int64_t kLifeTimeStep = 10;

// Adds what the codes of an eMMC or UFS drive tell: the life time used of its areas A and B, and
// how much of its reserve is left. Texts that are no codes are left out.
void AddLifeTime(std::string_view areaA, std::string_view areaB, std::string_view endOfLife,
                 DriveFigures& figures);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_DRIVES_DRIVE_FIGURES_H_
