// Texts of channels and samples: one line a channel, one line a record.
#include "channels/descriptions.h"

#include <errno.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdarg>
#include <cstdio>

#include "channels/units.h"
#include "channels/value_accessors.h"
#include "drvreport/drvreport.h"
#include "values/text.h"

namespace quorlet {
namespace {

// Numbers only, so that a line's length is known: strings may hold anything and go past this.
[[gnu::format(printf, 1, 2)]] std::string Printed(const char* format, ...) {
  std::array<char, 400> text{};  // the largest double has 309 digits
  std::va_list arguments;
  va_start(arguments, format);
  std::vsnprintf(text.data(), text.size(), format, arguments);
  va_end(arguments);
  return text.data();
}

std::string Hexadecimal(std::int64_t value) {
  return Printed("%#llx", static_cast<unsigned long long>(value));
}

std::string Column(std::int64_t value) { return Printed("%12lld", static_cast<long long>(value)); }

// Bytes are counted, as printf counts them; a text may hold zero bytes.
std::string RightAligned(std::string_view text, std::size_t width) {
  std::string out(width - std::min(width, text.size()), ' ');
  return out += text;
}

std::optional<std::string> CopyOf(const std::string* text) {
  return text == nullptr ? std::nullopt : std::optional(*text);
}

constexpr std::size_t kMaxDescriptionBytes = std::size_t{64} << 20;
constexpr std::size_t kMaxColumns = 256;  // of a line, without its strings
static_assert(kMaxDescriptionBytes / 0xFFFF > kMaxColumns);

// What the lines of one sample have in common, read once: a sample has up to 65,535 records.
struct SampleLines {
  Dictionary& sample;
  std::string prefix;
  std::string name;
  std::optional<std::string> unitLabel;
  ElementRun run;

  // False when the text would be absurdly long: a driver chooses the name and the records.
  bool fit() const {
    const std::size_t line = prefix.size() + name.size() + (unitLabel ? unitLabel->size() : 0);
    return line <= kMaxDescriptionBytes / std::max<std::size_t>(run.count(), 1) - kMaxColumns;
  }
  std::string simpleLines() const;
  std::string stateLines() const;
  std::optional<std::string> histogramLines() const;
};

std::string SampleLines::simpleLines() const {
  std::string out;
  const std::string value = Column(DrvReportSimpleGetIntegerValue(sample));
  for (std::size_t i = 0; i < run.count(); ++i) {
    out += FormatText("%s%s = { %s %@ }\n", prefix, RightAligned(name, 32), value, unitLabel);
  }
  return out;
}

std::string SampleLines::stateLines() const {
  const Array* names = getStateNames(sample);
  const auto sum = sumOfResidencies(sample);
  const std::uint64_t unit = DrvReportChannelGetUnit(sample);
  const auto states = ElementRun::Counted(sample, kDrvReportFormatState);
  constexpr std::int64_t kNone = kDrvReportInvalidValue;
  std::string out;
  for (std::size_t i = 0; i < run.count(); ++i) {
    const ElementValues state = states ? states->values(i) : ElementValues{kNone, kNone, kNone};
    const std::string* kept =
        names != nullptr && i < names->size() ? (*names)[i].asString() : nullptr;
    const double seconds =
        DrvReportScaleValue(static_cast<std::uint64_t>(state[2]), unit, kSecondsUnit);
    out += FormatText("%s%s[%s] = { # %s s / %s }\n", prefix, RightAligned(name, 20),
                      RightAligned(kept != nullptr ? *kept : Hexadecimal(state[0]), 8),
                      Printed("%-8llu %9.3e", static_cast<unsigned long long>(state[1]), seconds),
                      Printed("%4.1f%%", dutyCycle(state[2], sum) * 100));
  }
  return out;
}

std::optional<std::string> SampleLines::histogramLines() const {
  const auto buckets = ElementRun::Counted(sample, kDrvReportFormatHistogram);
  std::string out;
  for (std::size_t i = 0; i < run.count(); ++i) {
    std::int64_t lower = 0, upper = 0;
    if (DrvReportHistogramGetBucketBounds(sample, static_cast<std::int32_t>(i), &lower, &upper) !=
            kKernelSuccess ||
        !buckets) {
      return std::nullopt;
    }
    const auto [hits, minimum, maximum, sum] = buckets->values(i);
    if (hits == kDrvReportInvalidValue) return std::nullopt;
    out += FormatText("%s%s[%s - %s %@] = { ", prefix, RightAligned(name, 20), Column(lower),
                      Column(upper), unitLabel);
    if (hits == 0) {
      out += "<no hits>; # 0 }\n";
    } else {
      out += Printed("m %12lld; M %12lld; s %12lld; # %12llu }\n", static_cast<long long>(minimum),
                     static_cast<long long>(maximum), static_cast<long long>(sum),
                     static_cast<unsigned long long>(hits));
    }
  }
  return out;
}

// The channel ID stands in for a name that is missing, empty or not UTF-8.
std::string NameColumn(Dictionary& sample, const ElementRun& run) {
  const std::string* name = DrvReportChannelGetChannelName(sample);
  auto text = name == nullptr ? std::nullopt : _copyUTF8String(*name);
  return text ? *std::move(text) : Hexadecimal(static_cast<std::int64_t>(run.channelID(0)));
}

}  // namespace

std::optional<std::string> _copyUTF8String(std::string_view text) {
  if (text.empty() || !IsValidUtf8(text)) return std::nullopt;
  return std::string(text);
}

std::optional<std::string> DrvReportChannelCopyDescription(Dictionary& channel, std::uint64_t,
                                                           std::string_view prefix) {
  std::uint64_t type = 0;
  if (getChannelType(channel, type) != kKernelSuccess) return std::nullopt;
  const std::string* group = DrvReportChannelGetGroup(channel);
  const std::string* subGroup = DrvReportChannelGetSubGroup(channel);
  constexpr std::string_view kNoGroup = "(none)";
  return FormatText("%s%@ %@ < %s (%@) | G/g %@/%@ | cat %s | format %s | elts %u >\n", prefix,
                    CopyOf(DrvReportChannelGetDriverName(channel)),
                    CopyOf(DrvReportChannelGetChannelName(channel)),
                    Hexadecimal(DrvReportChannelGetChannelID(channel)),
                    CopyOf(DrvReportChannelGetUnitLabel(channel)),
                    group == nullptr ? kNoGroup : std::string_view(*group),
                    subGroup == nullptr ? kNoGroup : std::string_view(*subGroup),
                    Printed("%#04x", static_cast<unsigned>(DrvReportChannelGetCategories(channel))),
                    Printed("%#04x", static_cast<unsigned>(formatOfType(type))),
                    elementCountOfType(type));
}

std::optional<std::string> DrvReportSampleCopyDescription(Dictionary& sample, std::uint64_t,
                                                          std::string_view prefix) {
  const std::uint8_t format = DrvReportChannelGetFormat(sample);
  const auto run = ElementRun::Of(sample, format);
  if (!run) return std::nullopt;
  const SampleLines lines{.sample = sample,
                          .prefix = std::string(prefix),
                          .name = NameColumn(sample, *run),
                          .unitLabel = CopyOf(DrvReportChannelGetUnitLabel(sample)),
                          .run = *run};
  if (!lines.fit()) return std::nullopt;
  switch (format) {
    case kDrvReportFormatSimple:
      return lines.simpleLines();
    case kDrvReportFormatState:
      return lines.stateLines();
    case kDrvReportFormatHistogram:
      return lines.histogramLines();
    case kDrvReportFormatArray: {
      std::string out;
      for (std::size_t i = 0; i < run->count(); ++i) out += "arrays unsupported?";
      return out;
    }
    default:
      return std::nullopt;
  }
}

std::string DrvReportCopyCurrentProcessName() {
  return FormatText("%s <pid %d>", program_invocation_short_name, getpid());
}

KernelReturn DrvReportWriteStringUTF8(int fd, const std::string* text) {
  if (text == nullptr) return kKernelBadArgument;
  if (!IsValidUtf8(*text)) return kKernelNoMemory;
  const ssize_t written = write(fd, text->data(), text->size());
  if (written < 0) return kDrvReportWriteFailed;
  return static_cast<std::size_t>(written) < text->size() ? kDrvReportWriteShort : kKernelSuccess;
}

}  // namespace quorlet
