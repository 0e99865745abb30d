// An integer of 128 bits, for sums; not every processor's compiler has one.
#ifndef QUORLET_CTL_WIDE_INTEGER_H_
#define QUORLET_CTL_WIDE_INTEGER_H_

#include <cstdint>
#include <limits>

namespace quorlet {

// Wraps beyond 128 bits.
class WideInteger {
 public:
  constexpr WideInteger() = default;
  constexpr WideInteger(std::int64_t number)
      : high_(number < 0 ? kAllOnes : 0), low_(static_cast<std::uint64_t>(number)) {}

  constexpr WideInteger& operator+=(const WideInteger& other) {
    low_ += other.low_;
    high_ += other.high_ + (low_ < other.low_ ? 1 : 0);
    return *this;
  }
  constexpr WideInteger& operator-=(const WideInteger& other) {
    high_ -= other.high_ + (low_ < other.low_ ? 1 : 0);
    low_ -= other.low_;
    return *this;
  }

  constexpr bool isNegative() const { return (high_ & kHighestBit) != 0; }
  constexpr bool isPositive() const { return !isNegative() && (high_ | low_) != 0; }
  // The nearest number of 64 bits.
  constexpr std::int64_t saturated() const {
    const bool fits = high_ == ((low_ & kHighestBit) != 0 ? kAllOnes : 0);
    if (fits) return static_cast<std::int64_t>(low_);
    return isNegative() ? std::numeric_limits<std::int64_t>::min()
                        : std::numeric_limits<std::int64_t>::max();
  }

 private:
  static constexpr std::uint64_t kAllOnes = ~std::uint64_t{0};
  static constexpr std::uint64_t kHighestBit = std::uint64_t{1} << 63;
  std::uint64_t high_ = 0;
  std::uint64_t low_ = 0;
};

}  // namespace quorlet

#endif  // QUORLET_CTL_WIDE_INTEGER_H_
