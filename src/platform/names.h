// Names that several parts use: preference domains and keys, the service, types of logs.
#ifndef QUORLET_PLATFORM_NAMES_H_
#define QUORLET_PLATFORM_NAMES_H_

namespace quorlet {

// What passes and taskings remember; also the name of the service.
inline constexpr char kPassDomain[] = "nuvex.aggregated.quorlet";
inline constexpr char kServiceName[] = "nuvex.aggregated.quorlet";
// The day of the last gated pass.
inline constexpr char kGateDay[] = "LastCrashLogSerializationDateInDaysSince1970";
// What collectors and the status log remember.
inline constexpr char kCollectorsDomain[] = "nuvex.diagwell.quorlet";
// The owner's consent.
inline constexpr char kConsentDomain[] = "nuvex.diagwell";
inline constexpr char kSubmissionEnabled[] = "SubmissionEnabled";

inline constexpr char kAggregatedLogType[] = "193";
inline constexpr char kAggregatedLogName[] = "log-aggregated";
inline constexpr char kStatusLogType[] = "165";

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_NAMES_H_
