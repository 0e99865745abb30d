// The diagnostics-submission library: logs handed over for later submission.
#ifndef QUORLET_PLATFORM_DIAGNOSTICS_H_
#define QUORLET_PLATFORM_DIAGNOSTICS_H_

#include <functional>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "drvreport/property_value.h"

namespace quorlet {

// Where the body of a log goes while it is being written.
class LogOutput {
 public:
  virtual ~LogOutput() = default;
  // False when the bytes could not be written; the log then fails as a whole.
  virtual bool write(std::string_view bytes) = 0;
};

// A log to be written.
struct LogRequest {
  std::string_view typeCode;  // a decimal number
  std::string_view name;
  std::optional<Dictionary> metadata;
  // Called with the name of the log's file before that can be seen; may be empty. It must not use
  // the diagnostics.
  std::function<void(const std::string& fileName)> beforePublication;
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
  // that it does not, and one line in the system log says why: an error, or, while submission is
  // not enabled, for information.
  bool DGWWriteLogForSubmission(std::string_view typeCode, std::string_view name,
                                const std::optional<Dictionary>& metadata,
                                const LogWriter& writer) {
    return writeLog({typeCode, name, metadata, {}}, writer);
  }
  virtual bool writeLog(const LogRequest& request, const LogWriter& writer) = 0;

  // Whether a log of that file name has been written and not been taken away.
  virtual bool hasLog(const std::string& fileName) = 0;
  // Removes logs durably; one that is gone already is no failure. False after an error line.
  virtual bool removeLogs(std::span<const std::string> fileNames) = 0;
  // Removes every log durably. False after an error line.
  virtual bool removeAllLogs() = 0;

  // Hands every log written so far to the uploader; while submission is not enabled, none.
  virtual void SubmitDiagnosticLogs() = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_DIAGNOSTICS_H_
