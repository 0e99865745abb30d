// The steps of the daily pass, none of which may stop a later one.
#ifndef QUORLET_COLLECTORS_RUN_STEP_H_
#define QUORLET_COLLECTORS_RUN_STEP_H_

#include <exception>

#include "platform/system_log.h"

namespace quorlet {

// Runs one step of the sequence. Steps report their own failures; what they cannot (memory that
// runs out, say) becomes one error line and must not keep the later steps from running.
template <typename Step>
void RunStep(SystemLog& log, const char* name, Step step) {
  try {
    step();
  } catch (const std::exception& failure) {
    log.error("The daily pass could not finish its step \"%s\": %s", name, failure.what());
  }
}

}  // namespace quorlet

#endif  // QUORLET_COLLECTORS_RUN_STEP_H_
