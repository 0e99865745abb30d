// Any bytes are either refused or read; what was read can be written, and read again as the same.
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <span>
#include <string>

#include "values/property_list.h"

namespace quorlet {
namespace {

[[noreturn]] void Fail(const char* what, const std::string& detail) {
  std::fprintf(stderr, "%s: %s\n", what, detail.c_str());
  std::abort();
}

// What a writing may change is made the same: text, fractions of a second and years beyond 9999,
// and NaN, which never equals itself.
PropertyValue Settled(const PropertyValue& value) {
  if (const Number* number = value.asNumber()) {
    return std::isnan(number->toDouble()) ? PropertyValue("nan") : value;
  }
  if (const Date* date = value.asDate()) return AsWritten(*date);
  if (const std::string* text = value.asString()) return AsWritten(*text);
  if (const Array* array = value.asArray()) {
    Array settled;
    for (const PropertyValue& element : *array) settled.push_back(Settled(element));
    return settled;
  }
  if (const Dictionary* dictionary = value.asDictionary()) {
    Dictionary settled;
    for (const auto& [key, element] : *dictionary) settled[AsWritten(key)] = Settled(element);
    return settled;
  }
  return value;
}

PropertyValue Read(const std::string& document) {
  auto result = ReadPropertyList(document);
  if (const auto* error = std::get_if<PropertyListError>(&result)) {
    Fail("A written document is refused", error->description + "\n" + document);
  }
  return std::get<PropertyValue>(result);
}

bool Write(const PropertyValue& value, std::string& document) {
  auto result = WriteXmlPropertyList(value);
  if (const auto* error = std::get_if<PropertyListError>(&result)) {
    // A few shared objects can grow beyond what a document may be.
    if (error->description.starts_with("the document is larger")) return false;
    Fail("A tree that was read is not written", error->description);
  }
  document = std::get<std::string>(result);
  return true;
}

}  // namespace
}  // namespace quorlet

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace quorlet;
  const auto result = ReadPropertyList(std::as_bytes(std::span(bytes, size)));
  const auto* value = std::get_if<PropertyValue>(&result);
  if (value == nullptr) return 0;
  (void)value->description();
  std::string document;
  if (!Write(*value, document)) return 0;
  if (Settled(*value) != Settled(Read(document))) Fail("A value has changed", document);
  return 0;
}
