#ifndef QUORLET_TESTS_FAKES_FAKE_CLOCK_H_
#define QUORLET_TESTS_FAKES_FAKE_CLOCK_H_

#include "platform/clock.h"

namespace quorlet {

// A clock that stands still until a test moves it; it starts at noon of day 20000.
class FakeClock : public Clock {
 public:
  Date now() override { return {seconds}; }
  void goToDay(std::int32_t day) { seconds = day * 86400.0 + 43200; }

  double seconds = 20000 * 86400.0 + 43200;
};

}  // namespace quorlet

#endif  // QUORLET_TESTS_FAKES_FAKE_CLOCK_H_
