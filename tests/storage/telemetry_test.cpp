#include "storage/telemetry.h"

#include <gtest/gtest.h>

#include <numeric>

#include "fakes/fake_platform.h"

namespace quorlet {
namespace {

Dictionary Characteristics(PropertyValue chip, PropertyValue manufacturer,
                           PropertyValue channels = Int32(2)) {
  return {{"chip-id", chip}, {"manufacturer-id", manufacturer}, {"num-bus", channels}};
}

// Two channels: raw word i is i, or 10000 + i, word i of the summaries 30000 + i.
bool LogList(FakePlatform& device, const PropertyValue& characteristics, std::size_t length) {
  std::vector<std::uint32_t> words(2064);
  std::iota(words.begin(), words.begin() + 1024, 0);
  std::iota(words.begin() + 1024, words.begin() + 2048, 10000);
  std::iota(words.begin() + 2048, words.end(), 30000);
  const auto list = std::as_bytes(std::span(words)).first(length);
  return LogTelemetryList(device.crashSupport, device.standardError, list, characteristics);
}

TEST(Telemetry, WordMapsByDevice) {
  // Some words of the second channel.
  // clang-format off
  const struct {
    std::string_view chip, manufacturer;
    std::size_t entries;
    std::vector<std::pair<std::string_view, std::int64_t>> expected;
  } cases[] = {
      {"K4A", "g", 175, {
          {"RD", 30008}, {"num_pages", 30014}, {"readStage[7]", 10007}, {"readStage[32]", 10110},
          {"initialReadStage[13]", 10122}, {"nandStageOfLife[4]", 10023},
          {"dspExceptionParameter[37]", 10026}, {"readStage18NumOfErrorsBin[11]", 10044},
          {"readStage10NumOfErrorsBin[0]", 10055}, {"readStage17NumOfErrorsBin[9]", 10074},
          {"readStage19NumOfErrorsBin[11]", 10091}, {"retentionIndication[0]", 0},
          {"retentionIndication[3]", 10076}}},
      {"K3A", "g", 135, {
          {"readStage[22]", 10091}, {"initialReadStage[7]", 10027}, {"nandStageOfLife[0]", 10028},
          {"dspExceptionParameter[11]", 10115}, {"readStage10NumOfErrorsBin[9]", 10076},
          {"readStage9NumOfErrorsBin[7]", 10064}, {"algoNANDAccessesBin[7]", 10113}}},
      {"K4", "4582603A57FF", 127, {
          {"readStage[19]", 10301}, {"initialReadStage[9]", 10288}, {"nandStageOfLife[7]", 10297},
          {"dspExceptionParameter[9]", 10010}}},
      {"", "458260de57000000", 127, {{"readStage[19]", 10301}}},
      {"", "AD82522321ab", 127, {{"readStage[19]", 10297}, {"dspExceptionParameter[7]", 10311}}},
      {"", "AD8", 127, {
          {"readStage[22]", 10372}, {"initialReadStage[12]", 10392},
          {"dspExceptionParameter[11]", 10532}, {"readStage9NumOfErrorsBin[7]", 10337},
          {"readStage19NumOfErrorsBin[0]", 10373}}},
  };
  // clang-format on
  for (const auto& row : cases) {
    testing::internal::CaptureStdout();
    FakePlatform device;
    EXPECT_TRUE(LogList(device, Characteristics(row.chip, row.manufacturer), 8256));
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              row.manufacturer == "g" ? "unrecognized hex character: g" : "");
    const auto& [type, entry] = device.crashSupport.entries.at(1);
    EXPECT_EQ(type, 176);
    EXPECT_EQ(entry.size(), row.entries) << row.chip;
    for (const auto& [key, value] : row.expected) EXPECT_EQ(IntegerEntry(entry, key), value) << key;
  }
}

TEST(Telemetry, RefusedCharacteristics) {
  const std::string bounds = "ERROR: Attempting to parse beyond the bounds of the buffer\n";
  const std::pair<PropertyValue, std::string> cases[] = {
      {Array{}, "ERROR: Could not parse the Device Characteristics dictionary\n"},
      {Dictionary{}, "ERROR: Could not determine the chip-id\n"},
      {Characteristics(Int32(1), "1234"), "ERROR: chip-id is not stored as a PropStringTypeID\n"},
      {Characteristics(std::string(64, 'K'), "1234"),
       "ERROR: Unable to obtain chip-id as conversion from the UniChar contents of PropString "
       "failed, or the buffer of 64 bytes is too small\n"},
      {Dictionary{{"chip-id", "K4A"}}, "ERROR: Could not determine the manufacturer-id\n"},
      {Characteristics("K4A", true), "ERROR: manufacturer-id is NULL\n"},
      {Characteristics("K4A", "\xC3\xA4"),
       "ERROR: manufacturer-id is not stored as a PropStringTypeID\n"},
      {Dictionary{{"chip-id", ""}, {"manufacturer-id", ""}},
       "ERROR: could not determine the number of channels\n"},
      {Characteristics("K4A", "1234", Int32(-1)), bounds},
      {Characteristics("K4A", "1234"), bounds},
      {Characteristics(std::string(63, 'K'), "", Int32(0)), ""},
  };
  for (const auto& [characteristics, message] : cases) {
    FakePlatform device;
    EXPECT_EQ(LogList(device, characteristics, 8255), message.empty());
    EXPECT_EQ(device.standardError.text, message);
    EXPECT_TRUE(device.crashSupport.entries.empty()) << message;
  }
  const std::pair<const char*, std::uint32_t> digits[] = {
      {"", 0}, {"ABC", 0xAB0C}, {"abcdef0123", 0xABCDEF01}, {"12345", 0x123405}};
  for (const auto& [text, value] : digits) EXPECT_EQ(hexStringToInt32(text), value) << text;
}

}  // namespace
}  // namespace quorlet
