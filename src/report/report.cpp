#include "report/report.h"

#include <cmath>
#include <limits>

namespace quorlet {
namespace {

constexpr std::int64_t kMaxInt64 = std::numeric_limits<std::int64_t>::max();
constexpr std::int64_t kMinInt64 = std::numeric_limits<std::int64_t>::min();

std::uint64_t Magnitude(std::int64_t value) {
  const auto bits = static_cast<std::uint64_t>(value);
  return value < 0 ? 0 - bits : bits;
}

// The nearest multiple of `interval`, half-way cases away from zero, saturated.
std::int64_t RoundToInterval(std::int64_t value, std::uint64_t interval) {
  if (interval == 0) return 0;
  // No step overflows: a magnitude is at most 2^63, half an interval less than that.
  const std::uint64_t rounded = (Magnitude(value) + interval / 2) / interval * interval;
  if (value < 0)
    return rounded >= Magnitude(kMinInt64) ? kMinInt64 : -static_cast<std::int64_t>(rounded);
  return rounded >= static_cast<std::uint64_t>(kMaxInt64) ? kMaxInt64
                                                          : static_cast<std::int64_t>(rounded);
}

// `value` (not 0) to `digits` significant digits, half-way cases away from zero, saturated.
std::int64_t RoundToDigits(std::int64_t value, std::uint64_t digits) {
  const double exponent =
      std::ceil(std::log10(static_cast<double>(Magnitude(value)))) - static_cast<double>(digits);
  if (exponent < 1) return value;
  const double power = std::pow(10, exponent);
  const double rounded = power * std::round(static_cast<double>(value) / power);
  if (rounded >= 0x1p63) return kMaxInt64;
  if (rounded < -0x1p63) return kMinInt64;
  return static_cast<std::int64_t>(rounded);
}

}  // namespace

TLReport::TLReport(Platform& platform, UsedUp& usedUp)
    : _platform(platform),
      _usedUp(usedUp),
      _config(TLConfig::init(platform, &_isWhitelistUnreadable)) {}

ReportOutcome TLReport::writeLogForYesterdayWithAppInfo(std::int32_t yesterday,
                                                        const std::optional<Array>& appInfo) {
  bool allRead = true;
  _platform.log.info("writing aggregated log. yesterday=%d", yesterday);
  if (const auto history = _platform.counterStore.initWithDefaultPath()) {
    const std::int32_t before = yesterday > std::numeric_limits<std::int32_t>::min()
                                    ? yesterday - 1
                                    : std::numeric_limits<std::int32_t>::min();
    history->scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
        "", before, yesterday,
        [this](std::string_view key, std::int32_t, std::int64_t value, bool&) {
          if (const auto options = optionsForScalarKey(key)) {
            addScalarForKeyWithOptions(value, key, *options);
          }
        });
    history->distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
        "", before, yesterday,
        [this](std::string_view key, std::int32_t, TLHistoryDistributionEnumerator& values, bool&) {
          if (!_config) return;
          if (const auto options = _config->configOptionsForDistributionKey(key)) {
            computeAndAddDistributionForKeyWithOptions(values, key, *options);
          }
        });
    allRead = !history->failed();
  }
  if (_scalarsOutput.empty() && _distributionsOutput.empty() && _histogramsOutput.empty()) {
    // Without a whitelist there is nothing to report; one that cannot be read hides what there is.
    const bool isLost = !allRead || _isWhitelistUnreadable;
    return isLost ? ReportOutcome::kLost : ReportOutcome::kNothingToReport;
  }
  return serializeWithDateAndAppInfo(yesterday, appInfo) ? ReportOutcome::kWritten
                                                         : ReportOutcome::kLost;
}

std::int64_t TLReport::addScalarForKeyWithOptions(std::int64_t value, std::string_view key,
                                                  const KeyOptions& options) {
  if (!options.empty()) {
    reportFaultyOptions(options, key, KeyKind::kScalar);
    if (const auto interval = RoundingOption(options, kBucketInterval)) {
      value = RoundToInterval(value, *interval);
    }
    if (const auto digits = RoundingOption(options, kSigFig); digits && value != 0) {
      value = RoundToDigits(value, *digits);
    }
  }
  _scalarsOutput[key] = Int64(value);
  return value;
}

void TLReport::addScalarForKeyByExecutingBlock(std::string_view key,
                                               const std::function<std::int64_t()>& producer) {
  if (const auto options = optionsForScalarKey(key)) {
    addScalarForKeyWithOptions(producer(), key, *options);
  }
}

std::optional<KeyOptions> TLReport::optionsForScalarKey(std::string_view key) const {
  return _config ? _config->configOptionsForScalarKey(key) : std::nullopt;
}

void TLReport::reportFaultyOptions(const KeyOptions& options, std::string_view key, KeyKind kind) {
  const auto faults = KeyOptionFaults(options, kind);
  if (faults.empty()) return;
  // A prefix may bring the same options to thousands of keys.
  if (!_faultyOptions.try_emplace(options.identity(), options).second) return;
  for (const std::string& fault : faults) {
    _platform.log.error("Ignoring a whitelist option for key %@: %@", key, fault);
  }
}

}  // namespace quorlet
