// Messages of the D-Bus wire protocol, as far as asking a service for what it knows takes them.
//
// A message is: 'l' (little-endian), type, flags, version 1, u32 length of the body, u32 serial,
// u32 length of the header fields, the fields (u8 code, signature, value; each aligned to 8), zeros
// up to a multiple of 8, the body. A value is aligned to its size: a string or object path is a
// u32 length, the bytes and a NUL, a signature the same with a u8 length.
#ifndef QUORLET_PLATFORM_LINUX_NETWORK_BUS_MESSAGE_H_
#define QUORLET_PLATFORM_LINUX_NETWORK_BUS_MESSAGE_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "values/byte_reader.h"

namespace quorlet {

inline constexpr std::size_t kBusHeaderBytes = 16;  // up to the header fields

struct BusCall {
  std::string_view destination;
  std::string path;
  std::string_view interface;
  std::string_view member;
  std::vector<std::string_view> arguments;  // strings all of them
};

// The bytes of a method call; `serial` is not 0.
std::string EncodeBusCall(std::uint32_t serial, const BusCall& call);

// How many bytes the message has whose first kBusHeaderBytes are `header`; nullopt when that is no
// message, or one of more than `limit` bytes.
std::optional<std::size_t> BusMessageLength(std::string_view header, std::size_t limit);

// Reads values one after the other; a read beyond the end fails, see ByteReader. What it gives
// refers to the bytes.
class BusReader {
 public:
  explicit BusReader(std::string_view bytes) : reader_(std::as_bytes(std::span(bytes))) {}

  bool ok() const { return reader_.ok(); }
  std::size_t position() const { return reader_.position(); }

  void align(std::size_t size) { reader_.skip((size - reader_.position() % size) % size); }
  template <std::unsigned_integral T>
  T number() {
    align(sizeof(T));
    return reader_.little<T>();
  }
  // A string or object path.
  std::string_view text() { return terminated(number<std::uint32_t>()); }
  std::string_view signature() { return terminated(number<std::uint8_t>()); }

 private:
  std::string_view terminated(std::size_t length);

  ByteReader reader_;
};

// What a whole message says; a view into its bytes.
struct BusMessage {
  std::uint32_t replySerial = 0;  // of the call that it ends; 0 when it is no reply
  std::string_view error;         // of a call that failed, which has no signature and no body
  std::string_view signature;
  std::string_view body;
};

// nullopt when `bytes` are not one whole well-formed message.
std::optional<BusMessage> ParseBusMessage(std::string_view bytes);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_NETWORK_BUS_MESSAGE_H_
