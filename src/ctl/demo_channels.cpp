#include <array>
#include <cstdint>
#include <vector>

#include "ctl/demo_bytes.h"
#include "ctl/demo_drivers.h"
#include "platform/report_records.h"
#include "values/byte_writer.h"

namespace quorlet {
namespace {

constexpr std::int64_t kHubId = 0x100;
constexpr std::uint64_t kNetworkId = 0x1001;

constexpr std::uint64_t kDiagnosisCategory = 0x2;

// The four values of an element.
using Values = std::array<std::uint64_t, kRawElementValues>;

struct DemoChannel {
  std::uint64_t id;
  const char* name;
  ReportFormat format;
  std::uint64_t category;
  std::vector<Values> elements;
};

// A state's ID shows as its name.
constexpr std::uint64_t StateId(std::string_view name) {
  std::uint64_t id = 0;
  for (const char c : name) id = (id << 8) | static_cast<unsigned char>(c);
  return id;
}

// Group by group: the legend has one unit for a group.
std::vector<DemoChannel> Traffic() {
  return {{1, "net0 received", ReportFormat::kSimple, kDailyCategory, {{7'340'032}}},
          {2, "net0 sent", ReportFormat::kSimple, kDailyCategory, {{1'048'576}}},
          {3, "net0 dropped", ReportFormat::kSimple, kDailyCategory, {{4096}}}};
}

// State, transitions into it, microseconds in it.
std::vector<DemoChannel> Power() {
  return {{StateId("LINK"),
           "net0 link power",
           ReportFormat::kState,
           kDiagnosisCategory,
           {{StateId("SLEEP"), 1204, 61'870'000'000},
            {StateId("IDLE"), 18'311, 17'480'250'000},
            {StateId("ACTIVE"), 17'107, 7'049'750'000}}}};
}

// Hits, minimum, maximum, sum.
std::vector<DemoChannel> Packets() {
  return {{StateId("PKTSIZE"),
           "net0 packet size",
           ReportFormat::kHistogram,
           kDiagnosisCategory,
           {{0, 0, 0, 0},
            {0, 0, 0, 0},
            {3210, 42, 64, 179'760},
            {1405, 65, 256, 196'700},
            {604, 257, 1024, 362'400},
            {5102, 1025, 1514, 7'649'748}}}};
}

// Upper bounds 4, 16, ... 4096: one segment of powers of 4.
Data PacketBounds() { return ByteWriter().u32(4).u32(1).u32(0).u32(6).data(); }

class NetworkDriver {
 public:
  void add(const Dictionary& group, const std::vector<DemoChannel>& channels) {
    Array entries;
    for (const DemoChannel& channel : channels) {
      const std::uint64_t type =
          makeType(channel.format, channel.category, channel.elements.size());
      entries.push_back(Array{Int64(static_cast<std::int64_t>(channel.id)),
                              Int64(static_cast<std::int64_t>(type)), channel.name});
      ByteWriter run;
      std::uint64_t timeStamp = 0;
      for (const Values& values : channel.elements) {
        run.u64(kNetworkId).u64(channel.id).u64(type).u64(++timeStamp);
        for (const std::uint64_t value : values) run.u64(value);
      }
      channels_.push_back(Dictionary{{"ChannelID", Int64(static_cast<std::int64_t>(channel.id))},
                                     {"Elements", run.data()}});
    }
    Dictionary described = group;
    described["DrvReportChannels"] = entries;
    legend_.push_back(described);
  }

  Dictionary description() const {
    return {
        {"EntryID", Int64(static_cast<std::int64_t>(kNetworkId))},
        {"EntryName", "net0"},
        {"ClassName", "DemoNetworkController"},
        {"Properties", Dictionary{{"DrvReportLegendPublic", true}, {"DrvReportLegend", legend_}}},
        {"Channels", channels_}};
  }

 private:
  Array legend_;
  Array channels_;
};

}  // namespace

Dictionary DemoHub() {
  return {{"EntryID", Int64(kHubId)},
          {"EntryName", "DrvReportHub"},
          {"ClassName", "DrvReportHub"},
          {"Properties", Dictionary()}};
}

Dictionary DemoNetworkDriver() {
  NetworkDriver driver;
  driver.add(Dictionary{{"DrvReportGroupName", "Network"},
                        {"DrvReportChannelInfo",
                         Dictionary{{"DrvReportChannelUnit", Int64(std::int64_t{kBytes})}}}},
             Traffic());
  driver.add(Dictionary{{"DrvReportGroupName", "Network"},
                        {"DrvReportSubGroupName", "Power"},
                        {"DrvReportChannelInfo",
                         Dictionary{{"DrvReportChannelUnit", Int64(std::int64_t{kMicroseconds})}}}},
             Power());
  driver.add(Dictionary{{"DrvReportGroupName", "Network"},
                        {"DrvReportSubGroupName", "Packets"},
                        {"DrvReportChannelInfo",
                         Dictionary{{"DrvReportChannelUnit", Int64(std::int64_t{kBytes})},
                                    {"DrvReportChannelConfig", PacketBounds()}}}},
             Packets());
  return driver.description();
}

}  // namespace quorlet
