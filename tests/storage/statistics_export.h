// Statistics exports, and a driver that hands them out.
#ifndef QUORLET_TESTS_STORAGE_STATISTICS_EXPORT_H_
#define QUORLET_TESTS_STORAGE_STATISTICS_EXPORT_H_

#include <algorithm>
#include <cstring>
#include <string>
#include <utility>
#include <vector>

#include "fakes/fake_platform.h"
#include "storage/statistics_keys.h"

namespace quorlet {

using ExportWords = std::vector<std::uint64_t>;
using Records = std::vector<std::pair<std::string_view, ExportWords>>;

inline void AddRecord(ExportWords& words, std::uint64_t id, const ExportWords& values) {
  words.push_back(id | values.size() << 32);
  words.insert(words.end(), values.begin(), values.end());
}

// Records of keys by their names.
inline ExportWords ExportOf(const Records& records) {
  ExportWords words;
  for (const auto& [name, values] : records) {
    const auto key = std::ranges::find(kStatisticsKeys, name, &StatisticsKey::name);
    AddRecord(words, key->id, values);
  }
  return words;
}

// A controller that answers the export methods 8 (class FSPStorage) or 9.
struct ExportDevice : FakePlatform {
  explicit ExportDevice(std::string_view className = "FSPStorage") {
    FakeEntry entry;
    entry.className = className;
    entry.driver = [this, method = className == "FSPStorage" ? 8U : 9U](
                       std::uint32_t called, DriverCall& call) -> KernelReturn {
      const std::string input(reinterpret_cast<const char*>(call.structInput.data()),
                              call.structInput.size());
      requests.push_back(input);
      if (called != method) return kKernelUnsupported;
      const bool isQuery = (input.at(4) & 1) != 0;
      if ((isQuery ? queryStatus : fetchStatus) != 0) return isQuery ? queryStatus : fetchStatus;
      const auto size = claims.value_or(static_cast<std::uint32_t>(words.size() * 8));
      const void* const answer = isQuery ? static_cast<const void*>(&size) : words.data();
      const std::size_t length = isQuery ? sizeof size : words.size() * 8;
      call.bytesWritten = std::min(length, call.structOutput.size());
      if (call.bytesWritten != 0) {
        std::memcpy(call.structOutput.data(), answer, call.bytesWritten);
      }
      if (overstates) call.bytesWritten = SIZE_MAX;
      return 0;
    };
    driverRegistry.entries.push_back(entry);
  }
  FakeEntry& controller() { return driverRegistry.entries[0]; }

  ExportWords words;
  std::optional<std::uint32_t> claims;  // the size that the driver answers
  bool overstates = false;              // the driver says that it wrote more than there is room for
  KernelReturn queryStatus = 0;
  KernelReturn fetchStatus = 0;
  std::vector<std::string> requests;  // the input blocks
};

}  // namespace quorlet

#endif  // QUORLET_TESTS_STORAGE_STATISTICS_EXPORT_H_
