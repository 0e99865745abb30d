// A log file is one line of JSON, then the body: an XML property list (the aggregated log), or a
// text whose last line is "<date> <process>[<pid>]: key:value;key:value" (the status log).
#include "ctl/export_log.h"

#include <algorithm>
#include <cmath>
#include <tuple>

#include "ctl/json_value.h"
#include "platform/names.h"
#include "values/property_list.h"
#include "values/property_list_scalars.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr std::size_t kMaxHeaderBytes = 1 << 20;
constexpr std::string_view kNoTasking = "(no tasking id)";
// Lists of any length, also of one element.
constexpr std::string_view kListKey = "ValidityList[";

// Ends the reading of one log.
struct Unreadable {
  std::string why;
};

[[noreturn]] void Refuse(std::string why) { throw Unreadable{std::move(why)}; }

std::optional<std::string> TextOf(const Dictionary& dictionary, std::string_view key) {
  const std::string* text = StringEntry(dictionary, key);
  return text != nullptr ? std::optional(*text) : std::nullopt;
}

const Date* DateOf(const Dictionary& dictionary, std::string_view key) {
  const PropertyValue* value = dictionary.find(key);
  return value != nullptr ? value->asDate() : nullptr;
}

void SetDay(ExportedLog& log, Date date) {
  log.day = static_cast<std::int64_t>(std::floor(date.secondsSince1970 / 86400));
  log.dayText = Rfc3339(date).substr(0, 10);
}

std::optional<Date> ReadHeader(std::string_view line, ExportedLog& log) {
  if (line.size() > kMaxHeaderBytes) Refuse("its first line is too long");
  const auto parsed = ParseJson(line, JsonForm::kPlain);
  const auto* value = std::get_if<PropertyValue>(&parsed);
  const Dictionary* header = value != nullptr ? value->asDictionary() : nullptr;
  if (header == nullptr) Refuse("it does not start with a line of JSON");
  const auto type = TextOf(*header, "type");
  if (!type) Refuse("its header has no type");
  log.type = *type;
  log.device = TextOf(*header, "device");
  log.osVersion = TextOf(*header, "os_version");
  const auto created = DateFromText(TextOf(*header, "created").value_or(""));
  return created ? std::optional(*created->asDate()) : std::nullopt;
}

// The entries of a part of the document; none where it lacks the part.
Dictionary Part(const Dictionary& document, std::string_view name) {
  const PropertyValue* part = document.find(name);
  if (part == nullptr) return {};
  if (part->asDictionary() == nullptr) Refuse(std::string(name) + " is no dictionary");
  return *part->asDictionary();
}

[[noreturn]] void RefuseEntry(std::string_view kind, std::string_view key) {
  Refuse("the " + std::string(kind) + " " + std::string(key) + " is not one");
}

std::optional<std::uint64_t> CountOf(const PropertyValue& value) {
  const Number* number = value.asNumber();
  const bool isCount = number != nullptr && !number->isReal() &&
                       (number->kind() == NumberKind::kUInt64 || number->toInt64() >= 0);
  return isCount ? std::optional(number->toUInt64()) : std::nullopt;
}

DistributionRow ReadDistribution(std::string_view key, const PropertyValue& value) {
  const Array* figures = value.asArray();
  if (figures == nullptr || figures->size() != 5) RefuseEntry("distribution", key);
  const auto number = [&](std::size_t index) {
    const Number* found = (*figures)[index].asNumber();
    if (found == nullptr) RefuseEntry("distribution", key);
    return *found;
  };
  const auto count = CountOf((*figures)[4]);
  if (!count) RefuseEntry("distribution", key);
  return {key, number(0), number(1), number(2), number(3), *count};
}

HistogramRow ReadHistogram(std::string_view key, const PropertyValue& value) {
  const Dictionary* buckets = value.asDictionary();
  if (buckets == nullptr) RefuseEntry("histogram", key);
  HistogramRow row{key, {}};
  row.buckets.reserve(buckets->size());
  for (const auto& [label, hits] : *buckets) {
    const auto bounds = ParseBucketLabel(label);
    const auto count = CountOf(hits);
    const auto isNan = [](const Number& bound) { return std::isnan(bound.toDouble()); };
    if (!bounds || !count || isNan(bounds->lower) || isNan(bounds->upper)) {
      RefuseEntry("histogram", key);
    }
    row.buckets.push_back({*bounds, *count});
  }
  // As integers last, since doubles cannot tell large ones apart.
  std::ranges::stable_sort(row.buckets, {}, [](const LoggedBucket& bucket) {
    const auto& [lower, upper] = bucket.bounds;
    return std::tuple(lower.toDouble(), lower.toInt64(), upper.toDouble(), upper.toInt64());
  });
  return row;
}

void ReadAggregatedLog(std::string_view body, std::optional<Date>& created, ExportedLog& log) {
  auto parsed = ReadPropertyList(body, kLogLimits);
  if (const auto* error = std::get_if<PropertyListError>(&parsed)) Refuse(error->description);
  log.document = std::get<PropertyValue>(std::move(parsed));
  const Dictionary* document = log.document.asDictionary();
  const Date* start = document != nullptr ? DateOf(*document, "TLStartDate") : nullptr;
  if (start == nullptr) Refuse("it says no start date");
  SetDay(log, *start);
  const Date* written = DateOf(*document, "TLLogCreationDate");
  if (!created && written != nullptr) created = *written;
  log.whitelist = TextOf(*document, "TLWhitelistDigest");
  log.tasking = TextOf(*document, "TLTaskID");
  if (log.tasking == kNoTasking) log.tasking.reset();
  for (const auto& [key, value] : Part(*document, "TLScalars")) {
    if (value.asNumber() == nullptr) RefuseEntry("scalar", key);
    log.scalars.push_back({key, *value.asNumber()});
  }
  for (const auto& [key, value] : Part(*document, "TLDistributions")) {
    log.distributions.push_back(ReadDistribution(key, value));
  }
  for (const auto& [key, value] : Part(*document, "TLDistributionsHistogram")) {
    log.histograms.push_back(ReadHistogram(key, value));
  }
}

ScalarRow ReadStatusPair(std::string_view pair) {
  const std::size_t colon = pair.rfind(':');
  if (colon == std::string_view::npos) Refuse("a figure has no value");
  const std::string_view key = pair.substr(0, colon);
  const std::string_view value = pair.substr(colon + 1);
  const auto number = key.starts_with(kListKey) ? std::nullopt : ParseLoggedNumber(value);
  if (number) return {key, *number};
  return {key, value};
}

void ReadStatusLog(std::string_view body, const std::optional<Date>& created, ExportedLog& log) {
  constexpr std::string_view kBeforePairs = "]: ";
  log.isStatusLog = true;
  if (created) SetDay(log, *created);
  if (!body.ends_with('\n')) Refuse("its text is cut short");
  body.remove_suffix(1);
  std::string_view line = body.substr(body.rfind('\n') + 1);
  const std::size_t pairs = line.find(kBeforePairs);
  if (pairs == std::string_view::npos) Refuse("its last line has no figures");
  line.remove_prefix(pairs + kBeforePairs.size());
  while (!line.empty()) {
    const std::size_t end = line.find(';');
    log.scalars.push_back(ReadStatusPair(line.substr(0, end)));
    line.remove_prefix(end == std::string_view::npos ? line.size() : end + 1);
  }
  std::ranges::stable_sort(log.scalars, {}, &ScalarRow::key);
}

}  // namespace

std::variant<ExportedLog, std::string> ReadExportedLog(std::string_view bytes) try {
  ExportedLog log;
  const std::size_t end = bytes.find('\n');
  std::optional<Date> created = ReadHeader(bytes.substr(0, end), log);
  const std::string_view body =
      end == std::string_view::npos ? std::string_view() : bytes.substr(end + 1);
  if (log.type == kStatusLogType) {
    ReadStatusLog(body, created, log);
  } else {
    ReadAggregatedLog(body, created, log);
  }
  if (!created) Refuse("it does not say when it was created");
  log.created = Rfc3339(*created);
  return log;
} catch (const Unreadable& refusal) {
  return refusal.why;
}

}  // namespace quorlet
