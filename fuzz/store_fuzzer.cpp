// A counter store with any damage: nothing crashes or hangs, a reader changes nothing, and once
// damage has been noticed the new store keeps what it is given.
#include <unistd.h>

#include <limits>

#include "fakes/fake_platform.h"
#include "fuzz_support.h"
#include "platform/linux/counters/counter_store.h"

namespace quorlet {
namespace {

constexpr std::int32_t kDay = 20000;
constexpr std::size_t kMaxEdits = 64;

using Files = std::map<std::string, std::string>;  // by name

// Every process starts anew on the same directory.
struct Process {
  explicit Process(const TempRoot& device, Access access)
      : store(MakeLinuxCounterStore(device.root(), access, platform.clock, platform.queries,
                                    platform.preferences, platform.log)) {
    platform.clock.goToDay(kDay);
  }
  // So many equal values.
  bool record(std::int32_t day, std::uint32_t count, double value) {
    StoreChanges changes;
    changes.values.push_back({"d", day, std::vector<double>(count, value), {{60, count}}});
    for (const char* key : {"a.b", "a.c", "z"}) {
      changes.scalars.push_back({ScalarChange::Kind::kAdd, key, day, day});
    }
    return store->write(changes);
  }
  std::int64_t corruptions() {
    return platform.preferences.DGWPreferencesGetIntegerValue("DatabaseCorruptionCount",
                                                              "nuvex.aggregated");
  }

  FakePlatform platform;
  std::unique_ptr<CounterStore> store;
};

std::string StoreDirectory() {
  return FakePlatform().queries.dataHomePath().value() + "/Library/TallyLedger";
}

// The files of the store, without the lock files and what is in memory only.
Files ReadFiles(const TempRoot& device, const std::string& directory) {
  Files files;
  for (const std::string& name : device.list(directory)) {
    if (name.starts_with('.') || name.ends_with("-shm")) continue;
    files[name] = device.read(directory + "/" + name);
  }
  return files;
}

void Replace(const TempRoot& device, const std::string& directory, const Files& files) {
  for (const std::string& name : device.list(directory)) {
    ::unlink(device.path(directory + "/" + name).c_str());
  }
  for (const auto& [name, bytes] : files) device.write(directory + "/" + name, bytes);
}

// A sound store as a process that was killed leaves it.
Files MakeSound(const TempRoot& device, const std::string& directory) {
  Process process(device, Access::kReadWrite);
  for (const std::int32_t day : {kDay - 40, kDay - 1, kDay}) {
    Expect(process.record(day, day == kDay ? 500 : 20, 1.5), "the store cannot be made");
  }
  Files files = ReadFiles(device, directory);
  std::erase_if(files, [](const auto& file) { return file.second.empty(); });
  return files;
}

// Each edit has four bytes: what, where (two), and a byte.
Files Damaged(Files files, std::span<const std::uint8_t> edits) {
  const std::size_t count = std::min(edits.size() / 4, kMaxEdits);
  for (std::size_t i = 0; i < count; ++i) {
    const auto edit = edits.subspan(i * 4, 4);
    std::string& bytes =
        std::next(files.begin(), edit[0] / 8 % static_cast<int>(files.size()))->second;
    const std::size_t at = edit[1] * std::size_t{256} + edit[2];
    if (edit[0] % 8 == 0) bytes.resize(std::min(bytes.size(), at));
    if (edit[0] % 8 == 1) bytes.append(at, static_cast<char>(edit[3]));
    if (bytes.empty()) continue;
    char& byte = bytes[at % bytes.size()];
    byte = static_cast<char>(edit[0] % 8 < 5 ? byte ^ edit[3] : edit[3]);
  }
  return files;
}

// How many rows and values there are; at most as many as the store can have.
std::size_t ReadAll(CounterStore& store, std::int32_t minDay, std::int32_t maxDay) {
  constexpr std::size_t kMost = 1 << 20;
  std::size_t count = 0;
  const auto history = store.initWithDefaultPath();
  if (!history) return 0;
  const auto expectDay = [&](std::int32_t day) {
    Expect(day > minDay && day <= maxDay, "a row of another day");
    Expect(++count < kMost, "the enumeration does not end");
  };
  history->scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      "", minDay, maxDay,
      [&](std::string_view, std::int32_t day, std::int64_t, bool&) { expectDay(day); });
  history->distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      "", minDay, maxDay,
      [&](std::string_view, std::int32_t day, TLHistoryDistributionEnumerator& values, bool&) {
        double value = 0;
        std::int32_t second = 0;
        while (values.getNextValueSecondsInDayOffset(value, second)) expectDay(day);
      });
  return count;
}

std::optional<std::int64_t> Scalar(CounterStore& store, std::string_view wanted) {
  std::optional<std::int64_t> found;
  if (const auto history = store.initWithDefaultPath()) {
    history->scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
        wanted, kDay - 1, kDay,
        [&](std::string_view key, std::int32_t, std::int64_t value, bool& stop) {
          if (key == wanted) found = value;
          stop = found.has_value();
        });
  }
  return found;
}

void ReadOnly(const TempRoot& device, const std::string& directory) {
  const Files before = ReadFiles(device, directory);
  Process process(device, Access::kReadOnly);
  const std::size_t count = ReadAll(*process.store, std::numeric_limits<std::int32_t>::min(),
                                    std::numeric_limits<std::int32_t>::max());
  const std::size_t again = ReadAll(*process.store, std::numeric_limits<std::int32_t>::min(),
                                    std::numeric_limits<std::int32_t>::max());
  Expect(count == again, "two readings differ");
  Expect(process.corruptions() == 0, "a reader counts damage");
  Expect(process.platform.log.lines.size() <= 8, "a reader says too much");
  Expect(ReadFiles(device, directory) == before, "a reader changes the store");
}

void ReadAndWrite(const TempRoot& device, const std::string& directory) {
  Process process(device, Access::kReadWrite);
  ReadAll(*process.store, kDay - 2, kDay);
  const bool written = process.record(kDay, 100, 2.5);
  Expect(written || !process.platform.log.errors().empty(), "a failure is not told");
  process.store->TLClientCheckpoint();
  ReadAll(*process.store, std::numeric_limits<std::int32_t>::min(), kDay);

  bool isAside = false;
  for (const std::string& name : device.list(directory)) {
    isAside |= name.find(".damaged") != std::string::npos;
  }
  Expect(isAside == (process.corruptions() != 0), "damage is not counted");
  Expect(process.corruptions() <= 8, "damage is counted again and again");
  Expect(process.platform.log.errors().size() <= 16, "the same is told too often");
  if (!isAside) return;
  Process next(device, Access::kReadWrite);
  next.store->TLClientSetValueForScalarKey("new", 7);
  Expect(next.platform.log.errors().empty(), "the new store does not work",
         next.platform.log.errors().empty() ? "" : next.platform.log.errors().front());
  Process last(device, Access::kReadOnly);
  Expect(Scalar(*last.store, "new") == 7, "the new store loses a counter");
}

}  // namespace
}  // namespace quorlet

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  static const TempRoot device;
  static const std::string directory = StoreDirectory();
  static const Files sound = MakeSound(device, directory);
  Replace(device, directory, Damaged(sound, {data, size}));
  ReadOnly(device, directory);
  ReadAndWrite(device, directory);
  return 0;
}
