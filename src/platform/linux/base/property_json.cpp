#include "platform/linux/base/property_json.h"

#include <cmath>

#include "values/base64.h"
#include "values/property_list.h"
#include "values/text.h"

namespace quorlet {
namespace {

using Json = nlohmann::ordered_json;

Json NumberJson(const Number& number) {
  if (!number.isReal()) {
    return number.kind() == NumberKind::kUInt64 ? Json(number.toUInt64()) : Json(number.toInt64());
  }
  const double real = number.toDouble();
  if (std::isnan(real)) return "nan";
  if (std::isinf(real)) return real > 0 ? "inf" : "-inf";
  return real;
}

Json Convert(const PropertyValue& value, std::size_t depth) {
  if (const bool* boolean = value.asBoolean()) return *boolean;
  if (const Number* number = value.asNumber()) return NumberJson(*number);
  if (const std::string* text = value.asString()) return *text;
  if (const Data* data = value.asData()) return Base64Text(*data);
  if (const Date* date = value.asDate()) return Rfc3339(*date);
  if (depth == kMaxPropertyListDepth) return nullptr;
  if (const Array* array = value.asArray()) {
    Json list = Json::array();
    for (const PropertyValue& element : *array) list.push_back(Convert(element, depth + 1));
    return list;
  }
  Json object = Json::object();
  // Keys of a dictionary differ, so they are appended without a search for an equal one.
  auto& members = object.get_ref<Json::object_t&>();
  for (const auto& [key, element] : *value.asDictionary()) {
    members.Container::emplace_back(key, Convert(element, depth + 1));
  }
  return object;
}

}  // namespace

Json PropertyJson(const PropertyValue& value) { return Convert(value, 0); }

std::string JsonLine(const Json& json) {
  return json.dump(-1, ' ', true, Json::error_handler_t::replace);
}

}  // namespace quorlet
