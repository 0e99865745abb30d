#include "platform/linux/property_json.h"

#include <openssl/evp.h>

#include <cmath>

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

std::string Base64(const Data& data) {
  std::string text((data.size() + 2) / 3 * 4 + 1, '\0');  // the encoder ends it with a NUL
  std::size_t used = 0;
  // The encoder takes an int's worth at a time; a multiple of 3 bytes needs no padding.
  constexpr std::size_t kStep = 3UL << 20;
  for (std::size_t begin = 0; begin < data.size(); begin += kStep) {
    const std::size_t length = std::min(kStep, data.size() - begin);
    used += static_cast<std::size_t>(EVP_EncodeBlock(
        reinterpret_cast<unsigned char*>(text.data() + used),
        reinterpret_cast<const unsigned char*>(data.data() + begin), static_cast<int>(length)));
  }
  text.resize(used);
  return text;
}

Json Convert(const PropertyValue& value, std::size_t depth) {
  if (const bool* boolean = value.asBoolean()) return *boolean;
  if (const Number* number = value.asNumber()) return NumberJson(*number);
  if (const std::string* text = value.asString()) return *text;
  if (const Data* data = value.asData()) return Base64(*data);
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
