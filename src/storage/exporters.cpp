#include "storage/exporters.h"

#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <string>

#include "values/byte_reader.h"
#include "values/digits.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr std::uint32_t kConnectionType = 0;
constexpr char kNoConnectionMessage[] = "Could not get connection to service\n";

constexpr SelectorPair statsSelectors{kStatisticsSelector, kStatisticsSelector};
constexpr SelectorPair bandStatsSelector{kBandStatisticsSelector, kBandStatisticsSelector};
constexpr SelectorPair defectsListSelector{kDefectsListSelector, kDefectsListSelector};
constexpr SelectorPair telemetryListSelectors{kTelemetryListSelector, kTelemetryListSelector};
constexpr SelectorPair taskSchedulerSelectors{kTaskSchedulerSelector, kTaskSchedulerSelector};
constexpr SelectorPair snapshotSelectors{kSnapshotSelector, kSnapshotSelector};
constexpr SelectorPair snapshotHeaderSelectors{kSnapshotHeaderSelector, kSnapshotHeaderSelector};
// Two exports with one selector would be read as each other.
static_assert([] {
  auto selectors = std::array{statsSelectors,         bandStatsSelector,      defectsListSelector,
                              telemetryListSelectors, taskSchedulerSelectors, snapshotSelectors,
                              snapshotHeaderSelectors};
  std::ranges::sort(selectors, {}, &SelectorPair::fetch);
  return std::ranges::adjacent_find(selectors, {}, &SelectorPair::fetch) == selectors.end();
}());

// What every class that is known has in common.
constexpr StorageExporter MakeRow(const StorageClass& storageClass,
                                  std::uint32_t contentAdviceMethod) {
  return {.className = storageClass.name,
          .characteristicsKey = storageClass.characteristicsKey,
          .contentAdviceMethod = contentAdviceMethod,
          .queryMethod = storageClass.exportMethod,
          .fetchMethod = storageClass.exportMethod,
          .getStatsSelectors = FSPGetStatsSelectors,
          .getDefectsListSelectors = FSPGetDefectsListSelectors,
          .getTelemetryListSelectors = FSPGetTelemetryListSelectors,
          .getTaskSchedulerSelectors = FSPGetTaskSchedulerSelectors,
          .getSnapshotSelectors = FSPGetSnapshotSelectors,
          .getSnapshotHeaderSelectors = FSPGetSnapshotHeaderSelectors,
          .getBandStatsSelectors = FSPGetBandStatsSelectors,
          .parseBufferToCxt = FSPParseBufferToCxt,
          .releaseContext = FSPReleaseContext};
}

// False after a message, or without one when the row has no statistics export or the parser does
// not accept it.
bool FetchAndParse(const DriverServices& services, ExporterConnection& connection,
                   FSPParseContext& context) {
  const StorageExporter& row = connection.row();
  const SelectorPair* selectors = nullptr;
  if (row.getStatsSelectors != nullptr) {
    selectors = row.getStatsSelectors();
    if (selectors == nullptr || selectors->sizeQuery == kNoSelector) return false;
  }
  std::uint32_t size = 0;
  if (const KernelReturn status = connection.querySize(selectors, 0, size); status != 0) {
    services.standardError.write(
        FormatText("CallDriverStruct: %d", static_cast<std::int32_t>(status)));
    return false;
  }
  const auto buffer = ExportBuffer::Allocate(size);
  if (!buffer) {
    services.standardError.write(FormatText("Could not valloc %u bytes", size));
    return false;
  }
  std::size_t written = 0;
  if (connection.fetch(selectors, 0, buffer->bytes(), written) != 0) {
    const std::uint32_t selector = selectors != nullptr ? selectors->fetch : 0;
    services.standardError.write(
        FormatText("Could not retrieve data from driver for selector %s\n", HexNumber(selector)));
    return false;
  }
  return row.parseBufferToCxt(context, buffer->bytes().first(written));
}

}  // namespace

const SelectorPair* FSPGetStatsSelectors() { return &statsSelectors; }
const SelectorPair* FSPGetDefectsListSelectors() { return &defectsListSelector; }
const SelectorPair* FSPGetTelemetryListSelectors() { return &telemetryListSelectors; }
const SelectorPair* FSPGetTaskSchedulerSelectors() { return &taskSchedulerSelectors; }
const SelectorPair* FSPGetSnapshotSelectors() { return &snapshotSelectors; }
const SelectorPair* FSPGetSnapshotHeaderSelectors() { return &snapshotHeaderSelectors; }
const SelectorPair* FSPGetBandStatsSelectors() { return &bandStatsSelector; }

constexpr std::array<StorageExporter, 3> nand_exporters{
    MakeRow(kFlashStorageClass, 5),
    MakeRow(kNvmeStorageClass, kNoMethod),
    StorageExporter(),
};

RegistryHandle findNandExporter(DriverRegistry& registry, const StorageExporter*& row) {
  row = nand_exporters.data();
  for (; !row->className.empty(); ++row) {
    if (const RegistryHandle service = registry.FindServiceByClass(row->className)) return service;
  }
  return 0;
}

std::optional<ExportBuffer> ExportBuffer::Allocate(std::size_t size) {
  if (size > kMaxExportBytes) return std::nullopt;
  const auto pageSize = static_cast<std::size_t>(sysconf(_SC_PAGESIZE));
  const std::size_t pages = std::max<std::size_t>((size + pageSize - 1) / pageSize, 1);
  auto* memory = static_cast<std::byte*>(std::aligned_alloc(pageSize, pages * pageSize));
  if (memory == nullptr) return std::nullopt;
  // The driver may fill less than it said.
  std::memset(memory, 0, size);
  return ExportBuffer(memory, size);
}

ExporterConnection::ExporterConnection(const DriverServices& services, RegistryHandle service,
                                       const StorageExporter& row)
    : services_(services), service_(service), row_(row) {
  if (services.driverRegistry.OpenDriverConnection(service, kConnectionType, connection_) != 0) {
    connection_ = 0;
  }
  if (connection_ == 0) services.standardError.write(kNoConnectionMessage);
}

ExporterConnection::~ExporterConnection() {
  if (connection_ != 0 && services_.driverRegistry.CloseDriverConnection(connection_) != 0) {
    services_.standardError.write(std::string(kConnectionNotClosed) + '\n');
  }
  services_.driverRegistry.ReleaseHandle(service_);
}

KernelReturn ExporterConnection::querySize(const SelectorPair* selectors, std::uint16_t flags,
                                           std::uint32_t& size) {
  std::array<std::byte, sizeof size> answer{};
  std::size_t written = 0;
  const KernelReturn status =
      call(row_.queryMethod, selectors != nullptr ? &selectors->sizeQuery : nullptr,
           flags | kSizeOnlyFlag, answer, written);
  size = ByteReader(answer).little<std::uint32_t>();
  return status;
}

KernelReturn ExporterConnection::fetch(const SelectorPair* selectors, std::uint16_t flags,
                                       std::span<std::byte> buffer, std::size_t& written) {
  return call(row_.fetchMethod, selectors != nullptr ? &selectors->fetch : nullptr, flags, buffer,
              written);
}

KernelReturn ExporterConnection::call(std::uint32_t method, const std::uint32_t* selector,
                                      unsigned flags, std::span<std::byte> output,
                                      std::size_t& written) {
  ExportRequest request{};
  std::span<const std::byte> input;
  if (selector != nullptr) {
    request = MakeExportRequest(*selector, static_cast<std::uint16_t>(flags));
    input = request;
  }
  const KernelReturn status =
      services_.driverRegistry.CallDriverStruct(connection_, method, input, output, written);
  written = std::min(written, output.size());
  return status;
}

bool FetchAndParseStats(const DriverServices& services, const StorageExporter*& row,
                        FSPParseContext& context) {
  const RegistryHandle service = findNandExporter(services.driverRegistry, row);
  if (service == 0) {
    services.standardError.write(kNoExporterMessage);
    return false;
  }
  ExporterConnection connection(services, service, *row);
  return connection && FetchAndParse(services, connection, context);
}

bool NandRecommendsContentDeletion(const DriverServices& services) {
  DriverRegistry& registry = services.driverRegistry;
  const StorageExporter* row = nullptr;
  const RegistryHandle service = findNandExporter(registry, row);
  if (row->contentAdviceMethod == kNoMethod) {
    registry.ReleaseHandle(service);
    return false;
  }
  if (service == 0) {
    services.standardError.write(
        "_load_nand_infoCould not get matching Devreg service for exporting classes\n");
    return false;
  }
  const ExporterConnection connection(services, service, *row);
  if (!connection) return false;
  std::array<std::byte, sizeof(std::uint32_t)> answer{};
  std::size_t written = 0;
  const KernelReturn status = registry.CallDriverStruct(
      connection.connection(), row->contentAdviceMethod, {}, answer, written);
  return status == kKernelSuccess && written >= answer.size() &&
         ByteReader(answer).little<std::uint32_t>() != 0;
}

RegistryHandle FNDConnect(const DriverServices& services, const StorageExporter*& row) {
  DriverRegistry& registry = services.driverRegistry;
  const RegistryHandle service = findNandExporter(registry, row);
  if (service == 0) {
    services.standardError.write("No class found");
    return 0;
  }
  RegistryHandle connection = 0;
  const KernelReturn status = registry.OpenDriverConnection(service, kConnectionType, connection);
  registry.ReleaseHandle(service);
  if (status == kKernelSuccess) return connection;
  services.standardError.write(
      FormatText("OpenDriverConnection failed for class '%s', result 0x%s\n", row->className,
                 HexNumber(status)));
  return 0;
}

void FNDDisconnect(const DriverServices& services, RegistryHandle connection) {
  if (services.driverRegistry.CloseDriverConnection(connection) != kKernelSuccess) {
    services.standardError.write("closing connection to service failed\n");
  }
}

bool openFSPConnection(const DriverServices& services, FSPConnection& connection) {
  connection = {};
  connection.service = findNandExporter(services.driverRegistry, connection.exporter);
  if (connection.service == 0) {
    services.standardError.write("Can't get FSP Connection, no matching service!\n");
    return false;
  }
  connection.connection = FNDConnect(services, connection.exporter);
  if (connection.connection != 0 &&
      connection.exporter->getStatsSelectors == FSPGetStatsSelectors) {
    return true;
  }
  services.standardError.write("Can't get FSP Connection!\n");
  closeFSPConnection(services, connection);
  return false;
}

void closeFSPConnection(const DriverServices& services, FSPConnection& connection) {
  if (connection.connection != 0) FNDDisconnect(services, connection.connection);
  connection.connection = 0;
  if (connection.service != 0) services.driverRegistry.ReleaseHandle(connection.service);
  connection.service = 0;
}

}  // namespace quorlet
