// One line of the StatsD protocol: "name:value|type", with its extensions.
#ifndef QUORLET_CTL_STATSD_LINE_H_
#define QUORLET_CTL_STATSD_LINE_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

namespace quorlet {

// Keys longer than this are refused.
inline constexpr std::size_t kLongestRecordedKey = 200;

// Why a line was not recorded.
enum class Refusal {
  kUnreadable,
  kKeyTooLong,
  kKeyBytes,
  kSet,
  kEvent,
  kServiceCheck,
  kNotInWhitelist,
  kReserved,
  kTooManyKeys,
  kTooManyKeysOfUser,
  kTooManyValues,
  kStoreFull,
  kNone,  // it was
};
inline constexpr std::size_t kRefusalCount = 12;

enum class StatsdKind { kCounter, kGauge, kValues };

struct StatsdNumber {
  double real = 0;
  // The number itself when it is whole and has 64 bits, which a double may not tell exactly.
  std::optional<std::int64_t> whole;
  bool isSigned = false;  // it was written with "+" or "-" in front
};

// A line that was read. The key lies in the text that was parsed.
struct StatsdLine {
  std::string_view key;
  StatsdKind kind = StatsdKind::kCounter;
  std::vector<StatsdNumber> numbers;  // at least one, all finite
  double rate = 1;                    // above 0, at most 1
};

// Reads a line without its line break into `line`, whose vector is used again. Where it was not
// read, `line` holds nothing of use.
[[nodiscard]] Refusal ParseStatsdLine(std::string_view text, StatsdLine& line);

// Takes the next line off the front of a datagram's text; lines without any byte are passed over.
// Nothing at the end.
std::optional<std::string_view> NextStatsdLine(std::string_view& text);

}  // namespace quorlet

#endif  // QUORLET_CTL_STATSD_LINE_H_
