#include "ctl/json_value.h"

#include <chrono>
#include <nlohmann/json.hpp>
#include <optional>
#include <utility>
#include <vector>

#include "ctl/options.h"
#include "platform/linux/base/property_json.h"
#include "values/base64.h"
#include "values/property_list.h"
#include "values/text.h"

namespace quorlet {
namespace {

using Json = nlohmann::ordered_json;

constexpr char kDataTag[] = "$data";
constexpr char kDateTag[] = "$date";

// The one text for these bytes, nothing else.
std::optional<Data> ParseBase64(const std::string& text) {
  if (text.size() > kMaxPropertyListBytes) return std::nullopt;
  auto data = DataFromBase64(text);
  return data && Base64Text(*data) == text ? data : std::nullopt;
}

// "2026-03-04T05:06:07Z", nothing else.
std::optional<Date> ParseRfc3339(std::string_view text) {
  if (text.size() != 20) return std::nullopt;
  const auto field = [text](std::size_t at, std::size_t length) {
    const auto digits = text.substr(at, length);
    return digits.find_first_not_of("0123456789") == std::string_view::npos
               ? ParseNumber<int>(digits)
               : std::nullopt;
  };
  const auto year = field(0, 4), month = field(5, 2), day = field(8, 2);
  const auto hour = field(11, 2), minute = field(14, 2), second = field(17, 2);
  if (!year || !month || !day || !hour || !minute || !second) return std::nullopt;
  const std::chrono::year_month_day date{std::chrono::year(*year),
                                         std::chrono::month(static_cast<unsigned>(*month)),
                                         std::chrono::day(static_cast<unsigned>(*day))};
  if (!date.ok() || *hour > 23 || *minute > 59 || *second > 59) return std::nullopt;
  const auto days = std::chrono::sys_days(date).time_since_epoch().count();
  const Date parsed{static_cast<double>(days) * 86400 + *hour * 3600 + *minute * 60 + *second};
  if (Rfc3339(parsed) != text) return std::nullopt;  // the separators
  return parsed;
}

// Dates and data as objects with one tagged member.
Json TaggedJson(const PropertyValue& value) {
  const auto tagged = [&value](const char* tag) {
    return Json::object({{tag, PropertyJson(value)}});
  };
  if (value.asData() != nullptr) return tagged(kDataTag);
  if (value.asDate() != nullptr) return tagged(kDateTag);
  if (const Array* array = value.asArray()) {
    Json list = Json::array();
    for (const PropertyValue& element : *array) list.push_back(TaggedJson(element));
    return list;
  }
  const Dictionary* dictionary = value.asDictionary();
  if (dictionary == nullptr) return PropertyJson(value);
  Json object = Json::object();
  // Keys of a dictionary differ, so they are appended without a search for an equal one.
  auto& members = object.get_ref<Json::object_t&>();
  for (const auto& [key, element] : *dictionary) {
    members.Container::emplace_back(key, TaggedJson(element));
  }
  return object;
}

// Builds a value from the parser's events, so that depth and number texts can be judged before
// anything is built from them.
class ValueBuilder final : public nlohmann::json_sax<Json> {
 public:
  explicit ValueBuilder(JsonForm form) : form_(form) {}

  bool null() override { return fail("null is not a value that can be stored"); }
  bool boolean(bool value) override { return add(value); }
  bool number_integer(std::int64_t value) override { return add(Int64(value)); }
  bool number_unsigned(std::uint64_t value) override {
    return add(std::in_range<std::int64_t>(value) ? Int64(static_cast<std::int64_t>(value))
                                                  : UInt64(value));
  }
  bool number_float(double value, const std::string& text) override {
    if (text.find_first_of(".eE") == std::string::npos) return fail(text + " is out of range");
    return add(Double(value));
  }
  bool string(std::string& value) override { return add(std::move(value)); }
  bool binary(Json::binary_t&) override { return fail("binary JSON is not read"); }
  bool start_object(std::size_t) override { return open(Dictionary()); }
  bool start_array(std::size_t) override { return open(Array()); }
  bool key(std::string& name) override {
    open_.back().key = std::move(name);
    return true;
  }
  bool end_array() override { return close(); }
  bool end_object() override { return close(); }
  bool parse_error(std::size_t, const std::string&, const Json::exception& error) override {
    std::string_view why = error.what();
    if (why.starts_with('[')) why.remove_prefix(std::min(why.find(']') + 2, why.size()));
    // It quotes what it read last, several bytes for one.
    constexpr std::size_t kLongestReason = 200;
    return fail(std::string(why.substr(0, kLongestReason)) +
                (why.size() > kLongestReason ? "..." : ""));
  }

  const std::string& error() const { return error_; }
  PropertyValue takeResult() { return std::move(result_); }

 private:
  struct Open {
    PropertyValue container;
    std::string key;
  };

  bool fail(std::string why) {
    error_ = std::move(why);
    return false;
  }

  bool open(PropertyValue container) {
    if (open_.size() == kMaxPropertyListDepth) return fail("the value is nested too deeply");
    open_.push_back({std::move(container), {}});
    return true;
  }

  bool close() {
    PropertyValue value = std::move(open_.back().container);
    open_.pop_back();
    const Dictionary* dictionary = value.asDictionary();
    if (form_ == JsonForm::kPlain || dictionary == nullptr || dictionary->size() != 1) {
      return add(std::move(value));
    }
    if (const auto* text = StringEntry(*dictionary, kDataTag)) {
      const auto data = ParseBase64(*text);
      return data ? add(*data) : fail("$data is not base64");
    }
    if (const auto* text = StringEntry(*dictionary, kDateTag)) {
      const auto date = ParseRfc3339(*text);
      return date ? add(*date) : fail("$date is not like 2026-03-04T05:06:07Z");
    }
    return add(std::move(value));
  }

  bool add(PropertyValue value) {
    if (open_.empty()) {
      result_ = std::move(value);
    } else if (Array* array = open_.back().container.asArray()) {
      array->push_back(std::move(value));
    } else {
      (*open_.back().container.asDictionary())[open_.back().key] = std::move(value);
    }
    return true;
  }

  JsonForm form_;
  std::vector<Open> open_;
  PropertyValue result_;
  std::string error_;
};

}  // namespace

std::string JsonText(const PropertyValue& value, JsonForm form) {
  return JsonLine(form == JsonForm::kTagged ? TaggedJson(value) : PropertyJson(value));
}

std::variant<PropertyValue, std::string> ParseJson(std::string_view text, JsonForm form) {
  ValueBuilder builder(form);
  if (!Json::sax_parse(text, &builder)) return builder.error();
  return builder.takeResult();
}

}  // namespace quorlet
