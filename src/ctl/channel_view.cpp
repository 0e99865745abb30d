#include "ctl/channel_view.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <limits>
#include <optional>

#include "ctl/output.h"
#include "ctl/terminal.h"

namespace quorlet {
namespace {

constexpr std::int32_t kValuesPerRecord = 4;

std::string Decimals(double number, int count) {
  std::array<char, 400> text{};  // the largest double has 309 digits
  std::snprintf(text.data(), text.size(), "%.*f", count, number);
  return text.data();
}

std::string TextOr(const std::string* text, std::string_view otherwise) {
  return text != nullptr ? *text : std::string(otherwise);
}

// The name, otherwise the ID.
std::string Title(Dictionary& channel) {
  const std::string* name = DrvReportChannelGetChannelName(channel);
  if (name != nullptr) return *name;
  return Hexadecimal(static_cast<std::uint64_t>(DrvReportChannelGetChannelID(channel)));
}

struct State {
  std::string name;
  std::int64_t id = 0;
  std::int64_t transitions = 0;
  std::int64_t residency = 0;
  double share = 0;  // of all time; not a number when there is none
};

// Empty when the states cannot be read.
std::vector<State> States(Dictionary& sample) {
  std::vector<State> states;
  std::uint64_t sum = 0;
  const int count = DrvReportStateGetCount(sample);
  // All states have names or none has, and then each question would look for all of them again.
  const bool haveNames = count > 0 && DrvReportStateGetNameForIndex(sample, 0) != nullptr;
  for (std::int32_t i = 0; i < count; ++i) {
    State state;
    state.id = DrvReportStateGetIDForIndex(sample, i);
    state.transitions = DrvReportStateGetInTransitions(sample, i);
    state.residency = DrvReportStateGetResidency(sample, i);
    if (state.id == kDrvReportInvalidValue && state.residency == kDrvReportInvalidValue) return {};
    state.name = TextOr(haveNames ? DrvReportStateGetNameForIndex(sample, i) : nullptr,
                        Hexadecimal(static_cast<std::uint64_t>(state.id)));
    sum += static_cast<std::uint64_t>(state.residency);
    states.push_back(std::move(state));
  }
  // The library's duty cycle, which would add up all states for each of them.
  for (State& state : states) {
    state.share = sum == 0 ? std::numeric_limits<double>::quiet_NaN()
                           : static_cast<double>(static_cast<std::uint64_t>(state.residency)) /
                                 static_cast<double>(sum);
  }
  return states;
}

struct Bucket {
  std::optional<std::int64_t> lower;
  std::optional<std::int64_t> upper;
  std::int64_t hits = 0;
  std::int64_t minimum = 0;
  std::int64_t maximum = 0;
  std::int64_t sum = 0;
};

// Empty when the buckets cannot be read.
std::vector<Bucket> Buckets(Dictionary& sample) {
  std::vector<Bucket> buckets;
  const int count = DrvReportHistogramGetBucketCount(sample);
  std::int64_t bound = 0;
  // Without the first one there are none, and each question would compute them again.
  const bool haveBounds =
      DrvReportHistogramGetBucketBounds(sample, 0, &bound, nullptr) == kKernelSuccess;
  for (std::int32_t i = 0; i < count; ++i) {
    Bucket bucket;
    bucket.hits = DrvReportHistogramGetBucketHits(sample, i);
    if (bucket.hits == kDrvReportInvalidValue) return {};
    bucket.minimum = DrvReportHistogramGetBucketMinValue(sample, i);
    bucket.maximum = DrvReportHistogramGetBucketMaxValue(sample, i);
    bucket.sum = DrvReportHistogramGetBucketSum(sample, i);
    const auto has = [&](std::int64_t* lower, std::int64_t* upper) {
      return haveBounds &&
             DrvReportHistogramGetBucketBounds(sample, i, lower, upper) == kKernelSuccess;
    };
    if (has(&bound, nullptr)) bucket.lower = bound;
    if (has(nullptr, &bound)) bucket.upper = bound;
    buckets.push_back(bucket);
  }
  return buckets;
}

std::int32_t ArrayValueCount(const Dictionary& sample) {
  return DrvReportSampleGetElementCount(sample) * kValuesPerRecord;
}

Array DescribeStates(const std::vector<State>& states) {
  Array described;
  for (const State& state : states) {
    Dictionary item{{"name", state.name},
                    {"id", Hexadecimal(static_cast<std::uint64_t>(state.id))},
                    {"transitions", Int64(state.transitions)},
                    {"residency", Int64(state.residency)}};
    if (!std::isnan(state.share)) item["share"] = Double(state.share);
    described.push_back(item);
  }
  return described;
}

Array DescribeBuckets(const std::vector<Bucket>& buckets) {
  Array described;
  for (const Bucket& bucket : buckets) {
    Dictionary item{{"hits", Int64(bucket.hits)}};
    if (bucket.lower) item["above"] = Int64(*bucket.lower);
    if (bucket.upper) item["up_to"] = Int64(*bucket.upper);
    if (bucket.hits != 0) {
      item["minimum"] = Int64(bucket.minimum);
      item["maximum"] = Int64(bucket.maximum);
      item["sum"] = Int64(bucket.sum);
    }
    described.push_back(item);
  }
  return described;
}

std::vector<std::string> ArrayLines(Dictionary& sample, std::string_view prefix) {
  std::vector<std::string> lines;
  const std::string unit = TextOr(DrvReportChannelGetUnitLabel(sample), "(null)");
  const std::int32_t count = ArrayValueCount(sample);
  for (std::int32_t i = 0; i < count; i += kValuesPerRecord) {
    std::string line(prefix);
    line += RightAligned(Escape(Title(sample)), 32) + "[" + std::to_string(i) + "] = {";
    for (std::int32_t k = i; k < i + kValuesPerRecord; ++k) {
      const std::int64_t value = DrvReportArrayGetValueAtIndex(sample, k);
      line += value == kDrvReportInvalidValue ? " -" : " " + std::to_string(value);
    }
    lines.push_back(line + " " + Escape(unit) + " }");
  }
  return lines;
}

// Of a histogram that the library does not describe, since some buckets have no bounds.
std::vector<std::string> BucketLines(Dictionary& sample, std::string_view prefix) {
  std::vector<std::string> lines;
  if (DrvReportChannelGetFormat(sample) != kDrvReportFormatHistogram) return lines;
  const std::string unit = TextOr(DrvReportChannelGetUnitLabel(sample), "(null)");
  const auto bound = [](const std::optional<std::int64_t>& value) {
    return RightAligned(value ? std::to_string(*value) : "?", 12);
  };
  for (const Bucket& bucket : Buckets(sample)) {
    const std::string range = bound(bucket.lower) + " - " + bound(bucket.upper) + " " + unit;
    lines.push_back(std::string(prefix) + RightAligned(Escape(Title(sample)), 20) + "[" +
                    Escape(range) + "] = { # " + std::to_string(bucket.hits) + " }");
  }
  return lines;
}

// Bytes by powers of 1024, everything else as it is.
std::string Amount(double amount, std::string_view unit) {
  constexpr std::array<const char*, 5> kBytes = {"B", "KiB", "MiB", "GiB", "TiB"};
  if (unit != kBytes[0]) return Decimals(amount, amount < 100 && amount > -100 ? 1 : 0);
  std::size_t step = 0;
  for (; (amount >= 1024 || amount <= -1024) && step + 1 < kBytes.size(); ++step) amount /= 1024;
  return Decimals(amount, step == 0 ? 0 : 1) + " " + kBytes[step];
}

// Widths of the columns behind the first two, which share what is left.
constexpr std::size_t kDetailWidth = 22;
constexpr std::size_t kChangeWidth = 12;
constexpr std::size_t kRateWidth = 13;
constexpr std::size_t kNowWidth = 13;

// A number that is too long takes the room of texts: it is never cut.
std::string NumberColumn(std::string_view number, std::size_t width) {
  return RightAligned(number, std::max(width, number.size()));
}

std::string Row(std::size_t columns, std::string_view title, std::string_view detail,
                std::string_view change, std::string_view rate, std::string_view now) {
  const std::string numbers = " " + NumberColumn(change, kChangeWidth) + " " +
                              NumberColumn(rate, kRateWidth) + " " + NumberColumn(now, kNowWidth);
  const std::size_t left = columns > numbers.size() ? columns - numbers.size() : 0;
  const std::size_t detailWidth = std::min(kDetailWidth, left / 3);
  if (detailWidth == 0) return LeftAligned(title, left) + numbers;
  return LeftAligned(title, left - detailWidth - 1) + " " + LeftAligned(detail, detailWidth) +
         numbers;
}

std::string Percent(double share) {
  return share == share ? Decimals(share * 100, 1) + " %" : "-";  // what is no number is not equal
}

// The names and numbers before a bar, and the bar in what is left of the line.
std::string BarRow(std::size_t columns, std::string_view title, std::string_view name, double share,
                   double rate) {
  constexpr std::size_t kShareWidth = 8;
  const std::string start = LeftAligned(title, kDetailWidth) + " " +
                            LeftAligned(name, kDetailWidth) + " " +
                            RightAligned(Percent(share), kShareWidth) + " " +
                            RightAligned(Decimals(rate, 1) + "/s", kRateWidth) + " ";
  constexpr std::size_t kWidestBar = 50;
  const std::size_t used = 2 * kDetailWidth + kShareWidth + kRateWidth + 4;
  const std::size_t room = columns > used + 2 ? std::min(columns - used - 2, kWidestBar) : 0;
  return std::string(FitColumns(start + (room == 0 ? "" : Bar(share, room)), columns));
}

// What one of a unit of time is in seconds.
std::optional<double> SecondsOf(std::string_view unit) {
  constexpr std::pair<std::string_view, double> kUnits[] = {
      {"ns", 1e-9}, {"us", 1e-6}, {"ms", 1e-3}, {"s", 1}};
  const auto* const found =
      std::ranges::find(kUnits, unit, &std::pair<std::string_view, double>::first);
  return found != std::end(kUnits) ? std::optional(found->second) : std::nullopt;
}

std::vector<std::string> SimpleRow(Dictionary& sample, Dictionary& delta, double seconds,
                                   std::size_t columns) {
  const std::int64_t now = DrvReportSimpleGetIntegerValue(sample);
  const std::int64_t change = DrvReportSimpleGetIntegerValue(delta);
  if (now == kDrvReportInvalidValue || change == kDrvReportInvalidValue) {
    return {std::string(FitColumns(NoteLine(sample, "", "unreadable"), columns))};
  }
  const std::string unit = Escape(TextOr(DrvReportChannelGetUnitLabel(sample), ""));
  const auto number = static_cast<double>(change);
  const std::string suffix = unit == "events" || unit.empty() ? "" : " " + unit;
  // Time that passed in a state, say, is a share of the time that went by.
  const auto second = SecondsOf(unit);
  const std::string rate =
      second ? Percent(number * *second / seconds) : Amount(number / seconds, unit) + "/s";
  return {Row(columns, Escape(Title(sample)),
              Escape(TextOr(DrvReportChannelGetSubGroup(sample), "")),
              unit == "B" ? Amount(number, unit) : std::to_string(change) + suffix, rate,
              unit == "B" ? Amount(static_cast<double>(now), unit) : std::to_string(now) + suffix)};
}

}  // namespace

std::string FormatName(std::uint8_t format) {
  switch (format) {
    case kDrvReportFormatSimple:
      return "simple";
    case kDrvReportFormatState:
      return "state";
    case kDrvReportFormatHistogram:
      return "histogram";
    case kDrvReportFormatArray:
      return "array";
    default:
      return std::to_string(format);
  }
}

Dictionary DescribeChannel(Dictionary& channel) {
  Dictionary described{
      {"driver_id", Hexadecimal(static_cast<std::uint64_t>(DrvReportChannelGetDriverID(channel)))},
      {"id", Hexadecimal(static_cast<std::uint64_t>(DrvReportChannelGetChannelID(channel)))},
      {"format", FormatName(DrvReportChannelGetFormat(channel))},
      {"categories", Int32(DrvReportChannelGetCategories(channel))},
      {"elements", Int32(DrvReportChannelGetElementCount(channel))}};
  const std::uint64_t unit = DrvReportChannelGetUnit(channel);
  if (unit != static_cast<std::uint64_t>(kDrvReportInvalidValue)) {
    described["unit"] = Hexadecimal(unit);
  }
  const std::pair<const char*, const std::string*> texts[] = {
      {"driver", DrvReportChannelGetDriverName(channel)},
      {"name", DrvReportChannelGetChannelName(channel)},
      {"unit_label", DrvReportChannelGetUnitLabel(channel)},
      {"group", DrvReportChannelGetGroup(channel)},
      {"subgroup", DrvReportChannelGetSubGroup(channel)}};
  for (const auto& [key, text] : texts) {
    if (text != nullptr) described[key] = *text;
  }
  return described;
}

std::vector<std::string> ListRow(Dictionary& channel) {
  std::string group = TextOr(DrvReportChannelGetGroup(channel), "");
  if (const std::string* sub = DrvReportChannelGetSubGroup(channel)) group += " / " + *sub;
  return {Escape(Title(channel)),
          Escape(group),
          FormatName(DrvReportChannelGetFormat(channel)),
          Escape(TextOr(DrvReportChannelGetUnitLabel(channel), "")),
          std::to_string(DrvReportChannelGetElementCount(channel)),
          Escape(TextOr(DrvReportChannelGetDriverName(channel), ""))};
}

Dictionary DescribeValues(Dictionary& sample) {
  Dictionary described;
  switch (DrvReportChannelGetFormat(sample)) {
    case kDrvReportFormatSimple: {
      const std::int64_t value = DrvReportSimpleGetIntegerValue(sample);
      if (value != kDrvReportInvalidValue) described["value"] = Int64(value);
      break;
    }
    case kDrvReportFormatState:
      if (const auto states = States(sample); !states.empty()) {
        described["states"] = DescribeStates(states);
      }
      break;
    case kDrvReportFormatHistogram:
      if (const auto buckets = Buckets(sample); !buckets.empty()) {
        described["buckets"] = DescribeBuckets(buckets);
      }
      break;
    case kDrvReportFormatArray: {
      Array values;
      const std::int32_t count = ArrayValueCount(sample);
      for (std::int32_t i = 0; i < count; ++i) {
        const std::int64_t value = DrvReportArrayGetValueAtIndex(sample, i);
        values.push_back(value == kDrvReportInvalidValue ? PropertyValue("unreadable")
                                                         : Int64(value));
      }
      described["values"] = values;
      break;
    }
    default:
      break;
  }
  return described;
}

std::vector<std::string> SampleLines(Dictionary& sample, std::string_view prefix,
                                     std::size_t barWidth) {
  const std::uint8_t format = DrvReportChannelGetFormat(sample);
  if (format == kDrvReportFormatArray) return ArrayLines(sample, prefix);
  std::vector<State> states;
  if (format == kDrvReportFormatState) states = States(sample);
  const bool isReadable = format == kDrvReportFormatState ? !states.empty()
                          : format == kDrvReportFormatSimple
                              ? DrvReportSimpleGetIntegerValue(sample) != kDrvReportInvalidValue
                              : true;
  const auto description =
      isReadable ? DrvReportSampleCopyDescription(sample, 0, prefix) : std::nullopt;
  if (!description) {
    auto lines = BucketLines(sample, prefix);
    if (lines.empty()) lines.push_back(NoteLine(sample, prefix, "unreadable"));
    return lines;
  }
  if (barWidth == 0) states.clear();
  std::vector<std::string> lines;
  // A name may hold line ends; it is in the line of each record.
  const auto ends = static_cast<std::size_t>(std::ranges::count(*description, '\n'));
  const std::size_t endsOfRecord =
      ends / std::max<std::size_t>(DrvReportSampleGetElementCount(sample), 1);
  std::string_view rest = *description;
  while (!rest.empty()) {
    std::size_t end = rest.find('\n');
    for (std::size_t i = 1; i < endsOfRecord; ++i) end = rest.find('\n', end + 1);
    std::string line = Escape(rest.substr(0, end));
    if (lines.size() < states.size()) line += " " + Bar(states[lines.size()].share, barWidth);
    lines.push_back(std::move(line));
    rest.remove_prefix(std::min(rest.size(), end + 1));
  }
  return lines;
}

std::string NoteLine(Dictionary& sample, std::string_view prefix, std::string_view note) {
  return std::string(prefix) + RightAligned(Escape(Title(sample)), 32) + " = { " +
         std::string(note) + " }";
}

bool HasRestarted(Dictionary& delta) {
  switch (DrvReportChannelGetFormat(delta)) {
    case kDrvReportFormatState:
      return std::ranges::any_of(States(delta), [](const State& state) {
        return state.transitions < 0 || state.residency < 0;
      });
    case kDrvReportFormatHistogram:
      return std::ranges::any_of(Buckets(delta),
                                 [](const Bucket& bucket) { return bucket.hits < 0; });
    default:
      return false;  // simple values may fall
  }
}

std::string TableHeader(std::size_t columns) {
  return Row(columns, "CHANNEL", "DEVICE", "CHANGE", "RATE", "NOW");
}

std::vector<std::string> TableRows(Dictionary& sample, Dictionary& delta, double seconds,
                                   std::size_t columns) {
  std::vector<std::string> rows;
  const std::string title = Escape(Title(sample));
  switch (DrvReportChannelGetFormat(delta)) {
    case kDrvReportFormatSimple:
      return SimpleRow(sample, delta, seconds, columns);
    case kDrvReportFormatState:
      for (const State& state : States(delta)) {
        rows.push_back(BarRow(columns, title, Escape(state.name), state.share,
                              static_cast<double>(state.transitions) / seconds));
      }
      return rows;
    case kDrvReportFormatHistogram: {
      const std::string unit = Escape(TextOr(DrvReportChannelGetUnitLabel(sample), ""));
      const auto buckets = Buckets(delta);
      double hits = 0;
      for (const Bucket& bucket : buckets) hits += static_cast<double>(bucket.hits);
      for (const Bucket& bucket : buckets) {
        if (bucket.hits == 0) continue;
        const auto share = static_cast<double>(bucket.hits) / hits;
        const std::string bound =
            bucket.upper ? "<= " + std::to_string(*bucket.upper) + " " + unit : "more";
        rows.push_back(
            BarRow(columns, title, bound, share, static_cast<double>(bucket.hits) / seconds));
      }
      return rows;
    }
    default:
      for (const std::string& line : SampleLines(delta, "", 0)) {
        rows.emplace_back(FitColumns(line, columns));
      }
      return rows;
  }
}

}  // namespace quorlet
