// The system log: syslog(3), a file, or standard error.
//
// A line of the file: 2026-03-04T05:06:07Z default quorlet[123]: text
//
// Whatever a message holds, it stays one entry: ill-formed UTF-8 becomes U+FFFD; a line break (LF,
// or CR LF) is followed by a tab; every other control character, and the Unicode line separators
// that some readers break lines at, becomes \xNN for each of its bytes. One line break at the end
// of a message is dropped.
#include <syslog.h>

#include <array>
#include <cmath>
#include <mutex>

#include "platform/linux/base/descriptor.h"
#include "platform/linux/base/paths.h"
#include "platform/linux/base/services.h"
#include "values/digits.h"

namespace quorlet {
namespace {

constexpr char kLogName[] = "/quorlet.log";
constexpr char kIdent[] = "quorlet";

struct LevelInfo {
  const char* name;
  int priority;
};

LevelInfo Describe(LogLevel level) {
  switch (level) {
    case LogLevel::kDebug:
      return {"debug", LOG_DEBUG};
    case LogLevel::kInfo:
      return {"info", LOG_INFO};
    case LogLevel::kDefault:
      return {"default", LOG_NOTICE};
    case LogLevel::kError:
      break;
  }
  return {"error", LOG_ERR};
}

// The length of the character at the start of valid UTF-8 `text` that must not reach the log as it
// is, or 0 when the character is harmless.
std::size_t HarmfulLength(std::string_view text) {
  const auto first = static_cast<unsigned char>(text.front());
  if (first == 0x7f || (first < 0x20 && first != '\t')) return 1;
  if (first == 0xc2 && static_cast<unsigned char>(text[1]) < 0xa0) return 2;  // U+0080 to U+009F
  if (text.starts_with("\xe2\x80\xa8") || text.starts_with("\xe2\x80\xa9")) return 3;
  return 0;
}

std::string OneEntry(std::string_view message) {
  const std::string repaired = RepairUtf8(message);
  std::string_view rest = repaired;
  if (rest.ends_with('\n')) rest.remove_suffix(1);
  if (rest.ends_with('\r')) rest.remove_suffix(1);
  std::string entry;
  if (PrintableAsciiPrefix(rest) == rest.size()) return std::string(rest);
  entry.reserve(rest.size());
  while (!rest.empty()) {
    const std::size_t lineBreak = rest.starts_with("\r\n") ? 2 : rest.starts_with('\n') ? 1 : 0;
    const std::size_t harmful = lineBreak != 0 ? lineBreak : HarmfulLength(rest);
    if (lineBreak != 0) {
      entry += "\n\t";
    } else if (harmful == 0) {
      entry += rest.front();
    } else {
      for (const char c : rest.substr(0, harmful)) {
        entry += "\\x";
        AppendHex(entry, c);
      }
    }
    rest.remove_prefix(harmful == 0 ? 1 : harmful);
  }
  return entry;
}

class StandardErrorLog : public SystemLog {
 public:
  void write(LogLevel level, std::string_view text) override {
    const std::string line = std::string(Describe(level).name) + ": " + OneEntry(text) + "\n";
    (void)WriteFully(STDERR_FILENO, line);
  }
};

class SyslogLog : public SystemLog {
 public:
  void write(LogLevel level, std::string_view text) override {
    std::call_once(opened_, [] { openlog(kIdent, LOG_PID, LOG_DAEMON); });
    syslog(Describe(level).priority, "%s", OneEntry(text).c_str());
  }

 private:
  std::once_flag opened_;
};

class FileLog : public SystemLog {
 public:
  FileLog(const Root& root, Clock& clock)
      : clock_(clock), directory_(root.path(kSystemLogDirectory)), path_(directory_ + kLogName) {}

  ~FileLog() override { (void)flush(); }

  void write(LogLevel level, std::string_view text) override {
    const std::lock_guard lock(mutex_);
    const std::size_t start = waiting_.size();
    appendTime();
    waiting_.append(" ").append(Describe(level).name).append(" ").append(ident_);
    waiting_.append(OneEntry(text)).append("\n");
    // A pass may have thousands of debug lines; one system call for each would be most of its time.
    if (level == LogLevel::kDebug && waiting_.size() < kMostWaiting) return;
    const std::string line = level == LogLevel::kError ? waiting_.substr(start) : "";
    if (!flush()) (void)WriteFully(STDERR_FILENO, line);
  }

 private:
  static constexpr std::size_t kMostWaiting = 65536;

  void appendTime() {
    const double second = std::floor(clock_.now().secondsSince1970);
    if (second != timeSecond_) {
      timeSecond_ = second;
      timeText_ = Rfc3339({second});
    }
    waiting_ += timeText_;
  }

  // Writes the lines that wait. They are gone afterwards, written or not.
  bool flush() {
    const std::string lines = std::exchange(waiting_, {});
    if (lines.empty()) return true;
    if (!file_.isOpen()) {
      struct stat status = {};
      if (MakeDirectories(directory_) != 0 ||
          OpenRegularFile(path_, O_WRONLY | O_CREAT | O_APPEND, file_, status) != 0) {
        return false;
      }
    }
    // A line that a full disk cut short is ended, so that it does not spoil the next one.
    const std::string entry = cutShort_ ? "\n" + lines : lines;
    const ssize_t written =
        Uninterrupted([&] { return ::write(file_.get(), entry.data(), entry.size()); });
    const bool complete = written == static_cast<ssize_t>(entry.size());
    if (written > 0) cutShort_ = !complete;
    return complete;
  }

  Clock& clock_;
  const std::string directory_;
  const std::string path_;
  const std::string ident_ = std::string(kIdent) + "[" + std::to_string(getpid()) + "]: ";
  std::mutex mutex_;
  // Debug lines wait here for a message of a higher level, or the end.
  std::string waiting_;
  double timeSecond_ = -1;
  std::string timeText_ = Rfc3339({-1});
  Descriptor file_;
  bool cutShort_ = false;
};

}  // namespace

std::unique_ptr<SystemLog> MakeLinuxSystemLog(const Root& root, Access access, Clock& clock) {
  if (access == Access::kReadOnly) return MakeStandardErrorLog();
  if (root.isMachine()) return std::make_unique<SyslogLog>();
  return std::make_unique<FileLog>(root, clock);
}

std::unique_ptr<SystemLog> MakeStandardErrorLog() { return std::make_unique<StandardErrorLog>(); }

}  // namespace quorlet
