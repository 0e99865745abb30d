// The structured log: structured.jsonl, one JSON object a line
// ({"type":172,"time":"2026-03-04T05:06:07Z","data":{…}}), and structured-<yyyymmdd>.jsonl beside
// it for the days before today. Errors are errno values or kLogIsFull, 0 is success.
#ifndef QUORLET_PLATFORM_LINUX_LOGS_STRUCTURED_LOG_H_
#define QUORLET_PLATFORM_LINUX_LOGS_STRUCTURED_LOG_H_

#include <sys/types.h>

#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "drvreport/property_value.h"

namespace quorlet {

class StructuredLog {
 public:
  // What the files may hold together; the oldest days go first.
  static constexpr off_t kMostBytes = off_t{16} << 20;
  // What some lines may take beyond that.
  static constexpr off_t kReservedBytes = off_t{1} << 20;
  static constexpr int kMostDays = 30;
  static constexpr int kLogIsFull = -1;  // even without the days before today
  enum class Share { kCommon, kReserved };

  explicit StructuredLog(std::string directory) : directory_(std::move(directory)) {}

  // Appends `lines`, with breaks between them, as lines of their own, even where a crash cut the
  // last one off. After an error the log is as it was.
  [[nodiscard]] int append(std::string_view lines, Share share = Share::kCommon) const;

  // Makes the log's lines durable.
  [[nodiscard]] int sync() const;

  // Drops the lines that were staged and not begun to be published; finishes what was begun.
  [[nodiscard]] int beginStaging(Date now) const;
  // As append(), to what is staged.
  [[nodiscard]] int stage(std::string_view lines) const;
  // Puts the staged lines into the log, durably, once, and moves old lines as moveOldLines() does.
  // kLogIsFull when some had no room and are gone; after another error they are still staged.
  [[nodiscard]] int publish(Date now) const;

  // Moves the lines of days before `now`'s to their days' files; after an error every line still is
  // in one place. A line whose time cannot be read goes with the line before it. Whenever the
  // move is killed, the next call leaves every line in one place. Nothing is written when there is
  // nothing to move.
  [[nodiscard]] int moveOldLines(Date now) const;

  // Removes the files of days that are more than kMostDays before `now`, and the oldest ones until
  // the rest is within its bounds.
  [[nodiscard]] int dropOldDays(Date now) const;

  // Whoever changes the log holds this lock file.
  std::string lockPath() const { return directory_ + "/.structured.lock"; }
  std::string path() const { return directory_ + "/structured.jsonl"; }

 private:
  struct Move;
  struct Usage {
    std::vector<std::pair<std::string, off_t>> days;  // paths and sizes, the oldest first
    off_t total = 0;                                  // with the log
  };

  std::string dayPath(std::string_view day) const;
  std::string newLogPath() const { return directory_ + "/.structured.new"; }
  std::string stagedPath() const { return directory_ + "/.structured.staged"; }

  int measure(Usage& usage) const;
  int makeRoom(off_t bytes, off_t limit) const;

  int inodeOfLog(std::string& inode) const;
  int replaceLog(Date now) const;
  int planMove(std::string_view today, Move& move) const;
  int scanLog(std::string_view today, Move& move) const;
  int scanStaged(Move& move) const;
  int stageDay(const Move& move, const std::string& day) const;
  int stageLog(const Move& move) const;
  int stageMove(const Move& move) const;
  int finishMove() const;

  std::string directory_;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_LOGS_STRUCTURED_LOG_H_
