// Any bytes are either refused or one message, whose parts lie inside it.
#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "platform/linux/network/bus_message.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace quorlet;
  const std::string_view text(reinterpret_cast<const char*>(bytes), size);
  const auto message = ParseBusMessage(text);
  if (!message) return 0;
  if (BusMessageLength(text.substr(0, kBusHeaderBytes), size) != size) std::abort();
  for (const std::string_view part : {message->signature, message->body}) {
    if (!part.empty() && (part.data() < text.data() || part.data() + part.size() > text.end())) {
      std::abort();
    }
  }
  BusReader reader(message->body);
  for (const char type : message->signature) {
    if (type == 's' || type == 'o') {
      (void)reader.text();
    } else if (type == 'g' || type == 'v') {
      (void)reader.signature();
    } else if (type == 't') {
      (void)reader.number<std::uint64_t>();
    } else {
      (void)reader.number<std::uint32_t>();
    }
    if (reader.position() > message->body.size()) std::abort();
  }
  return 0;
}
