#include "storage/vm_freezer.h"

#include <gtest/gtest.h>

#include "fakes/fake_platform.h"

namespace quorlet {
namespace {

std::string Item(std::uint32_t type, std::uint64_t flags, const std::string& payload) {
  const std::uint32_t header[] = {type, static_cast<std::uint32_t>(payload.size()),
                                  static_cast<std::uint32_t>(flags), 0};
  return std::string(reinterpret_cast<const char*>(header), sizeof header) + payload;
}
std::string Begin(std::uint32_t id) { return Item(0x13, id, "TASK"); }
std::string End(std::uint32_t id) { return Item(0x14, id, ""); }
std::string Name(const std::string& name) { return Item(0x909, 0, name); }
std::string Written(char count) {
  return Item(0x901, 0, std::string(24, '\x77') + count + std::string(15, '\0'));
}

// What is found in the snapshot: the number of bytes written, or -1 for the error keys.
std::int64_t Found(const std::optional<std::string>& bytes) {
  FakePlatform platform;
  if (bytes) {
    const auto snapshot = std::as_bytes(std::span(*bytes));
    platform.taskSnapshot.buffer = Data(snapshot.begin(), snapshot.end());
  }
  const Dictionary info = CopyVMFreezerNANDInfo(platform.taskSnapshot, platform.standardError);
  const std::string prefix = "nuvex.NANDInfo.VMFreezer.";
  const Dictionary error{
      {prefix + "Error", "1"},
      {prefix + "ErrorMessage", "Unable parse snapshot for VMFreezer NAND writes."}};
  return info == error ? -1 : IntegerEntry(info, prefix + "NumPhysicalWrites").value();
}

TEST(VMFreezer, FindsTheThreadsContainer) {
  const std::string name = Name("VM_swapout");
  std::string deep;
  for (int i = 0; i < 200'000; ++i) deep += Begin(1);
  // clang-format off
  const std::pair<std::int64_t, std::optional<std::string>> cases[] = {
      {-1, std::nullopt}, {-1, ""},
      {7, Begin(1) + name + Written(7) + End(1)},
      {7, Begin(1) + Written(7) + Name("VM_swapout" + std::string(54, '\0') + "x") + End(1)},
      {-1, name + Written(7)},
      {-1, Begin(1) + Written(7) + End(1)},
      {7, Begin(1) + Name("") + Written(7) + End(1)},
      {-1, Begin(1) + Name("VM_swapout_extra") + Written(7) + End(1)},
      {-1, Begin(1) + Name(std::string("VM_swap\0out", 11)) + End(1)},
      {0, Begin(1) + name + End(1) + Written(7)},
      {0, Begin(1) + name + Item(0x901, 0, std::string(31, '7')) + End(1)},
      {8, Begin(1) + Written(7) + Begin(2) + End(2) + Begin(3) + name + Written(8) + End(3)},
      {0, Begin(1) + Written(7) + Begin(2) + name + End(2) + End(1)},
      {9, Begin(1) + Begin(2) + Written(8) + End(2) + name + End(77) + Written(9) + End(1)},
      {5, Begin(1) + Name("a") + End(1) + Begin(2) + name + Written(5) + End(2)},
      {-1, Item(0x13, 1, "abc") + name + End(1)},
      {-1, Item(0x23, 1, "abcdefgh") + name + End(1)},
      {7, Begin(1) + name + Written(7) + Begin(2) + Item(0xF19158ED, 0, "") + Written(8) + End(1)},
      {7, deep + name + Written(7)},
  };
  // clang-format on
  for (const auto& row : cases) EXPECT_EQ(Found(row.second), row.first) << &row - cases;
  const std::string whole = Begin(1) + name + Written(7) + End(1);
  for (std::size_t length = 0; length < whole.size(); ++length) {
    EXPECT_EQ(Found(whole.substr(0, length)), length < 46 ? -1 : length < 102 ? 0 : 7) << length;
  }
}

}  // namespace
}  // namespace quorlet
