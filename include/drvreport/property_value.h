// The value tree of every structured datum: preferences, messages, the whitelist, logs, channels.
//
// A PropertyValue is a boolean, a number, a string, data, a date, an array or a dictionary.
// Dictionary and Array are handles: copying one shares the elements with the original, and a
// change through any copy is seen by all; shallowCopy and deepCopy make independent ones. Do not
// put a container into itself. Strings hold any bytes; they are UTF-8 wherever they come from a
// document. Nothing here is safe to change from two threads at once.
#ifndef DRVREPORT_PROPERTY_VALUE_H_
#define DRVREPORT_PROPERTY_VALUE_H_

#if __cplusplus < 202002L
#error "drvreport needs C++20: compile with -std=c++20"
#endif

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace quorlet {

class PropertyValue;

using Data = std::vector<std::byte>;

// An instant, in seconds since 1970-01-01T00:00:00Z; fractions are kept.
struct Date {
  double secondsSince1970 = 0;
  bool operator==(const Date&) const = default;
};

// kUInt64 holds only what a signed 64-bit number cannot, unless it is asked for explicitly.
enum class NumberKind : std::uint8_t { kInt8, kInt16, kInt32, kInt64, kUInt64, kSingle, kDouble };

// A number that remembers its kind. Conversions never trap: they truncate toward zero, saturate at
// the ends of the target, and give 0 for NaN.
class Number {
 public:
  // `value` must fit `kind`, an integer kind other than kUInt64.
  static Number Signed(NumberKind kind, std::int64_t value) { return {kind, value}; }
  static Number Unsigned(std::uint64_t value) { return {NumberKind::kUInt64, value}; }
  static Number Real(NumberKind kind, double value) { return {kind, value}; }

  NumberKind kind() const { return kind_; }
  bool isReal() const { return std::holds_alternative<double>(value_); }
  std::int64_t toInt64() const;
  std::uint64_t toUInt64() const;
  double toDouble() const;

  // By numeric value, whatever the kinds: Int32(5) equals Double(5.0). NaN equals nothing.
  bool operator==(const Number& other) const;

 private:
  using Stored = std::variant<std::int64_t, std::uint64_t, double>;
  Number(NumberKind kind, Stored value) : kind_(kind), value_(value) {}
  NumberKind kind_;
  Stored value_;
};

// A handle on a shared, growable sequence of values.
class Array {
 public:
  using Elements = std::vector<PropertyValue>;

  Array();
  // An array around a single array is Array{PropertyValue(inner)}: compilers read Array{inner}
  // either as that or as a copy of `inner`.
  Array(std::initializer_list<PropertyValue> elements);

  std::size_t size() const;
  bool empty() const { return size() == 0; }
  // `index` must be below size().
  PropertyValue& operator[](std::size_t index);
  const PropertyValue& operator[](std::size_t index) const;
  void push_back(PropertyValue value);
  // Makes room for `count` elements in all.
  void reserve(std::size_t count);
  // Drops the elements from the one at `count` on; there must be so many.
  void truncate(std::size_t count);
  Elements::const_iterator begin() const;
  Elements::const_iterator end() const;

  Array shallowCopy() const;
  Array deepCopy() const;
  // Whether both handles share one sequence.
  bool sharesWith(const Array& other) const;
  bool operator==(const Array& other) const;

 private:
  std::shared_ptr<Elements> elements_;
};

// A handle on a shared dictionary with string keys, enumerated in byte order of the keys.
class Dictionary {
 public:
  using Entries = std::map<std::string, PropertyValue, std::less<>>;

  Dictionary();
  Dictionary(std::initializer_list<std::pair<std::string_view, PropertyValue>> entries);

  std::size_t size() const;
  bool empty() const { return size() == 0; }
  // The value under `key`, or nullptr; valid until the entry is removed.
  const PropertyValue* find(std::string_view key) const;
  PropertyValue* find(std::string_view key);
  bool contains(std::string_view key) const { return find(key) != nullptr; }
  // The value under `key`; a new entry starts as the boolean false.
  PropertyValue& operator[](std::string_view key);
  void remove(std::string_view key);
  Entries::const_iterator begin() const;
  Entries::const_iterator end() const;

  Dictionary shallowCopy() const;
  Dictionary deepCopy() const;
  // Whether both handles share one dictionary.
  bool sharesWith(const Dictionary& other) const;
  // What identifies the shared dictionary while a handle on it lives.
  const void* identity() const;
  bool operator==(const Dictionary& other) const;

 private:
  std::shared_ptr<Entries> entries_;
};

class PropertyValue {
 public:
  PropertyValue() : value_(false) {}
  // Constrained, so that neither a pointer nor an integer turns into a boolean by accident;
  // numbers are made by Int8 to Double below.
  PropertyValue(std::same_as<bool> auto value) : value_(value) {}
  PropertyValue(Number value) : value_(value) {}
  PropertyValue(std::string value) : value_(std::move(value)) {}
  PropertyValue(std::string_view value) : value_(std::string(value)) {}
  PropertyValue(const char* value) : value_(std::string(value)) {}
  PropertyValue(Data value) : value_(std::move(value)) {}
  PropertyValue(Date value) : value_(value) {}
  PropertyValue(Array value) : value_(std::move(value)) {}
  PropertyValue(Dictionary value) : value_(std::move(value)) {}

  // The value when it is of that type, otherwise nullptr; owned by this value.
  const bool* asBoolean() const { return std::get_if<bool>(&value_); }
  const Number* asNumber() const { return std::get_if<Number>(&value_); }
  const std::string* asString() const { return std::get_if<std::string>(&value_); }
  const Data* asData() const { return std::get_if<Data>(&value_); }
  const Date* asDate() const { return std::get_if<Date>(&value_); }
  const Array* asArray() const { return std::get_if<Array>(&value_); }
  const Dictionary* asDictionary() const { return std::get_if<Dictionary>(&value_); }
  Array* asArray() { return std::get_if<Array>(&value_); }
  Dictionary* asDictionary() { return std::get_if<Dictionary>(&value_); }

  // A container's elements are shared by a shallow copy of it; everything else is copied.
  PropertyValue shallowCopy() const;
  // Nothing is shared.
  PropertyValue deepCopy() const;

  // Same type and equal content, all the way down; numbers compare by value.
  bool operator==(const PropertyValue& other) const { return value_ == other.value_; }

  // The text that "%@" prints for the value: a string as it is, an integer in decimal, a real as
  // %.16g (single: %.7g), a boolean as 1 or 0, a date as "2026-03-04 05:06:07 +0000", data as
  // "{length = 3, bytes = 0x010203}" (at most 24 bytes are shown), an array as "(\n    a,\n b\n)"
  // and a dictionary as "{\n    key = value;\n}"; strings inside containers are quoted unless they
  // are plain words.
  std::string description() const;

 private:
  std::variant<bool, Number, std::string, Data, Date, Array, Dictionary> value_;
};

inline PropertyValue Int8(std::int8_t v) { return Number::Signed(NumberKind::kInt8, v); }
inline PropertyValue Int16(std::int16_t v) { return Number::Signed(NumberKind::kInt16, v); }
inline PropertyValue Int32(std::int32_t v) { return Number::Signed(NumberKind::kInt32, v); }
inline PropertyValue Int64(std::int64_t v) { return Number::Signed(NumberKind::kInt64, v); }
inline PropertyValue UInt64(std::uint64_t v) { return Number::Unsigned(v); }
inline PropertyValue Single(float v) {
  return Number::Real(NumberKind::kSingle, static_cast<double>(v));
}
inline PropertyValue Double(double v) { return Number::Real(NumberKind::kDouble, v); }

// Shorthands for the usual question "the entry under `key`, if it is of this type"; nullptr or
// nullopt otherwise. An integer is taken from a number of any kind, by Number::toInt64.
const std::string* StringEntry(const Dictionary& dictionary, std::string_view key);
const Array* ArrayEntry(const Dictionary& dictionary, std::string_view key);
const Dictionary* DictionaryEntry(const Dictionary& dictionary, std::string_view key);
const Data* DataEntry(const Dictionary& dictionary, std::string_view key);
std::optional<std::int64_t> IntegerEntry(const Dictionary& dictionary, std::string_view key);

}  // namespace quorlet

#endif  // DRVREPORT_PROPERTY_VALUE_H_
