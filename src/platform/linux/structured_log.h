// The structured log: structured.jsonl, one JSON object a line
// ({"type":172,"time":"2026-03-04T05:06:07Z","data":{…}}), and structured-<yyyymmdd>.jsonl beside
// it for the days before today.
#ifndef QUORLET_PLATFORM_LINUX_STRUCTURED_LOG_H_
#define QUORLET_PLATFORM_LINUX_STRUCTURED_LOG_H_

#include <sys/types.h>

#include <string>
#include <string_view>
#include <utility>

#include "platform/linux/descriptor.h"
#include "values/property_value.h"

namespace quorlet {

class StructuredLog {
 public:
  explicit StructuredLog(std::string directory) : directory_(std::move(directory)) {}

  // Appends `line`, which has no line break, as a line of its own, even where a crash cut the last
  // one off; 0, or the errno with the log as it was.
  [[nodiscard]] int append(std::string_view line) const;

  // Lines that are to reach the log together. Staging begins without any; publishing puts them all
  // into the log, once, however often it was cut short before; a power cut may lose them.
  [[nodiscard]] int beginStaging() const;
  [[nodiscard]] int stageLine(std::string_view line) const;
  [[nodiscard]] int publishStaged() const;

  // Makes the lines in the log durable.
  [[nodiscard]] int sync() const;

  // Moves the lines of days before `now`'s to their days' files; 0, or the errno with every line
  // still in one place. A line whose time cannot be read goes with the line before it. Whenever the
  // move is killed, the next call leaves every line in one place. Nothing is written when there is
  // nothing to move.
  [[nodiscard]] int moveOldLines(Date now);

  // Whoever changes the log holds this lock file.
  std::string lockPath() const { return directory_ + "/.structured.lock"; }
  std::string path() const { return directory_ + "/structured.jsonl"; }

 private:
  struct Move;

  std::string dayPath(std::string_view day) const;
  std::string newLogPath() const { return directory_ + "/.structured.new"; }
  std::string stagedPath() const { return directory_ + "/.structured.staged"; }
  int openLog(Descriptor& log, off_t& size) const;
  int publishMarked() const;
  int appendStaged(const std::string& marked, const Descriptor& log, off_t size) const;
  int planMove(std::string_view today, Move& move) const;
  int stageDay(const Move& move, const std::string& day) const;
  int stageLog(const Move& move) const;
  int stage(const Move& move) const;
  int finishMove() const;

  std::string directory_;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_STRUCTURED_LOG_H_
