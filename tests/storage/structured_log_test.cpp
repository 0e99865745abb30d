#include "storage/structured_log.h"

#include <gtest/gtest.h>

#include <map>

#include "storage/statistics_export.h"

namespace quorlet {
namespace {

std::string Words(const std::vector<std::uint32_t>& words) {
  return {reinterpret_cast<const char*>(words.data()), words.size() * sizeof(words[0])};
}
std::span<const std::byte> Bytes(const std::string& text) { return std::as_bytes(std::span(text)); }

// One entry of the list 3, behind two words; one defect.
const std::string kValidity = Words({1, 2, 8, 8, 8, 8, 9, 3, 77, 9, 9});
const std::string kDefects = Words({9, 12, 1, 0x20001, 3, 4, 5, 6, 7, 0xF8F6});

// A controller with all exports, by selector << 10 | list index << 2 | request flag << 1.
struct Device : FakePlatform {
  explicit Device(std::uint32_t bandErases = 45, std::uint32_t requestFlag = 0) {
    // clang-format off
    const ExportWords words = ExportOf({
        {"bytesPerPage", {16384}}, {"pagesPerVirtualBlock", {16}}, {"bandErases", {bandErases}},
        {"pagesPerVirtualBlockSlc", {1}}, {"pagesPerVirtualBlockSlc", {8}},
        {"intermediateBandErases", {100}}, {"hostWrites", {1600}}, {"exportVersion", {1}}});
    // clang-format on
    exports[13 << 10] = {reinterpret_cast<const char*>(words.data()), words.size() * 8};
    exports[11 << 10 | requestFlag] = kValidity;
    exports[15 << 10 | requestFlag] = kDefects;
    for (unsigned i = 0; i < 3; ++i) exports[17 << 10 | i << 2 | requestFlag].assign(4128, '\1');
    FakeEntry entry;
    entry.className = "FSPStorage";
    entry.properties["Device Characteristics"] =
        Dictionary{{"chip-id", "K3A"}, {"manufacturer-id", "1234"}, {"num-bus", Int32(1)}};
    entry.driver = [this](std::uint32_t, DriverCall& call) -> KernelReturn {
      std::uint32_t request[2];
      std::memcpy(request, call.structInput.data(), sizeof request);
      const std::uint32_t key = request[0] << 10 | request[1];
      const auto found = exports.find(key & ~1U);
      if (found == exports.end() || key == failing) return 0x2BC;
      std::string answer = found->second;
      if ((key & 1) != 0) answer = Words({size.value_or(answer.size())});
      call.bytesWritten =
          answer.copy(reinterpret_cast<char*>(call.structOutput.data()), call.structOutput.size());
      return 0;
    };
    driverRegistry.entries.push_back(entry);
  }
  FakeEntry& controller() { return driverRegistry.entries[0]; }

  std::map<std::uint32_t, std::string> exports;
  std::uint32_t failing = 0;  // a query's request has bit 0 set
  std::optional<std::uint32_t> size;
  StorageLogState state;
};

TEST(StructuredLog, OneRun) {
  Device device(51, 2);
  EXPECT_TRUE(DumpStorageStructuredLog(device.services, device.state, true));
  EXPECT_EQ(device.standardError.text, "");
  EXPECT_EQ(device.state.gCurrentUserWamp, static_cast<double>(2.04F));
  const SubmittedLog& log = device.diagnostics.logs.at(0);
  EXPECT_EQ(log.typeCode, "165");
  EXPECT_NE(log.body.find("]: IntermediateWamp:2.00;UserWamp:2.04;ValidityList[3]:77;nuvex."),
            std::string::npos);
  // clang-format off
  const Dictionary defect{
      {"Bus", Int32(1)}, {"CE", Int32(2)}, {"CAU", Int32(3)}, {"Block", Int32(4)},
      {"Cycle", Int32(5)}, {"Reason", Int32(6)}, {"Page", Int32(7)}, {"Temperature", Int8(-10)}};
  // clang-format on
  const auto& entries = device.crashSupport.entries;
  EXPECT_TRUE(entries.at(2).second.contains("readStage[22]"));
  EXPECT_EQ(entries.at(3).second, (Dictionary{{"Factory Count", Int32(12)}}));
  EXPECT_EQ(entries.at(4), std::pair(176, defect));
}

TEST(StructuredLog, Threshold) {
  const struct {
    std::optional<PropertyValue> preference;
    std::uint32_t bandErases;  // 50 of them: a ratio of 2
    bool needed;
    bool forced = false;
  } cases[] = {{std::nullopt, 50, false}, {std::nullopt, 51, true}, {"1", 45, false},
               {Single(1.5F), 45, true},  {Int32(1), 45, false},    {Int32(1), 51, true},
               {Double(10), 51, true},    {Double(10), 45, false},  {Double(0), 45, false},
               {Double(9.5), 230, false}, {Double(9.5), 240, true}, {Double(9.5), 0, true, true}};
  for (const auto& [preference, bandErases, needed, forced] : cases) {
    Device device(bandErases);
    device.state.gForceCollectionSet = forced;
    device.preferences.DGWPreferencesSetValue("userWAmp", preference, "nuvex.NANDInfo");
    DumpStorageStructuredLog(device.services, device.state, false);
    EXPECT_EQ(device.diagnostics.logs.size(), needed ? 1U : 0U) << bandErases;
  }
}

TEST(StructuredLog, Failures) {
  // clang-format off
  const struct {
    void (*setUp)(Device&);
    bool result;
    std::string message;
    std::size_t entries;
  } cases[] = {
      {[](auto& d) { d.controller().className = "x"; }, false, "for exporting classes\n", 0},
      {[](auto& d) { d.controller().properties = {}; }, false, "failed to create dictionary", 0},
      {[](auto& d) { d.failing = 17 << 10 | 5; }, true,
       "CallDriverStruct failed with status 0x2bc on selector index 2\n", 4},
      {[](auto& d) { d.failing = 15 << 10; }, true,
       "Could not retrieve data from driver for selector 15\n", 3},
      {[](auto& d) { d.exports[15 << 10] = ""; }, true, "", 3},
      {[](auto& d) { d.exports[17 << 10].pop_back(); }, false, "bounds of the buffer\n", 4},
      {[](auto& d) { d.size = ~0U; }, false, "Could not malloc 4294967295 bytes", 0},
      {[](auto& d) { d.exports[15 << 10] = kDefects.substr(0, 12); d.size = 4128; }, true, "", 4},
  };
  // clang-format on
  for (const auto& [setUp, result, message, entries] : cases) {
    Device device;
    setUp(device);
    EXPECT_EQ(DumpStorageStructuredLog(device.services, device.state, false), result) << message;
    EXPECT_TRUE(device.standardError.text.ends_with(message)) << device.standardError.text;
    EXPECT_EQ(device.crashSupport.entries.size(), entries) << message;
    EXPECT_TRUE(device.driverRegistry.isBalanced());
  }
}

TEST(StructuredLog, DamagedLists) {
  // The counts of the last two: 20 x 0x0CCCCCCD is 4 in 32 bits, 8 x 0x20000000 is 0.
  const std::string lists[] = {"",
                               kValidity.substr(1),
                               Words({0, 0}),
                               Words({~0U, ~0U, 0, 0}),
                               Words({0x0CCCCCCD, 0, 0}),
                               Words({1, 0x20000000, 0, 0, 0, 0, 0})};
  for (const std::string& list : lists) {
    Device device;
    device.state.gNeedValidityList = true;
    EXPECT_FALSE(LogValidityList(device.services, device.state, Bytes(list))) << list.size();
    EXPECT_EQ(device.standardError.text, "data cannot be parsed");
  }
  Device claiming;  // 2^32 - 1 defects in 3 MB, of which it writes 12 bytes
  const std::string claim = Words({0, 1, ~0U}) + std::string(3'000'000, '\0');
  EXPECT_TRUE(LogDefectsList(claiming.services, Bytes(claim), 12));
  EXPECT_EQ(claiming.crashSupport.entries.size(), 1u);
  EXPECT_TRUE(LogDefectsList(claiming.services, Bytes(claim), claim.size()));
  EXPECT_EQ(claiming.crashSupport.entries.size(), 1u + 16385);
  EXPECT_EQ(claiming.log.errors().size(), 1u);
  std::string defects = kDefects + kDefects.substr(12);
  defects[11] = '\x7F';  // claims far more records than there are
  for (std::size_t length = 0; length <= defects.size(); ++length) {
    Device device;
    EXPECT_EQ(LogDefectsList(device.services, Bytes(defects.substr(0, length)), length),
              length >= 8);
    EXPECT_EQ(device.crashSupport.entries.size(), length < 8    ? 0
                                                  : length < 12 ? 1
                                                                : 1 + (length - 12) / 28);
  }
}

}  // namespace
}  // namespace quorlet
