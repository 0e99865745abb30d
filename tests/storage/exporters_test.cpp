#include "storage/exporters.h"

#include <gtest/gtest.h>

#include <functional>

#include "storage/statistics_export.h"

namespace quorlet {
namespace {

using namespace std::string_literals;

constexpr char kNoConnection[] = "Could not get connection to service\n";

TEST(Exporters, FetchAndParseStats) {
  const struct {
    std::function<void(ExportDevice&)> setUp;
    const char* message;
    bool result;
    std::size_t pairs;
  } cases[] = {
      {[](auto&) {}, "", true, 2},
      {[](auto& d) { d.overstates = true; }, "", true, 2},
      {[](auto& d) { d.claims = 16; }, "", true, 1},
      {[](auto& d) { d.claims = 24; }, "", false, 1},
      {[](auto& d) { d.claims = 4096; }, "", true, 2},
      {[](auto& d) { d.claims = 0; }, "", false, 0},
      {[](auto& d) { d.claims = 64 << 20; }, "", true, 2},
      {[](auto& d) { d.claims = (64 << 20) + 1; }, "Could not valloc 67108865 bytes", false, 0},
      {[](auto& d) { d.claims = ~0U; }, "Could not valloc 4294967295 bytes", false, 0},
      {[](auto& d) { d.words.clear(); }, "", false, 0},
      {[](auto& d) { d.queryStatus = kKernelUnsupported; }, "CallDriverStruct: -536870201", false,
       0},
      {[](auto& d) { d.fetchStatus = kKernelError; },
       "Could not retrieve data from driver for selector d\n", false, 0},
      {[](auto& d) { d.controller().openStatus = kKernelError; }, kNoConnection, false, 0},
      {[](auto& d) { d.controller().closeStatus = kKernelError; },
       "Could not close connection to service\n", true, 2},
      {[](auto& d) { d.controller().className = "Other"; },
       "Could not get matching Devreg service for exporting classes\n", false, 0},
  };
  for (const auto& [setUp, message, result, pairs] : cases) {
    ExportDevice device;
    device.words = ExportOf({{"version", {1}}, {"boots", {2}}});
    setUp(device);
    const StorageExporter* row = nullptr;
    FSPParseContext context;
    EXPECT_EQ(FetchAndParseStats(device.services, row, context), result);
    EXPECT_EQ(device.standardError.text, message);
    EXPECT_EQ(context.pairs.size(), pairs) << &message - &cases[0].message;
    EXPECT_EQ(row->className, device.controller().className == "Other" ? "" : "FSPStorage");
    EXPECT_TRUE(device.driverRegistry.isBalanced());
  }
}

TEST(Exporters, RequestsAndRows) {
  ExportDevice device("NuvexEmbeddedNVMeController");
  device.words = ExportOf({{"version", {1}}});
  const StorageExporter* row = nullptr;
  FSPParseContext context;
  EXPECT_TRUE(FetchAndParseStats(device.services, row, context));
  EXPECT_EQ(row->characteristicsKey, "Controller Characteristics");
  EXPECT_EQ(device.requests, (std::vector<std::string>{"\x0D\0\0\0\1\0"s + std::string(18, '\0'),
                                                       "\x0D"s + std::string(23, '\0')}));
  const auto request = MakeExportRequest(0x04030201, ExportFlags(true, 255));
  EXPECT_EQ(std::string(reinterpret_cast<const char*>(request.data()), request.size()),
            "\1\2\3\4\xFE\3"s + std::string(18, '\0'));

  device.driverRegistry.entries.emplace_back().className = "FSPStorage";
  const RegistryHandle service = findNandExporter(device.driverRegistry, row);
  EXPECT_EQ(row->characteristicsKey, "Device Characteristics");
  device.driverRegistry.ReleaseHandle(service);
  auto buffer = ExportBuffer::Allocate(5000);
  EXPECT_EQ(reinterpret_cast<std::uintptr_t>(buffer->bytes().data()) % 4096, 0U);
  EXPECT_EQ(std::ranges::count(buffer->bytes(), std::byte{0}), 5000);
}

TEST(Exporters, ContentAdvice) {
  const struct {
    const char* className;
    std::string answer;
    KernelReturn status;
    bool result;
    int opens;
    const char* message;
  } cases[] = {
      {"FSPStorage", "\0\0\0\1"s, 0, true, 1, ""},
      {"FSPStorage", "\0\0\0\0"s, 0, false, 1, ""},
      {"FSPStorage", "\1\1\1"s, 0, false, 1, ""},
      {"FSPStorage", "\1\0\0\0"s, kKernelError, false, 1, ""},
      {"NuvexEmbeddedNVMeController", "\1\0\0\0"s, 0, false, 0, ""},
      {"Other", "", 0, false, 0,
       "_load_nand_infoCould not get matching Devreg service for exporting classes\n"},
  };
  for (const auto& test : cases) {
    FakePlatform device;
    device.driverRegistry.entries.emplace_back().className = test.className;
    device.driverRegistry.entries[0].driver = [&](std::uint32_t method, DriverCall& call) {
      if (method != 5 || !call.structInput.empty()) return kKernelUnsupported;
      call.bytesWritten = test.answer.copy(reinterpret_cast<char*>(call.structOutput.data()),
                                           call.structOutput.size());
      return test.status;
    };
    EXPECT_EQ(NandRecommendsContentDeletion(device.services), test.result) << test.className;
    EXPECT_EQ(device.standardError.text, test.message);
    EXPECT_EQ(device.driverRegistry.opens, test.opens);
    EXPECT_TRUE(device.driverRegistry.isBalanced());
    device.driverRegistry.entries[0].openStatus = kKernelError;
    device.standardError.text.clear();
    EXPECT_FALSE(NandRecommendsContentDeletion(device.services));
    EXPECT_EQ(device.standardError.text, test.opens != 0 ? kNoConnection : test.message);
    EXPECT_TRUE(device.driverRegistry.isBalanced());
  }
}

TEST(Exporters, KeptConnections) {
  ExportDevice device;
  FSPConnection connection;
  ASSERT_TRUE(openFSPConnection(device.services, connection));
  EXPECT_EQ(connection.exporter->className, "FSPStorage");
  EXPECT_FALSE(device.driverRegistry.isBalanced());
  device.controller().closeStatus = kKernelError;
  closeFSPConnection(device.services, connection);
  device.controller().openStatus = 0xE00002C5;
  EXPECT_FALSE(openFSPConnection(device.services, connection));
  device.controller().className = "Other";
  EXPECT_FALSE(openFSPConnection(device.services, connection));
  EXPECT_EQ(FNDConnect(device.services, connection.exporter), 0U);
  EXPECT_EQ(device.standardError.text,
            "closing connection to service failed\n"
            "OpenDriverConnection failed for class 'FSPStorage', result 0xe00002c5\n"
            "Can't get FSP Connection!\n"
            "Can't get FSP Connection, no matching service!\n"
            "No class found");
  EXPECT_TRUE(device.driverRegistry.isBalanced());
}

}  // namespace
}  // namespace quorlet
