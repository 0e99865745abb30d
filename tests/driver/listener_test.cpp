#include "driver/listener.h"

#include <gtest/gtest.h>

namespace quorlet {
namespace {

TEST(ListenerTest, OnlyNumbersMayBeMissing) {
  const Dictionary sparse{{"uuid", Data(16, std::byte{0xAB})},
                          {"bundle_id", "b"},
                          {"version", "1"},
                          {"tesk_id", "7"},
                          {"arch", Double(7)}};
  Array records;
  EXPECT_TRUE(appInfoRecordFromMessage(sparse, records));
  EXPECT_EQ(records, (Array{Dictionary{{"bundle", "b"},
                                       {"version", "1"},
                                       {"uuid", "ABABABAB-ABAB-ABAB-ABAB-ABABABABABAB"},
                                       {"teskID", Int64(0)},
                                       {"arch", Int64(0)}}}));
  for (const char* key : {"uuid", "bundle_id", "version"}) {
    Dictionary broken = sparse.shallowCopy();
    broken.remove(key);
    EXPECT_TRUE(appInfoRecordFromMessage(broken, records));
    broken[key] = Data(15);
    EXPECT_TRUE(appInfoRecordFromMessage(broken, records));
  }
  EXPECT_TRUE(appInfoRecordFromMessage("x", records));
  EXPECT_EQ(records.size(), 1u) << "incomplete elements add nothing";
}

}  // namespace
}  // namespace quorlet
