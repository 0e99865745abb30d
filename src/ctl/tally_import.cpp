#include "ctl/tally_import.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <map>
#include <memory>
#include <optional>
#include <string_view>
#include <tuple>
#include <utility>
#include <vector>

#include "ctl/tally_lines.h"
#include "platform/linux/base/files.h"

namespace quorlet {
namespace {

// Longer than any line that a key from a command line can make.
constexpr std::size_t kMaxLineBytes = 1 << 20;
// The most that an import may take up in memory: some 30 million values.
constexpr std::size_t kMaxImportBytes = std::size_t{512} << 20;

struct CloseFile {
  void operator()(std::FILE* file) const { std::fclose(file); }
};
using File = std::unique_ptr<std::FILE, CloseFile>;

[[noreturn]] void FailReading(const std::string& file, int error) {
  throw Failure("cannot read " + file + ": " + ErrnoText(error));
}

File OpenInput(const std::string& name) {
  const bool isStandardInput = name == "-";
  const std::string shown = isStandardInput ? "standard input" : name;
  const int descriptor = isStandardInput ? ::fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, 3)
                                         : ::open(name.c_str(), O_RDONLY | O_CLOEXEC);
  if (descriptor < 0) FailReading(shown, errno);
  File file(::fdopen(descriptor, "r"));
  if (!file) {
    ::close(descriptor);
    FailReading(shown, errno);
  }
  struct stat status {};
  if (::fstat(descriptor, &status) != 0) FailReading(shown, errno);
  if (S_ISDIR(status.st_mode)) FailReading(shown, EISDIR);
  return file;
}

class LineReader {
 public:
  LineReader(std::FILE* file, std::string name) : file_(file), name_(std::move(name)) {}

  // The next line without its line break, valid until the next call; nothing at the end.
  std::optional<std::string_view> next() {
    ++number_;
    line_.clear();
    while (true) {
      const std::string_view available = std::string_view(block_.data(), end_).substr(start_);
      const std::size_t lineBreak = available.find('\n');
      const std::string_view part = available.substr(0, lineBreak);
      if (part.size() > kMaxLineBytes - line_.size()) throw Failure(wrong("is too long"));
      line_ += part;
      start_ += part.size();
      if (lineBreak != std::string_view::npos) {
        ++start_;
        return line_;
      }
      if (!fill()) break;
    }
    if (line_.empty()) return std::nullopt;
    return line_;
  }

  // `why` with the place: "import.tsv: line 3 is too long".
  std::string wrong(const std::string& why) const {
    return name_ + ": line " + std::to_string(number_) + " " + why;
  }

 private:
  bool fill() {
    start_ = 0;
    end_ = std::fread(block_.data(), 1, block_.size(), file_);
    if (end_ == 0 && std::ferror(file_)) FailReading(name_, errno);
    return end_ != 0;
  }

  std::FILE* file_;
  std::string name_;
  std::array<char, 1 << 16> block_;
  std::size_t start_ = 0;
  std::size_t end_ = 0;
  std::string line_;
  std::uint64_t number_ = 0;
};

// What the lines say, by day and key. Nothing is locked before all of it is here: a pipe may take
// its time, and a wrong line may be the last one.
class ImportedRows {
 public:
  ImportCounts counts;

  void add(ScalarLine line) {
    const auto [row, isNew] =
        scalars_.insert_or_assign({line.day, std::move(line.key)}, line.value);
    if (isNew) countRow(sizeof(*row) + row->first.second.size());
    ++counts.scalars;
  }

  void add(SampleLine line) {
    const auto [row, isNew] = values_.try_emplace({line.day, std::move(line.key)});
    if (isNew) countRow(sizeof(*row) + row->first.second.size());
    row->second.add(line.sample.value, line.sample.secondsInDay);
    bytes_ += sizeof(double) + sizeof(RecordedValues::Run);
    ++counts.values;
  }

  bool areTooMany() const { return bytes_ > kMaxImportBytes; }

  // Row by row, so that nothing is in memory twice.
  StoreChanges take() {
    StoreChanges changes;
    changes.scalars.reserve(scalars_.size());
    changes.values.reserve(values_.size());
    while (!scalars_.empty()) {
      auto row = scalars_.extract(scalars_.begin());
      auto& [day, key] = row.key();
      changes.scalars.push_back({ScalarChange::Kind::kSet, std::move(key), row.mapped(), day});
    }
    while (!values_.empty()) {
      auto row = values_.extract(values_.begin());
      RecordedValues& recorded = changes.values.emplace_back(std::move(row.mapped()));
      std::tie(recorded.day, recorded.key) = std::move(row.key());
    }
    return changes;
  }

 private:
  using DayAndKey = std::pair<std::int32_t, std::string>;

  void countRow(std::size_t bytes) {
    constexpr std::size_t kNodeBytes = 64;  // what the map and the allocator add
    bytes_ += bytes + kNodeBytes;
  }

  std::map<DayAndKey, std::int64_t> scalars_;
  std::map<DayAndKey, RecordedValues> values_;  // without their day and key
  std::size_t bytes_ = 0;
};

void ReadRows(LineReader& lines, ImportedRows& rows) {
  while (const auto line = lines.next()) {
    auto parsed = ParseTallyLine(*line);
    if (const auto* why = std::get_if<std::string>(&parsed)) {
      throw Failure(lines.wrong(line->empty() ? "is empty" : "is wrong: " + why->substr(0, 200)));
    }
    if (auto* scalar = std::get_if<ScalarLine>(&parsed)) {
      rows.add(std::move(*scalar));
    } else {
      rows.add(std::get<SampleLine>(std::move(parsed)));
    }
    if (rows.areTooMany()) throw Failure(lines.wrong("is too much for one import: split it"));
  }
}

}  // namespace

ImportCounts ImportTallies(const std::string& file, CounterStore& store, const Messages& messages) {
  ImportedRows rows;
  {
    const File input = OpenInput(file);
    LineReader lines(input.get(), file == "-" ? "standard input" : file);
    ReadRows(lines, rows);
  }
  const auto isTaken = [&store](const auto& change) { return store.takesKey(change.key); };
  const StoreChanges changes = rows.take();
  if (!std::ranges::all_of(changes.scalars, isTaken) ||
      !std::ranges::all_of(changes.values, isTaken) || !store.write(changes)) {
    throw Failure(messages.lastErrorOr("the counters could not be stored"));
  }
  return rows.counts;
}

}  // namespace quorlet
