// The time of day.
#ifndef QUORLET_PLATFORM_CLOCK_H_
#define QUORLET_PLATFORM_CLOCK_H_

#include "drvreport/property_value.h"

namespace quorlet {

class Clock {
 public:
  virtual ~Clock() = default;

  // The current instant.
  virtual Date now() = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_CLOCK_H_
