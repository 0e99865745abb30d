// Any messages of a peer: app info becomes records of one shape, only the first other message
// counts, and nothing is logged or posted without a message that asks for it.
#include <algorithm>

#include "driver/listener.h"
#include "fakes/fake_platform.h"
#include "fuzz_support.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

void CheckRecords(const Array& elements) {
  Array records;
  for (const PropertyValue& element : elements) {
    const std::size_t before = records.size();
    Expect(appInfoRecordFromMessage(element, records), "an element ends the list");
    Expect(records.size() - before <= 1, "two records of one element");
  }
  for (const PropertyValue& value : records) {
    const Dictionary& record = *value.asDictionary();
    const std::string* uuid = StringEntry(record, "uuid");
    Expect(record.size() == 5 && uuid != nullptr && uuid->size() == 36,
           "a record of another shape");
    Expect(std::ranges::count(*uuid, '-') == 4, "a uuid of another shape", *uuid);
    Expect(IntegerEntry(record, "arch").has_value() && IntegerEntry(record, "teskID").has_value(),
           "a record without its integers");
  }
}

void Send(const Array& messages) {
  constexpr std::size_t kMostMessages = 8;
  FakePlatform platform;
  RunDriver driver(platform.services);
  Listener listener(platform.services, driver);
  std::size_t count = 0;
  for (const PropertyValue& message : messages) {
    if (++count > kMostMessages) break;
    listener.handlePeerMessage(message);
    if (const Dictionary* fields = message.asDictionary()) {
      if (const Array* elements = ArrayEntry(*fields, "app_data")) CheckRecords(*elements);
    }
  }
  Expect(!platform.passLock.held, "the pass lock is still held");
  Expect(std::ranges::count(platform.notifications.posted, "nuvex.aggregated.quorlet.logging") <= 1,
         "the logging status is announced twice");
  Expect(!listener.appInfoRequested() || !platform.notifications.posted.empty(),
         "app info is wanted without an announcement");
}

}  // namespace
}  // namespace quorlet

// One message, or an array of messages.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  const auto document = ReadPropertyList(AsText(data, size));
  const auto* value = std::get_if<PropertyValue>(&document);
  if (value == nullptr) return 0;
  Send(value->asArray() != nullptr ? *value->asArray() : Array{*value});
  return 0;
}
