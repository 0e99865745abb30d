// Any text is either refused, with a short reason, or a value whose JSON stands for the same value;
// the first line of a stored log is such a text.
#include <algorithm>

#include "ctl/json_value.h"
#include "fuzz_support.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

void Check(std::string_view text, JsonForm form) {
  const auto parsed = ParseJson(text, form);
  if (const auto* why = std::get_if<std::string>(&parsed)) {
    Expect(!why->empty() && why->size() <= 2 * text.size() + 300, "a reason is too long", *why);
    return;
  }
  const auto& value = std::get<PropertyValue>(parsed);
  const std::string written = JsonText(value, form);
  Expect(std::ranges::all_of(written, [](char c) { return c >= ' ' && c <= '~'; }),
         "not one line of ASCII", written);
  // A character takes at most six: "\u00e9".
  Expect(written.size() <= 64 + 32 * text.size(), "a text has grown", written);
  const auto again = ParseJson(written, form);
  Expect(std::holds_alternative<PropertyValue>(again), "a written text is refused", written);
  Expect(std::get<PropertyValue>(again) == value, "a value has changed", written);
  Expect(JsonText(std::get<PropertyValue>(again), form) == written, "a text has changed", written);
  // What preferences hold is written as a property list.
  static_cast<void>(WriteXmlPropertyList(value));
}

// Any value has a text, and what it stands for is what the plain form can tell.
void Print(const PropertyValue& value) {
  const std::string plain = JsonText(value, JsonForm::kPlain);
  Expect(plain.find('\n') == std::string::npos, "more than a line", plain);
  const auto read = ParseJson(plain, JsonForm::kPlain);
  Expect(std::holds_alternative<PropertyValue>(read), "a written text is refused", plain);
  Expect(JsonText(std::get<PropertyValue>(read), JsonForm::kPlain) == plain, "a text has changed",
         plain);
}

}  // namespace
}  // namespace quorlet

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  const std::string_view text = AsText(data, size);
  Check(text, JsonForm::kPlain);
  Check(text, JsonForm::kTagged);
  Check(text.substr(0, text.find('\n')), JsonForm::kPlain);
  const auto document = ReadPropertyList(text);
  if (const auto* value = std::get_if<PropertyValue>(&document)) Print(*value);
  return 0;
}
