// The diagnostics-submission library: logs handed over for later submission.
#ifndef QUORLET_PLATFORM_DIAGNOSTICS_H_
#define QUORLET_PLATFORM_DIAGNOSTICS_H_

#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "values/property_value.h"

namespace quorlet {

// Where the body of a log goes while it is being written.
class LogOutput {
 public:
  virtual ~LogOutput() = default;
  // False when the bytes could not be written; the log then fails as a whole.
  virtual bool write(std::string_view bytes) = 0;
};

class Diagnostics {
 public:
  using LogWriter = std::function<bool(LogOutput& output)>;

  virtual ~Diagnostics() = default;

  // Whether the device's owner has opted in to submitting logs.
  virtual bool DiagnosticLogSubmissionEnabled() = 0;

  // The running OS version, for people; never empty.
  virtual std::string DGWOSVersion() = 0;

  // A value of the diagnostics tasking, or nothing.
  virtual std::optional<PropertyValue> DGWGetDATaskingValue(std::string_view name) = 0;

  // Creates a log of type `typeCode` (a decimal number) for later submission, with `writer`
  // writing its body before the call returns. The log appears whole or not at all; false says
  // that it does not, and one error line in the system log says why.
  virtual bool DGWWriteLogForSubmission(std::string_view typeCode, std::string_view name,
                                        const std::optional<Dictionary>& metadata,
                                        const LogWriter& writer) = 0;

  // Hands every log written so far to the uploader.
  virtual void SubmitDiagnosticLogs() = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_DIAGNOSTICS_H_
