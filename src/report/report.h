// TLReport: the in-memory model of one day's aggregated log.
#ifndef QUORLET_REPORT_REPORT_H_
#define QUORLET_REPORT_REPORT_H_

#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "drvreport/property_value.h"
#include "platform/platform.h"
#include "report/config.h"

namespace quorlet {

// What a log tells once only, since telling uses it up.
struct UsedUp {
  // Database corruptions that an earlier log took off the count and that the next log is to tell.
  std::int64_t corruptions = 0;
  // Those that this log took off: the change is pending in the preferences, domain
  // "nuvex.aggregated".
  std::int64_t corruptionsTaken = 0;
};

enum class ReportOutcome {
  kNothingToReport,
  kWritten,
  kLost  // the counters could not be read, or the log not be written; the system log says why
};

// In the preferences of domain "nuvex.aggregated.quorlet" while a log that tells of a new OS
// version is not known to be spooled: {"version": the version before, "day": the log's day}.
inline constexpr char kOSVersionBefore[] = "LastOSVersionBefore";

// A report is made for one day, used once and discarded. KeyOptions are the whitelist's options
// of a key (report/config.h).
class TLReport {
 public:
  // Loads the whitelist; without one the report stays empty.
  explicit TLReport(Platform& platform) : TLReport(platform, _nothingUsedUp) {}
  // The same; `usedUp` must outlive the report.
  TLReport(Platform& platform, UsedUp& usedUp);

  // Reads the whitelisted scalars and distributions of day `yesterday` from the counter store and
  // hands the aggregated log to the diagnostics library, if there is anything to report.
  // `appInfo`: app-info records, put into the log as they are. Call it at most once.
  ReportOutcome writeLogForYesterdayWithAppInfo(std::int32_t yesterday,
                                                const std::optional<Array>& appInfo);

  // Rounds `value` as `options` ask, stores it under `key` (replacing) and returns what was stored.
  std::int64_t addScalarForKeyWithOptions(std::int64_t value, std::string_view key,
                                          const KeyOptions& options);

  // Runs `producer` and adds its result, if `key` is whitelisted; otherwise does nothing.
  void addScalarForKeyByExecutingBlock(std::string_view key,
                                       const std::function<std::int64_t()>& producer);

  // Consumes `values` and stores the key's [minimum, maximum, mean, sum of squared deviations,
  // count] and, when the options have "intervals", its histogram. NaN values are left out; a
  // distribution whose values could not all be read is, with an error line.
  void computeAndAddDistributionForKeyWithOptions(TLHistoryDistributionEnumerator& values,
                                                  std::string_view key, const KeyOptions& options);

  // The bucket of `value`: the index of the first bound that is not less, or the number of bounds.
  // `intervals` must not descend; of bounds in any order, the largest so far at each position
  // give the same answers.
  static std::uint32_t determineHistBucketForValueWithIntervals(double value,
                                                                std::span<const double> intervals);

  // Label -> count for the buckets with a count; nothing when there are none. `intervals` holds n
  // bounds, `counts` n + 1 counters.
  static std::optional<Dictionary> histogramDictForIntervalsWithHistCounts(
      const Array& intervals, std::span<const std::uint64_t> counts);

  const Dictionary& scalarsOutput() const { return _scalarsOutput; }
  const Dictionary& distributionsOutput() const { return _distributionsOutput; }
  const Dictionary& histogramsOutput() const { return _histogramsOutput; }

 private:
  bool serializeWithDateAndAppInfo(std::int32_t yesterday, const std::optional<Array>& appInfo);
  std::optional<KeyOptions> optionsForScalarKey(std::string_view key) const;
  // One error line for each option that will not work, once for each options dictionary.
  void reportFaultyOptions(const KeyOptions& options, std::string_view key, KeyKind kind);
  Dictionary assembleDocument(std::int32_t yesterday, const std::string& whitelistDigest,
                              const std::optional<Array>& appInfo);
  void addInstalledAppInfo();
  void addMetadataKeys();
  void reportDatabaseSize();
  void reportCPUUptime();
  void reportVMStats();

  Platform& _platform;
  UsedUp _nothingUsedUp;
  UsedUp& _usedUp;
  bool _isWhitelistUnreadable = false;
  std::optional<TLConfig> _config;
  Dictionary _scalarsOutput;
  Dictionary _distributionsOutput;
  Dictionary _histogramsOutput;
  Dictionary _metadataOutput;
  // Options that error lines have been written about, by identity; the handle keeps the identity
  // from being given to others.
  std::unordered_map<const void*, KeyOptions> _faultyOptions;
};

}  // namespace quorlet

#endif  // QUORLET_REPORT_REPORT_H_
