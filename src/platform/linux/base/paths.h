// Where what we read and write lies below the root.
#ifndef QUORLET_PLATFORM_LINUX_BASE_PATHS_H_
#define QUORLET_PLATFORM_LINUX_BASE_PATHS_H_

#include <array>
#include <cstdint>
#include <string_view>

namespace quorlet {

inline constexpr char kDriversDirectory[] = "/var/db/drivers";
inline constexpr char kPreferencesDirectory[] = "/var/mobile/Library/Preferences";
// Logs for submission, first in the one directory, then in the other.
inline constexpr char kSpoolDirectory[] = "/var/mobile/Library/Logs/Diagwell";
inline constexpr char kPendingDirectory[] = "/var/mobile/Library/Logs/Diagwell/pending";
inline constexpr char kOutboxDirectory[] = "/var/mobile/Library/Logs/Diagwell/outbox";
inline constexpr std::array<std::string_view, 2> kSpoolStages = {"pending", "outbox"};
inline constexpr std::uint64_t kSpoolQuotaBytes = std::uint64_t{64} << 20;  // of both together
inline constexpr char kStructuredLogDirectory[] = "/var/mobile/Library/Logs/FaultScribe";
inline constexpr char kSupportLogDirectory[] = "/var/mobile/Library/Logs/Carewell";
inline constexpr char kSystemLogDirectory[] = "/var/log";
// Sockets and locks.
inline constexpr char kServiceDirectory[] = "/run/quorlet";

// Below the data home.
inline constexpr char kCounterStoreDirectory[] = "/Library/TallyLedger";
inline constexpr char kCounterStorePath[] = "/Library/TallyLedger/TLDataStore.sqlitedb";

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_BASE_PATHS_H_
