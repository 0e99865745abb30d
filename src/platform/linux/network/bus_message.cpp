#include "platform/linux/network/bus_message.h"

namespace quorlet {
namespace {

constexpr char kLittleEndian = 'l';
constexpr char kVersion = 1;
enum MessageType : std::uint8_t { kMethodCall = 1, kMethodReturn = 2, kError = 3 };
enum Field : std::uint8_t {
  kPath = 1,
  kInterface = 2,
  kMember = 3,
  kErrorName = 4,
  kReplySerial = 5,
  kDestination = 6,
  kSignature = 8,
};

class Writer {
 public:
  std::string bytes;

  void align(std::size_t size) { bytes.resize((bytes.size() + size - 1) / size * size); }
  void byte(std::uint8_t value) { bytes += static_cast<char>(value); }
  void number(std::size_t value) {
    align(4);
    for (int shift = 0; shift < 32; shift += 8) byte(static_cast<std::uint8_t>(value >> shift));
  }
  void text(std::string_view value) {
    number(value.size());
    bytes += value;
    bytes += '\0';
  }
  void signature(std::string_view value) {
    byte(static_cast<std::uint8_t>(value.size()));
    bytes += value;
    bytes += '\0';
  }
  void field(Field code, std::string_view type, std::string_view value) {
    align(8);
    byte(code);
    signature(type);
    if (type == "g") {
      signature(value);
    } else {
      text(value);
    }
  }
};

}  // namespace

std::string EncodeBusCall(std::uint32_t serial, const BusCall& call) {
  Writer body;
  for (const std::string_view argument : call.arguments) body.text(argument);
  Writer fields;
  fields.field(kPath, "o", call.path);
  fields.field(kInterface, "s", call.interface);
  fields.field(kMember, "s", call.member);
  fields.field(kDestination, "s", call.destination);
  if (!call.arguments.empty()) {
    fields.field(kSignature, "g", std::string(call.arguments.size(), 's'));
  }
  Writer message;
  message.byte(kLittleEndian);
  message.byte(kMethodCall);
  message.byte(0);
  message.byte(kVersion);
  message.number(body.bytes.size());
  message.number(serial);
  message.number(fields.bytes.size());
  message.bytes += fields.bytes;
  message.align(8);
  return message.bytes + body.bytes;
}

std::optional<std::size_t> BusMessageLength(std::string_view header, std::size_t limit) {
  BusReader reader(header);
  const bool isLittle = reader.number<std::uint8_t>() == kLittleEndian;
  reader.number<std::uint8_t>();
  reader.number<std::uint8_t>();
  const bool isKnown = reader.number<std::uint8_t>() == kVersion;
  const std::uint64_t body = reader.number<std::uint32_t>();
  reader.number<std::uint32_t>();
  const std::uint64_t fields = reader.number<std::uint32_t>();
  const std::uint64_t length = kBusHeaderBytes + (fields + 7) / 8 * 8 + body;
  if (!reader.ok() || !isLittle || !isKnown || length > limit) return std::nullopt;
  return static_cast<std::size_t>(length);
}

std::string_view BusReader::terminated(std::size_t length) {
  const auto bytes = reader_.take(length);
  reader_.skip(1);
  return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

std::optional<BusMessage> ParseBusMessage(std::string_view bytes) {
  if (BusMessageLength(bytes, bytes.size()) != bytes.size()) return std::nullopt;
  BusReader reader(bytes);
  reader.number<std::uint8_t>();
  const auto type = reader.number<std::uint8_t>();
  reader.align(4);
  const std::size_t bodyBytes = reader.number<std::uint32_t>();
  reader.number<std::uint32_t>();
  const std::size_t fieldsEnd = reader.number<std::uint32_t>() + kBusHeaderBytes;
  BusMessage message;
  while (reader.ok() && reader.position() < fieldsEnd) {
    reader.align(8);
    const auto code = reader.number<std::uint8_t>();
    const std::string_view fieldType = reader.signature();
    if (fieldType == "u") {
      const auto value = reader.number<std::uint32_t>();
      if (code == kReplySerial) message.replySerial = value;
    } else if (fieldType == "g") {
      const auto value = reader.signature();
      if (code == kSignature) message.signature = value;
    } else if (fieldType == "s" || fieldType == "o") {
      const auto value = reader.text();
      if (code == kErrorName) message.error = value;
    } else {
      return std::nullopt;  // the protocol has no field of another type
    }
  }
  if (!reader.ok() || reader.position() != fieldsEnd) return std::nullopt;
  if (type == kMethodReturn) {
    message.body = bytes.substr(bytes.size() - bodyBytes);
  } else {
    message.signature = {};
    if (type != kError) message.replySerial = 0;
  }
  return message;
}

}  // namespace quorlet
