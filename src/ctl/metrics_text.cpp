#include "ctl/metrics_text.h"

#include <array>
#include <cmath>
#include <cstdlib>
#include <optional>

#include "ctl/channel_view.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr char kPrefix[] = "quorlet_channel";

struct BaseUnit {
  std::uint8_t quantity;
  std::uint64_t scale;
  std::string_view name;
};
constexpr auto kBaseUnits = std::to_array<BaseUnit>({{1, 0, "seconds"},
                                                     {2, 0, "watts"},
                                                     {3, 0, "joules"},
                                                     {4, 0, "amperes"},
                                                     {5, 0, "volts"},
                                                     {6, 0, "farads"},
                                                     {7, 0, "henries"},
                                                     {8, 0, "hertz"},
                                                     {9, 0x820000000000, "bytes"},
                                                     {10, 0, "celsius"},
                                                     {100, 0, "events"},
                                                     {101, 0, "packets"}});

// "key="value"" with what would end the value escaped.
std::string Label(std::string_view name, std::string_view value) {
  std::string label(name);
  label += "=\"";
  for (const char c : RepairUtf8(value)) {
    if (c == '\n') {
      label += "\\n";
    } else {
      if (c == '"' || c == '\\') label += '\\';
      label += c;
    }
  }
  return label + "\"";
}

std::string NumberText(double value) {
  if (std::isnan(value)) return "NaN";
  if (std::isinf(value)) return value < 0 ? "-Inf" : "+Inf";
  return FormatText("%@", Double(value));
}

// A bound is written as a real.
std::string BoundText(double bound) {
  const std::string text = NumberText(bound);
  return text.find_first_of(".eIN") == std::string::npos ? text + ".0" : text;
}

}  // namespace

// What the lines of one channel share.
struct MetricsText::Channel {
  std::string labels;
  std::string suffix;  // "_seconds", or nothing
  std::string_view unit;
  double factor = 1;  // to the base unit

  explicit Channel(Dictionary& sample) {
    const Dictionary described = DescribeChannel(sample);
    for (const auto& [label, key] : {std::pair("driver", "driver"), std::pair("channel", "name"),
                                     std::pair("group", "group"), std::pair("subgroup", "subgroup"),
                                     std::pair("driver_id", "driver_id"), std::pair("id", "id")}) {
      const std::string* text = StringEntry(described, key);
      if (text == nullptr || text->empty()) continue;
      labels += (labels.empty() ? "" : ",") + Label(label, *text);
    }
    findUnit(sample);
  }

 private:
  void findUnit(Dictionary& sample) {
    const std::uint64_t code = DrvReportChannelGetUnit(sample);
    const std::string* label = DrvReportChannelGetUnitLabel(sample);
    if (label == nullptr) return;
    for (const BaseUnit& base : kBaseUnits) {
      const std::uint64_t to = std::uint64_t{base.quantity} << 56 | base.scale;
      // Large enough that a factor below 1 keeps its digits.
      constexpr std::uint64_t kProbe = 1'000'000'000'000;
      const double scaled = DrvReportScaleValue(kProbe, code, to);
      if (code >> 56 != base.quantity || !std::isfinite(scaled) || scaled == 0) continue;
      factor = scaled / static_cast<double>(kProbe);
      unit = base.name;
      suffix = "_" + std::string(unit);
      return;
    }
    labels += "," + Label("unit", *label);
  }
};

MetricsText::Family& MetricsText::family(const std::string& name, std::string_view type,
                                         std::string_view unit, std::string_view help) {
  return families_.try_emplace(name, Family{type, unit, help, {}}).first->second;
}

void MetricsText::addLine(Family& family, const std::string& series, const std::string& value) {
  if (series_.insert(series).second) family.lines.push_back(series + " " + value);
}

void MetricsText::add(Dictionary& sample) {
  const Channel channel(sample);
  const Dictionary values = DescribeValues(sample);
  // What is in the base unit already keeps all its digits.
  const auto scaled = [&](const Number& number) {
    return channel.factor == 1 ? FormatText("%lld", number.toInt64())
                               : NumberText(number.toDouble() * channel.factor);
  };
  if (const PropertyValue* value = values.find("value"); value && value->asNumber()) {
    const std::string name = kPrefix + channel.suffix;
    addLine(family(name, "unknown", channel.unit, "What a simple reporting channel says."),
            name + "{" + channel.labels + "}", scaled(*value->asNumber()));
  } else if (const Array* array = ArrayEntry(values, "values")) {
    const std::string name = kPrefix + std::string("_array") + channel.suffix;
    Family& family = this->family(name, "unknown", channel.unit, "A value of an array channel.");
    for (std::size_t i = 0; i < array->size(); ++i) {
      if ((*array)[i].asNumber() == nullptr) continue;
      addLine(family, name + "{" + channel.labels + "," + Label("index", std::to_string(i)) + "}",
              scaled(*(*array)[i].asNumber()));
    }
  } else if (const Array* states = ArrayEntry(values, "states")) {
    addStates(channel, *states);
  } else if (const Array* buckets = ArrayEntry(values, "buckets")) {
    addHistogram(channel, *buckets);
  }
}

void MetricsText::addStates(const Channel& channel, const Array& states) {
  const std::string time = kPrefix + std::string("_state") + channel.suffix;
  const std::string entered = kPrefix + std::string("_state_transitions");
  Family& times = family(time, "counter", channel.unit, "Time spent in a state.");
  Family& entries = family(entered, "counter", "", "How often a state was entered.");
  std::set<std::string> names;
  for (const PropertyValue& value : states) {
    const Dictionary& state = *value.asDictionary();
    std::string name = *StringEntry(state, "name");
    if (!names.insert(name).second) name += " " + *StringEntry(state, "id");
    const std::string labels = "{" + channel.labels + "," + Label("state", name) + "}";
    const auto count = [&](std::string_view key) {
      return static_cast<double>(static_cast<std::uint64_t>(IntegerEntry(state, key).value_or(0)));
    };
    addLine(times, time + "_total" + labels, NumberText(count("residency") * channel.factor));
    addLine(entries, entered + "_total" + labels, NumberText(count("transitions")));
  }
}

// Its buckets count upwards; each line counts all that is not above its bound.
void MetricsText::addHistogram(const Channel& channel, const Array& buckets) {
  const std::string name = kPrefix + std::string("_distribution") + channel.suffix;
  std::vector<std::pair<std::string, double>> lines;
  double hits = 0;
  double sum = 0;
  std::optional<std::int64_t> last;
  bool isNegative = false;
  for (const PropertyValue& value : buckets) {
    const Dictionary& bucket = *value.asDictionary();
    const auto upper = IntegerEntry(bucket, "up_to");
    const bool isLast = &value == &buckets[buckets.size() - 1];
    if ((!upper && !isLast) || (upper && last && *upper <= *last)) return;  // no such histogram
    last = upper;
    hits += static_cast<double>(IntegerEntry(bucket, "hits").value_or(0));
    sum += static_cast<double>(IntegerEntry(bucket, "sum").value_or(0)) * channel.factor;
    isNegative |= IntegerEntry(bucket, "minimum").value_or(0) < 0;
    if (!upper) break;
    lines.emplace_back(BoundText(static_cast<double>(*upper) * channel.factor), hits);
  }
  if (buckets.empty()) return;
  lines.emplace_back("+Inf", hits);
  Family& family =
      this->family(name, "histogram", channel.unit, "The values that a histogram channel counted.");
  for (const auto& [bound, count] : lines) {
    addLine(family, name + "_bucket{" + channel.labels + "," + Label("le", bound) + "}",
            NumberText(count));
  }
  addLine(family, name + "_count{" + channel.labels + "}", NumberText(hits));
  // The sum of values below 0 as well is none that only grows.
  if (!isNegative) addLine(family, name + "_sum{" + channel.labels + "}", NumberText(sum));
}

std::string MetricsText::text() const {
  const bool isOpen = format_ == MetricsFormat::kOpenMetrics;
  std::string text;
  for (const auto& [name, family] : families_) {
    if (family.lines.empty()) continue;
    const bool isCounter = family.type == "counter";
    // Prometheus knows the whole name only, and has another word for what is unknown.
    const std::string shown = name + (isCounter && !isOpen ? "_total" : "");
    const std::string type(family.type == "unknown" && !isOpen ? "untyped" : family.type);
    text += "# HELP " + shown + " " + std::string(family.help) + "\n";
    text += "# TYPE " + shown + " " + type + "\n";
    if (isOpen && !family.unit.empty()) {
      text += "# UNIT " + shown + " " + std::string(family.unit) + "\n";
    }
    for (const std::string& line : family.lines) text += line + "\n";
  }
  return isOpen ? text + "# EOF\n" : text;
}

}  // namespace quorlet
