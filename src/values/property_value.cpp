// The value tree: numbers that compare exactly, shared containers, and the text that "%@" prints.
#include "drvreport/property_value.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <initializer_list>
#include <limits>

#include "values/digits.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr double kTwoTo63 = 9223372036854775808.0;
constexpr double kTwoTo64 = 18446744073709551616.0;

// Exact, where a conversion of the integer would round 2^53 + 1 to 2^53.
bool SameNumber(std::int64_t integer, double real) {
  return real >= -kTwoTo63 && real < kTwoTo63 && std::trunc(real) == real &&
         static_cast<std::int64_t>(real) == integer;
}
bool SameNumber(std::uint64_t integer, double real) {
  return real >= 0 && real < kTwoTo64 && std::trunc(real) == real &&
         static_cast<std::uint64_t>(real) == integer;
}
bool SameNumber(double real, std::integral auto integer) { return SameNumber(integer, real); }
bool SameNumber(double a, double b) { return a == b; }
bool SameNumber(std::integral auto a, std::integral auto b) { return std::cmp_equal(a, b); }

// Deeper containers are printed as "...": only a container that holds itself gets there.
constexpr std::size_t kMaxDescribedDepth = 256;
constexpr std::size_t kMaxDescribedBytes = 24;

void AppendIndent(std::string& out, std::size_t depth) { out.append(depth * 4, ' '); }

std::string Describe(const Number& number) {
  if (!number.isReal()) {
    return number.kind() == NumberKind::kUInt64 ? std::to_string(number.toUInt64())
                                                : std::to_string(number.toInt64());
  }
  const double value = number.toDouble();
  if (std::isnan(value)) return "nan";  // to_chars would print the sign of one
  char text[32];
  const auto [end, error] =
      std::to_chars(std::begin(text), std::end(text), value, std::chars_format::general,
                    number.kind() == NumberKind::kSingle ? 7 : 16);
  return {text, end};
}

std::string Describe(const Data& data) {
  std::string out = FormatText("{length = %llu, bytes = 0x", data.size());
  const std::size_t shown = std::min(data.size(), kMaxDescribedBytes);
  for (std::size_t i = 0; i < shown; ++i) AppendHex(out, data[i]);
  if (shown < data.size()) out += "...";
  return out + "}";
}

std::string Describe(Date date) {
  std::string out = Rfc3339(date);
  out[out.find('T')] = ' ';
  out.replace(out.size() - 1, 1, " +0000");
  return out;
}

bool IsPlainWord(std::string_view text) {
  return !text.empty() && std::ranges::all_of(text, [](char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
           std::string_view("_$./:").find(c) != std::string_view::npos;
  });
}

void AppendString(std::string& out, std::string_view text) {
  if (IsPlainWord(text)) {
    out += text;
    return;
  }
  out += '"';
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (c == '"' || c == '\\') {
      out += '\\';
      out += c;
    } else if (c == '\n') {
      out += "\\n";
    } else if (byte < 0x20 || byte == 0x7F) {
      out += "\\x";
      AppendHex(out, std::byte{byte});
    } else {
      out += c;
    }
  }
  out += '"';
}

void AppendElement(std::string& out, const PropertyValue& value, std::size_t depth);

// `depth` is that of the container, counted from 0; its elements stand one step further in.
void AppendContainer(std::string& out, const Array& array, std::size_t depth) {
  out += "(\n";
  std::size_t left = array.size();
  for (const PropertyValue& element : array) {
    AppendIndent(out, depth + 1);
    AppendElement(out, element, depth + 1);
    out += --left == 0 ? "\n" : ",\n";
  }
  AppendIndent(out, depth);
  out += ')';
}

void AppendContainer(std::string& out, const Dictionary& dictionary, std::size_t depth) {
  out += "{\n";
  for (const auto& [key, value] : dictionary) {
    AppendIndent(out, depth + 1);
    AppendString(out, key);
    out += " = ";
    AppendElement(out, value, depth + 1);
    out += ";\n";
  }
  AppendIndent(out, depth);
  out += '}';
}

void AppendElement(std::string& out, const PropertyValue& value, std::size_t depth) {
  const Array* array = value.asArray();
  const Dictionary* dictionary = value.asDictionary();
  if (const std::string* text = value.asString()) {
    AppendString(out, *text);
  } else if (array == nullptr && dictionary == nullptr) {
    out += value.description();
  } else if (depth >= kMaxDescribedDepth) {
    out += "...";
  } else if (array != nullptr) {
    AppendContainer(out, *array, depth);
  } else {
    AppendContainer(out, *dictionary, depth);
  }
}

}  // namespace

std::int64_t Number::toInt64() const {
  using Limits = std::numeric_limits<std::int64_t>;
  if (const auto* real = std::get_if<double>(&value_)) {
    if (std::isnan(*real)) return 0;
    if (*real >= kTwoTo63) return Limits::max();
    return *real < -kTwoTo63 ? Limits::min() : static_cast<std::int64_t>(*real);
  }
  if (const auto* large = std::get_if<std::uint64_t>(&value_)) {
    return std::in_range<std::int64_t>(*large) ? static_cast<std::int64_t>(*large) : Limits::max();
  }
  return std::get<std::int64_t>(value_);
}

std::uint64_t Number::toUInt64() const {
  if (const auto* real = std::get_if<double>(&value_)) {
    if (!(*real > 0)) return 0;
    return *real >= kTwoTo64 ? std::numeric_limits<std::uint64_t>::max()
                             : static_cast<std::uint64_t>(*real);
  }
  if (const auto* large = std::get_if<std::uint64_t>(&value_)) return *large;
  return static_cast<std::uint64_t>(std::max<std::int64_t>(0, std::get<std::int64_t>(value_)));
}

double Number::toDouble() const {
  return std::visit([](auto stored) { return static_cast<double>(stored); }, value_);
}

bool Number::operator==(const Number& other) const {
  return std::visit([](auto a, auto b) { return SameNumber(a, b); }, value_, other.value_);
}

Array::Array() : elements_(std::make_shared<Elements>()) {}
Array::Array(std::initializer_list<PropertyValue> elements)
    : elements_(std::make_shared<Elements>(elements)) {}

std::size_t Array::size() const { return elements_->size(); }
PropertyValue& Array::operator[](std::size_t index) { return (*elements_)[index]; }
const PropertyValue& Array::operator[](std::size_t index) const { return (*elements_)[index]; }
void Array::push_back(PropertyValue value) { elements_->push_back(std::move(value)); }
void Array::reserve(std::size_t count) { elements_->reserve(count); }
void Array::truncate(std::size_t count) {
  elements_->erase(elements_->begin() + static_cast<std::ptrdiff_t>(count), elements_->end());
}
Array::Elements::const_iterator Array::begin() const { return elements_->cbegin(); }
Array::Elements::const_iterator Array::end() const { return elements_->cend(); }

Array Array::shallowCopy() const {
  Array copy;
  *copy.elements_ = *elements_;
  return copy;
}

Array Array::deepCopy() const {
  Array copy;
  copy.reserve(size());
  for (const PropertyValue& element : *this) copy.push_back(element.deepCopy());
  return copy;
}

bool Array::sharesWith(const Array& other) const { return elements_ == other.elements_; }
bool Array::operator==(const Array& other) const { return *elements_ == *other.elements_; }

Dictionary::Dictionary() : entries_(std::make_shared<Entries>()) {}
Dictionary::Dictionary(std::initializer_list<std::pair<std::string_view, PropertyValue>> entries)
    : Dictionary() {
  for (const auto& [key, value] : entries) (*this)[key] = value;
}

std::size_t Dictionary::size() const { return entries_->size(); }

const PropertyValue* Dictionary::find(std::string_view key) const {
  const auto entry = entries_->find(key);
  return entry == entries_->end() ? nullptr : &entry->second;
}

PropertyValue* Dictionary::find(std::string_view key) {
  const auto entry = entries_->find(key);
  return entry == entries_->end() ? nullptr : &entry->second;
}

PropertyValue& Dictionary::operator[](std::string_view key) {
  // Documents and the counter store come in order: then there is nothing to search.
  if (!entries_->empty() && entries_->rbegin()->first < key) {
    return entries_->emplace_hint(entries_->end(), key, PropertyValue())->second;
  }
  const auto place = entries_->lower_bound(key);
  if (place != entries_->end() && place->first == key) return place->second;
  return entries_->emplace_hint(place, key, PropertyValue())->second;
}

void Dictionary::remove(std::string_view key) {
  if (const auto entry = entries_->find(key); entry != entries_->end()) entries_->erase(entry);
}

Dictionary::Entries::const_iterator Dictionary::begin() const { return entries_->cbegin(); }
Dictionary::Entries::const_iterator Dictionary::end() const { return entries_->cend(); }

Dictionary Dictionary::shallowCopy() const {
  Dictionary copy;
  *copy.entries_ = *entries_;
  return copy;
}

Dictionary Dictionary::deepCopy() const {
  Dictionary copy;
  for (const auto& [key, value] : *this) {
    copy.entries_->emplace_hint(copy.entries_->end(), key, value.deepCopy());
  }
  return copy;
}

bool Dictionary::sharesWith(const Dictionary& other) const { return entries_ == other.entries_; }
const void* Dictionary::identity() const { return entries_.get(); }
bool Dictionary::operator==(const Dictionary& other) const { return *entries_ == *other.entries_; }

PropertyValue PropertyValue::shallowCopy() const {
  if (const Array* array = asArray()) return array->shallowCopy();
  if (const Dictionary* dictionary = asDictionary()) return dictionary->shallowCopy();
  return *this;
}

PropertyValue PropertyValue::deepCopy() const {
  if (const Array* array = asArray()) return array->deepCopy();
  if (const Dictionary* dictionary = asDictionary()) return dictionary->deepCopy();
  return *this;
}

std::string PropertyValue::description() const {
  if (const bool* boolean = asBoolean()) return *boolean ? "1" : "0";
  if (const Number* number = asNumber()) return Describe(*number);
  if (const std::string* text = asString()) return *text;
  if (const Data* data = asData()) return Describe(*data);
  if (const Date* date = asDate()) return Describe(*date);
  std::string out;
  AppendElement(out, *this, 0);
  return out;
}

const std::string* StringEntry(const Dictionary& dictionary, std::string_view key) {
  const PropertyValue* value = dictionary.find(key);
  return value == nullptr ? nullptr : value->asString();
}

const Array* ArrayEntry(const Dictionary& dictionary, std::string_view key) {
  const PropertyValue* value = dictionary.find(key);
  return value == nullptr ? nullptr : value->asArray();
}

const Dictionary* DictionaryEntry(const Dictionary& dictionary, std::string_view key) {
  const PropertyValue* value = dictionary.find(key);
  return value == nullptr ? nullptr : value->asDictionary();
}

const Data* DataEntry(const Dictionary& dictionary, std::string_view key) {
  const PropertyValue* value = dictionary.find(key);
  return value == nullptr ? nullptr : value->asData();
}

std::optional<std::int64_t> IntegerEntry(const Dictionary& dictionary, std::string_view key) {
  const PropertyValue* value = dictionary.find(key);
  const Number* number = value == nullptr ? nullptr : value->asNumber();
  return number == nullptr ? std::nullopt : std::optional(number->toInt64());
}

}  // namespace quorlet
