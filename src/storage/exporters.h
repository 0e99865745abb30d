// Access to the flash-storage controller's exports: finding its driver, asking how large an export
// is, fetching it.
//
// Unless it says otherwise, an operation reports failures on standard error and gives every handle
// back on every path.
#ifndef QUORLET_STORAGE_EXPORTERS_H_
#define QUORLET_STORAGE_EXPORTERS_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <optional>
#include <span>
#include <string_view>

#include "platform/platform.h"
#include "platform/storage_exports.h"
#include "storage/statistics_parser.h"

namespace quorlet {

// --- The exporters that are known ---------------------------------------------------------------

// The selectors that the driver knows an export by.
struct SelectorPair {
  std::uint32_t sizeQuery;
  std::uint32_t fetch;
};
inline constexpr std::uint32_t kNoSelector = 0xFFFFFFFF;  // as sizeQuery: there is no such export
inline constexpr std::uint32_t kNoMethod = 0xFFFFFFFF;

// A driver class that exports statistics.
struct StorageExporter {
  using SelectorGetter = const SelectorPair* (*)();  // gives nullptr for an export that is missing

  std::string_view className;
  std::string_view characteristicsKey;    // the registry property of the device characteristics
  std::uint32_t contentAdviceMethod = 0;  // or kNoMethod
  std::uint32_t queryMethod = 0;
  std::uint32_t fetchMethod = 0;
  SelectorGetter getStatsSelectors = nullptr;
  SelectorGetter getDefectsListSelectors = nullptr;
  SelectorGetter getTelemetryListSelectors = nullptr;
  SelectorGetter getTaskSchedulerSelectors = nullptr;
  SelectorGetter getSnapshotSelectors = nullptr;
  SelectorGetter getSnapshotHeaderSelectors = nullptr;
  SelectorGetter getBandStatsSelectors = nullptr;
  bool (*parseBufferToCxt)(FSPParseContext&, std::span<const std::byte>) = nullptr;
  void (*releaseContext)(FSPParseContext&) = nullptr;
};

const SelectorPair* FSPGetStatsSelectors();
const SelectorPair* FSPGetDefectsListSelectors();
const SelectorPair* FSPGetTelemetryListSelectors();
const SelectorPair* FSPGetTaskSchedulerSelectors();
const SelectorPair* FSPGetSnapshotSelectors();
const SelectorPair* FSPGetSnapshotHeaderSelectors();
const SelectorPair* FSPGetBandStatsSelectors();

// In the order in which they are searched; the last row, without a class, stands for none.
extern const std::array<StorageExporter, 3> nand_exporters;

// The first service of the first class that has one, for the caller to release; 0, with the last
// row, when there is none. Writes no message.
RegistryHandle findNandExporter(DriverRegistry& registry, const StorageExporter*& row);

inline constexpr std::string_view kNoExporterMessage =
    "Could not get matching Devreg service for exporting classes\n";
inline constexpr std::string_view kConnectionNotClosed = "Could not close connection to service";

// --- One export ---------------------------------------------------------------------------------

// The largest export that is fetched; no controller has so much to tell.
inline constexpr std::size_t kMaxExportBytes = std::size_t{64} << 20;

// What it takes to ask a driver: the registry, and where failures are said.
struct DriverServices {
  // NOLINTNEXTLINE(google-explicit-constructor): a narrower view of the same services
  DriverServices(const Platform& platform)
      : driverRegistry(platform.driverRegistry), standardError(platform.standardError) {}
  DriverRegistry& driverRegistry;
  StandardError& standardError;
};

// Zeroed, page-aligned memory that a driver writes an export to.
class ExportBuffer {
 public:
  // Nothing when `size` is above kMaxExportBytes or memory has run out.
  static std::optional<ExportBuffer> Allocate(std::size_t size);
  std::span<std::byte> bytes() const { return {memory_.get(), size_}; }

 private:
  struct Free {
    void operator()(std::byte* memory) const { std::free(memory); }
  };
  ExportBuffer(std::byte* memory, std::size_t size) : memory_(memory), size_(size) {}
  std::unique_ptr<std::byte, Free> memory_;
  std::size_t size_;
};

// An exporter's service and a connection to its driver, for as long as it lives.
class ExporterConnection {
 public:
  // Takes over `service`, as findNandExporter found it with `row`. Without a connection, the object
  // is false and a message has been written.
  ExporterConnection(const DriverServices& services, RegistryHandle service,
                     const StorageExporter& row);
  // Writes a message when the connection cannot be closed.
  ~ExporterConnection();
  ExporterConnection(const ExporterConnection&) = delete;
  ExporterConnection& operator=(const ExporterConnection&) = delete;

  explicit operator bool() const { return connection_ != 0; }
  const StorageExporter& row() const { return row_; }
  RegistryHandle service() const { return service_; }
  RegistryHandle connection() const { return connection_; }

  // Asks for the size in bytes of the export. Without `selectors` (nullptr) the driver gets no
  // request block. Like fetch(), it writes no message.
  KernelReturn querySize(const SelectorPair* selectors, std::uint16_t flags, std::uint32_t& size);
  // Fetches the export into `buffer`; `written` is how many bytes the driver wrote.
  KernelReturn fetch(const SelectorPair* selectors, std::uint16_t flags,
                     std::span<std::byte> buffer, std::size_t& written);

 private:
  KernelReturn call(std::uint32_t method, const std::uint32_t* selector, unsigned flags,
                    std::span<std::byte> output, std::size_t& written);

  const DriverServices services_;
  const RegistryHandle service_;
  const StorageExporter& row_;
  RegistryHandle connection_ = 0;
};

// Fetches the statistics export and parses it. `row` becomes the exporter's row in any case; the
// caller releases `context` with the row's releaseContext, when it has one, whether or not the
// parse went well. True only when the parser accepted the export.
bool FetchAndParseStats(const DriverServices& services, const StorageExporter*& row,
                        FSPParseContext& context);

// Whether the driver says that content should be deleted; false for a driver without an answer.
bool NandRecommendsContentDeletion(const DriverServices& services);

// --- Connections that the caller keeps ----------------------------------------------------------

// A connection to the exporter's driver for the caller to close with FNDDisconnect, or 0.
RegistryHandle FNDConnect(const DriverServices& services, const StorageExporter*& row);
void FNDDisconnect(const DriverServices& services, RegistryHandle connection);

struct FSPConnection {
  RegistryHandle service = 0;
  RegistryHandle connection = 0;
  const StorageExporter* exporter = nullptr;
};

// Fills `connection`, for the caller to close with closeFSPConnection. False, with everything given
// back, without an exporter that has the usual statistics export.
bool openFSPConnection(const DriverServices& services, FSPConnection& connection);
// Gives back what there is.
void closeFSPConnection(const DriverServices& services, FSPConnection& connection);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_EXPORTERS_H_
