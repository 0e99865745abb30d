// Any file that describes a driver: one entry or one error line, and answers that stay within what
// the caller has room for.
#include <algorithm>
#include <array>

#include "fakes/fake_platform.h"
#include "fuzz_support.h"
#include "platform/linux/registry/driver_files.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

// Calls a method with room for every amount around the usual ones.
void Call(EntryDriver& driver, std::uint32_t method, std::span<const std::byte> request) {
  std::array<std::byte, 80> room;
  std::array<std::uint64_t, 4> scalars;
  for (const std::size_t size : {0u, 1u, 3u, 4u, 5u, 64u}) {
    room.fill(std::byte{0xA5});
    DriverCall call;
    call.structInput = request;
    call.structOutput = std::span(room).first(size);
    call.scalarOutput = std::span(scalars).first(size % 5);
    static_cast<void>(driver.call(method, call));
    Expect(call.bytesWritten <= size && call.scalarsWritten <= size % 5, "more than fits");
    Expect(std::ranges::all_of(std::span(room).subspan(size),
                               [](std::byte byte) { return byte == std::byte{0xA5}; }),
           "bytes beyond the room");
  }
}

void UseDriver(EntryDriver& driver) {
  static_cast<void>(driver.open(0));
  for (const std::uint32_t method : {0u, 2u, 9u, 10u}) {
    for (std::size_t selector = 0; selector < 16; ++selector) {
      for (const unsigned flags : {0u, 1u, 4u, 5u}) {
        std::array<std::byte, 24> request{};
        request[0] = static_cast<std::byte>(selector);
        request[4] = static_cast<std::byte>(flags);
        Call(driver, method, request);
      }
    }
    Call(driver, method, {});
  }
  static_cast<void>(driver.close());
}

// The runs of the channels that the file itself names.
void UseChannels(EntrySource& source, std::uint64_t driver, std::string_view document) {
  const auto parsed = ReadPropertyList(document);
  const Array* channels = ArrayEntry(*std::get<PropertyValue>(parsed).asDictionary(), "Channels");
  if (channels == nullptr) return;
  for (const PropertyValue& channel : *channels) {
    const Dictionary* entries = channel.asDictionary();
    const auto id = entries != nullptr ? IntegerEntry(*entries, "ChannelID") : std::nullopt;
    if (!id) continue;
    const auto run = source.elements(driver, static_cast<std::uint64_t>(*id));
    Expect(run.size() % 64 == 0 && run.size() <= document.size(), "a run of half a record");
  }
}

}  // namespace
}  // namespace quorlet

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  static FuzzFiles files;
  const std::string_view text = AsText(data, size);
  files.set("/var/db/drivers/a.plist", text);
  files.set("/var/db/drivers/b.plist", text);
  FakePlatform platform;
  const auto source = MakeDriverFiles(files.device().root(), platform.log);
  const auto entries = source->entries();
  // Of two files with one ID the first counts; what is no description has a line for each file.
  Expect(entries.size() <= 1, "two entries with one ID");
  Expect(platform.log.errors().size() == 2 - entries.size(), "not one line for each bad file");
  Expect(source->entries().size() == entries.size(), "other entries the second time");
  Expect(platform.log.errors().size() == 2 - entries.size(), "the same line again");
  if (entries.empty()) return 0;
  Expect(entries.front().driver != nullptr, "an entry without driver");
  UseDriver(*entries.front().driver);
  source->refreshElements();
  UseChannels(*source, entries.front().id, text);
  return 0;
}
