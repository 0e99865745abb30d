// Binary documents to value trees, and value trees to XML documents, with libplist.
#include "values/property_list.h"

#include <plist/plist.h>

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <limits>
#include <map>
#include <memory>
#include <optional>
#include <utility>
#include <vector>

#include "values/byte_reader.h"
#include "values/property_list_check.h"
#include "values/property_list_scalars.h"
#include "values/property_list_xml.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr std::string_view kBinaryMagic = "bplist00";
constexpr std::string_view kReplacement = "\xEF\xBF\xBD";  // U+FFFD
// Property-list dates count from 2001-01-01T00:00:00Z.
constexpr double kEpoch2001 = 978307200;
constexpr double kFirstWrittenSecond = -62135596800;     // 0001-01-01T00:00:00Z
constexpr double kFirstYearOfFourDigits = -30610224000;  // 1000-01-01T00:00:00Z
constexpr double kLastWrittenSecond = 253402300799;      // 9999-12-31T23:59:59Z

struct NodeFree {
  void operator()(void* node) const { plist_free(node); }
};
using Node = std::unique_ptr<void, NodeFree>;

struct MemoryFree {
  void operator()(void* memory) const { std::free(memory); }
};
template <typename T>
using Allocated = std::unique_ptr<T, MemoryFree>;

// A node of a kind that libplist makes only by parsing.
Node ParseScalar(std::string_view element, const std::string& text) {
  const std::string document = FormatText("<plist><%s>%s</%s></plist>", element, text, element);
  plist_t node = nullptr;
  plist_from_xml(document.data(), static_cast<std::uint32_t>(document.size()), &node);
  return Node(node);
}

// --- Reading: the depth was checked before the nodes were made ----------------------------------

PropertyValue IntegerFromNode(plist_t node) {
  std::uint64_t bits = 0;
  plist_get_uint_val(node, &bits);
  if (std::in_range<std::int64_t>(bits)) return Int64(static_cast<std::int64_t>(bits));
  // -1 and 2^64 - 1 look the same so far; only the signed one equals a node made from the bits.
  const Node signedNode(plist_new_uint(bits));
  if (plist_compare_node_value(node, signedNode.get()) != 0) {
    return Int64(static_cast<std::int64_t>(bits));
  }
  return UInt64(bits);
}

// libplist hands dates out in 32 bits of seconds; the binary form of one that does not fit keeps
// all of it.
PropertyValue DateFromNode(plist_t node) {
  std::int32_t seconds = 0;
  std::int32_t microseconds = 0;
  plist_get_date_val(node, &seconds, &microseconds);
  const Node whole(plist_new_date(seconds, 0));
  if (plist_compare_node_value(node, whole.get()) != 0) return Date{seconds + kEpoch2001};
  char* memory = nullptr;
  std::uint32_t size = 0;
  plist_to_bin(node, &memory, &size);
  const Allocated<char> binary(memory);
  ByteReader reader(std::as_bytes(std::span(memory, memory == nullptr ? 0 : size)));
  reader.skip(kBinaryMagic.size() + 1);
  return Date{std::bit_cast<double>(reader.big(8)) + kEpoch2001};
}

bool BooleanFromNode(plist_t node) {
  std::uint8_t boolean = 0;
  plist_get_bool_val(node, &boolean);
  return boolean != 0;
}

PropertyValue DataFromNode(plist_t node) {
  std::uint64_t size = 0;
  const char* bytes = plist_get_data_ptr(node, &size);
  const auto content = std::as_bytes(std::span(bytes, bytes == nullptr ? 0 : size));
  return Data(content.begin(), content.end());
}

std::string TextOf(plist_t node) {
  std::uint64_t size = 0;
  const char* text = plist_get_string_ptr(node, &size);
  return RepairUtf8({text, text == nullptr ? 0 : static_cast<std::size_t>(size)});
}

// nullopt for a node that is not what the check let pass.
std::optional<PropertyValue> ValueOf(plist_t node);

std::optional<PropertyValue> ArrayOf(plist_t node) {
  Array array;
  array.reserve(plist_array_get_size(node));
  plist_array_iter position = nullptr;
  plist_array_new_iter(node, &position);
  const Allocated<void> owner(position);
  while (true) {
    plist_t item = nullptr;
    plist_array_next_item(node, position, &item);
    if (item == nullptr) return array;
    auto element = ValueOf(item);
    if (!element) return std::nullopt;
    array.push_back(*std::move(element));
  }
}

std::optional<PropertyValue> DictionaryOf(plist_t node) {
  plist_dict_iter position = nullptr;
  plist_dict_new_iter(node, &position);
  const Allocated<void> owner(position);
  Dictionary dictionary;
  while (true) {
    char* key = nullptr;
    plist_t item = nullptr;
    plist_dict_next_item(node, position, &key, &item);
    const Allocated<char> keyOwner(key);
    if (item == nullptr) return dictionary;
    auto element = ValueOf(item);
    if (!element || key == nullptr) return std::nullopt;
    dictionary[RepairUtf8(key)] = *std::move(element);
  }
}

std::optional<PropertyValue> ValueOf(plist_t node) {
  switch (plist_get_node_type(node)) {
    case PLIST_BOOLEAN:
      return BooleanFromNode(node);
    case PLIST_UINT:
      return IntegerFromNode(node);
    case PLIST_REAL: {
      double real = 0;
      plist_get_real_val(node, &real);
      return Double(real);
    }
    case PLIST_STRING:
      return TextOf(node);
    case PLIST_DATA:
      return DataFromNode(node);
    case PLIST_DATE:
      return DateFromNode(node);
    case PLIST_ARRAY:
      return ArrayOf(node);
    case PLIST_DICT:
      return DictionaryOf(node);
    case PLIST_KEY:
    case PLIST_UID:
    case PLIST_NONE:
      break;
  }
  return std::nullopt;
}

// --- Writing ------------------------------------------------------------------------------------

class TreeWriter {
 public:
  // Null when the tree is beyond the limits; error() says which.
  Node toNode(const PropertyValue& value, std::size_t above) {
    if (++values_ > kMaxPropertyListValues) return refuse(TooManyValues());
    if (const bool* boolean = value.asBoolean()) return Node(plist_new_bool(*boolean ? 1 : 0));
    if (const Number* number = value.asNumber()) return numberNode(*number);
    if (const Date* date = value.asDate()) return dateNode(*date);
    if (const std::string* text = value.asString()) {
      return takeContent(text->size()) ? Node(plist_new_string(AsWritten(*text).c_str())) : nullptr;
    }
    if (const Data* data = value.asData()) {
      return takeContent(data->size())
                 ? Node(plist_new_data(reinterpret_cast<const char*>(data->data()), data->size()))
                 : nullptr;
    }
    // A tree that holds itself ends here too.
    if (above == kMaxPropertyListDepth)
      return refuse(FormatText("the tree is %s", TooDeeplyNested()));
    if (const Array* array = value.asArray()) return arrayNode(*array, above);
    return dictionaryNode(*value.asDictionary(), above);
  }

  const std::string& error() const { return error_; }
  // Whether libplist writes a year with fewer than four digits.
  bool hasShortYears() const { return hasShortYears_; }

 private:
  Node refuse(std::string error) {
    error_ = std::move(error);
    return nullptr;
  }

  bool takeContent(std::size_t size) {
    if (size <= kMaxPropertyListContentBytes - content_) {
      content_ += size;
      return true;
    }
    error_ = TooMuchContent();
    return false;
  }

  static Node numberNode(const Number& number) {
    if (number.isReal()) return Node(plist_new_real(number.toDouble()));
    const std::uint64_t bits = number.toUInt64();
    // libplist takes the bits for those of a signed number.
    if (!std::in_range<std::int64_t>(bits)) return ParseScalar("integer", std::to_string(bits));
    return Node(plist_new_uint(static_cast<std::uint64_t>(number.toInt64())));
  }

  Node dateNode(Date date) {
    hasShortYears_ = hasShortYears_ || date.secondsSince1970 < kFirstYearOfFourDigits;
    const double second = AsWritten(date).secondsSince1970;
    const double since2001 = second - kEpoch2001;
    if (std::abs(since2001) > std::numeric_limits<std::int32_t>::max()) {
      return ParseScalar("date", Rfc3339({second}));
    }
    return Node(plist_new_date(static_cast<std::int32_t>(since2001), 0));
  }

  Node arrayNode(const Array& array, std::size_t above) {
    Node node(plist_new_array());
    for (const PropertyValue& element : array) {
      Node child = toNode(element, above + 1);
      if (child == nullptr) return nullptr;
      plist_array_append_item(node.get(), child.release());
    }
    return node;
  }

  Node dictionaryNode(const Dictionary& dictionary, std::size_t above) {
    // Of keys that repair makes the same, the last one's value stays. They come in order, so the
    // end is the place for all but repaired ones.
    std::map<std::string, const PropertyValue*> entries;
    for (const auto& [key, value] : dictionary) {
      if (!takeContent(key.size())) return nullptr;
      entries.insert_or_assign(entries.end(), AsWritten(key), &value);
    }
    Node node(plist_new_dict());
    for (const auto& [key, value] : entries) {
      Node child = toNode(*value, above + 1);
      if (child == nullptr) return nullptr;
      // libplist hashes a key so that anyone can make many collide, which takes quadratic time. An
      // entry goes in under a number that no repaired key can be, and is then given its name.
      const plist_t entry = child.release();
      plist_dict_set_item(node.get(), ("\x01" + std::to_string(values_)).c_str(), entry);
      plist_set_key_val(plist_dict_item_get_key(entry), key.c_str());
    }
    return node;
  }

  std::size_t values_ = 0;
  std::size_t content_ = 0;
  bool hasShortYears_ = false;
  std::string error_;
};

// The document with each year in four digits. "<date>" is an element wherever it stands.
std::string WithWholeYears(std::string_view document) {
  constexpr std::string_view kStart = "<date>";
  std::string out;
  for (std::size_t at; (at = document.find(kStart)) != std::string_view::npos;) {
    out += document.substr(0, at + kStart.size());
    document.remove_prefix(at + kStart.size());
    out.append(4 - std::min<std::size_t>(document.find('-'), 4), '0');
  }
  return out.append(document);
}

std::string TooLarge() {
  return FormatText("the document is larger than %llu bytes", kMaxPropertyListBytes);
}

}  // namespace

PropertyListResult ReadPropertyList(std::string_view bytes) {
  if (bytes.empty()) return PropertyListError{"the document is empty"};
  if (bytes.size() > kMaxPropertyListBytes) return PropertyListError{TooLarge()};
  if (!bytes.starts_with(kBinaryMagic)) return ReadXmlPropertyList(bytes);
  if (const auto wrong = CheckBinaryPropertyList(std::as_bytes(std::span(bytes)))) {
    return PropertyListError{*wrong};
  }
  plist_t parsed = nullptr;
  plist_from_bin(bytes.data(), static_cast<std::uint32_t>(bytes.size()), &parsed);
  const Node node(parsed);
  auto value = node == nullptr ? std::nullopt : ValueOf(node.get());
  if (!value) return PropertyListError{"the document cannot be parsed"};
  return *std::move(value);
}

PropertyListResult ReadPropertyList(std::span<const std::byte> bytes) {
  return ReadPropertyList(
      std::string_view(reinterpret_cast<const char*>(bytes.data()), bytes.size()));
}

std::string AsWritten(std::string_view text) {
  if (PrintableAsciiPrefix(text) == text.size()) return std::string(text);
  const std::string repaired = RepairUtf8(text);
  std::string_view rest = repaired;
  std::string out;
  while (true) {
    const std::size_t good = XmlTextPrefix(rest);
    out += rest.substr(0, good);
    rest.remove_prefix(good);
    if (rest.empty()) return out;
    out += kReplacement;
    // A control character, or U+FFFE or U+FFFF in three bytes.
    rest.remove_prefix(static_cast<unsigned char>(rest[0]) < 0x20 ? 1 : 3);
  }
}

Date AsWritten(Date date) {
  if (std::isnan(date.secondsSince1970)) return {0};
  return {std::clamp(std::floor(date.secondsSince1970), kFirstWrittenSecond, kLastWrittenSecond)};
}

std::variant<std::string, PropertyListError> WriteXmlPropertyList(const PropertyValue& root) {
  TreeWriter writer;
  const Node node = writer.toNode(root, 0);
  if (node == nullptr) {
    return PropertyListError{writer.error().empty() ? "out of memory" : writer.error()};
  }
  char* memory = nullptr;
  std::uint32_t size = 0;
  plist_to_xml(node.get(), &memory, &size);
  const Allocated<char> document(memory);
  if (memory == nullptr) return PropertyListError{"the document cannot be written"};
  if (size > kMaxPropertyListBytes) return PropertyListError{TooLarge()};
  const std::string_view text(memory, size);
  return writer.hasShortYears() ? WithWholeYears(text) : std::string(text);
}

}  // namespace quorlet
