// Sample drivers for "quorletctl init --demo".
#ifndef QUORLET_CTL_DEMO_DRIVERS_H_
#define QUORLET_CTL_DEMO_DRIVERS_H_

#include "drvreport/property_value.h"

namespace quorlet {

// The hub of the reporting channels.
Dictionary DemoHub();

// A network controller that publishes simple channels for the daily record, and a state and a
// histogram channel, with what they report.
Dictionary DemoNetworkDriver();

// A flash-storage controller of two channels: its statistics, block validity, telemetry, defects,
// and its snapshot with the header that describes it.
Dictionary DemoStorageDriver();

}  // namespace quorlet

#endif  // QUORLET_CTL_DEMO_DRIVERS_H_
