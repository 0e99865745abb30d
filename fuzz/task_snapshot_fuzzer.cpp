// Any texts of processes become items that nest and end where they say, and that their reader
// takes.
#include "fakes/fake_platform.h"
#include "fuzz_support.h"
#include "platform/linux/device/services.h"
#include "storage/vm_freezer.h"
#include "values/byte_reader.h"

namespace quorlet {
namespace {

constexpr std::uint32_t kBegin = 0x13;
constexpr std::uint32_t kEnd = 0x14;
constexpr std::uint32_t kStatistics = 0x901;
constexpr std::uint32_t kName = 0x909;
constexpr std::uint32_t kBufferEnd = 0xF19158ED;

void CheckItems(const Data& items) {
  ByteReader reader(items);
  std::vector<std::uint64_t> open;
  while (reader.remaining() != 0) {
    const auto type = reader.little<std::uint32_t>();
    const auto payload = reader.little<std::uint32_t>();
    const auto flags = reader.little<std::uint64_t>();
    reader.skip(payload);
    Expect(reader.ok(), "an item goes beyond the end");
    if (type == kBegin) {
      open.push_back(flags);
      Expect(open.size() <= 2 && payload == 4, "not a process or one of its threads");
    } else if (type == kEnd) {
      Expect(!open.empty() && open.back() == flags, "another container ends");
      open.pop_back();
    } else if (type == kBufferEnd) {
      Expect(open.empty() && reader.remaining() == 0, "the buffer ends too early");
    } else {
      Expect(open.size() == 2, "an item of no thread");
      Expect(type == kName ? payload <= 65 : type == kStatistics && payload == 32,
             "an item of another size");
    }
  }
}

}  // namespace
}  // namespace quorlet

// comm and io of a thread, and of another one.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  static FuzzFiles files;
  const char* paths[] = {"/proc/7/task/7/comm", "/proc/7/task/7/io", "/proc/7/task/12/comm",
                         "/proc/7/task/12/io"};
  const auto parts = Parts(AsText(data, size), std::size(paths));
  for (std::size_t i = 0; i < parts.size(); ++i) files.set(paths[i], parts[i]);
  FakePlatform platform;
  const auto snapshot = MakeLinuxTaskSnapshot(files.device().root(), platform.log);
  const auto items = snapshot->CaptureTaskSnapshot(kTaskSnapshotTaggedItems);
  Expect(items.has_value(), "no snapshot");
  CheckItems(*items);
  Expect(snapshot->CaptureTaskSnapshot(kTaskSnapshotTaggedItems) == items, "another one at once");
  platform.taskSnapshot.buffer = items;
  Expect(!CopyVMFreezerNANDInfo(platform.taskSnapshot, platform.standardError).empty(),
         "nothing can be read");
  return 0;
}
