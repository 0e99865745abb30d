#include "driver/listener.h"

#include <gtest/gtest.h>

#include "fakes/fake_platform.h"

namespace quorlet {
namespace {

Data Uuid() {
  Data uuid;
  for (int i = 0; i < 16; ++i) uuid.push_back(static_cast<std::byte>(0xA0 + i));
  return uuid;
}

Dictionary Element() {
  Dictionary element{{"uuid", Uuid()}, {"bundle_id", "b"}, {"version", "1"}};
  element["tesk_id"] = Int64(7);
  element["arch"] = Int64(-1);
  return element;
}

TEST(ListenerTest, RecordsHaveFiveFields) {
  Array records;
  EXPECT_TRUE(appInfoRecordFromMessage(Element(), records));
  Dictionary sparse = Element();
  sparse.remove("arch");
  sparse["tesk_id"] = "7";
  EXPECT_TRUE(appInfoRecordFromMessage(sparse, records));
  const std::string uuid = "A0A1A2A3-A4A5-A6A7-A8A9-AAABACADAEAF";
  const auto record = [&](std::int64_t teskID, std::int64_t arch) {
    Dictionary fields{{"bundle", "b"}, {"version", "1"}, {"uuid", uuid}};
    fields["teskID"] = Int64(teskID);
    fields["arch"] = Int64(arch);
    return fields;
  };
  EXPECT_EQ(records, (Array{record(7, -1), record(0, 0)}));

  for (const char* key : {"uuid", "bundle_id", "version"}) {
    Dictionary broken = Element();
    broken.remove(key);
    EXPECT_TRUE(appInfoRecordFromMessage(broken, records));
    broken[key] = Data(15);
    EXPECT_TRUE(appInfoRecordFromMessage(broken, records));
  }
  EXPECT_TRUE(appInfoRecordFromMessage("x", records));
  EXPECT_EQ(records.size(), 2u) << "incomplete elements add nothing";
}

TEST(ListenerTest, WithoutAListenerOneQuietSliceIsWaitedOut) {
  FakePlatform device;
  device.namedService.canListen = false;
  RunDriver driver(device.services);
  Listener(device.services, driver).serve();
  EXPECT_EQ(device.namedService.sliceSeconds, std::vector<double>{10.0});
}

}  // namespace
}  // namespace quorlet
