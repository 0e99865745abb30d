#include "ctl/tally_import.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <map>
#include <memory>
#include <optional>
#include <string_view>
#include <utility>
#include <vector>

#include "ctl/tally_lines.h"

namespace quorlet {
namespace {

// Longer than any line that a key from a command line can make.
constexpr std::size_t kMaxLineBytes = 1 << 20;
// Values collected before they are handed to the store.
constexpr std::size_t kMaxPendingBytes = 4 << 20;

struct CloseFile {
  void operator()(std::FILE* file) const { std::fclose(file); }
};
using File = std::unique_ptr<std::FILE, CloseFile>;

[[noreturn]] void FailReading(const std::string& file, int error) {
  throw Failure("cannot read " + file + ": " + ErrnoText(error));
}

// A pipe may take its time, and while a transaction is open nobody else can write: such input is
// copied to an unnamed temporary file first.
File Spool(std::FILE* from, const std::string& name) {
  File copy(std::tmpfile());
  if (!copy) throw Failure("cannot make a temporary file: " + ErrnoText(errno));
  std::array<char, 1 << 16> block;
  while (const std::size_t size = std::fread(block.data(), 1, block.size(), from)) {
    if (std::fwrite(block.data(), 1, size, copy.get()) != size) {
      throw Failure("cannot write a temporary file: " + ErrnoText(errno));
    }
  }
  if (std::ferror(from)) FailReading(name, errno);
  if (std::fflush(copy.get()) != 0) {
    throw Failure("cannot write a temporary file: " + ErrnoText(errno));
  }
  std::rewind(copy.get());
  return copy;
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
  return S_ISREG(status.st_mode) ? std::move(file) : Spool(file.get(), shown);
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

// Collects the values of each key and day and hands them to the store in large runs, in order.
class PendingValues {
 public:
  explicit PendingValues(TallyLedger& ledger) : ledger_(ledger) {}

  [[nodiscard]] bool add(SampleLine line) {
    const auto [row, isNew] = rows_.try_emplace({line.day, std::move(line.key)});
    if (isNew) bytes_ += sizeof(*row) + row->first.second.size();
    row->second.push_back(line.sample);
    bytes_ += sizeof(line.sample);
    return bytes_ < kMaxPendingBytes || flush();
  }

  [[nodiscard]] bool flush() {
    for (const auto& [dayAndKey, samples] : rows_) {
      if (!ledger_.recordValues(dayAndKey.second, dayAndKey.first, samples)) return false;
    }
    rows_.clear();
    bytes_ = 0;
    return true;
  }

 private:
  TallyLedger& ledger_;
  std::map<std::pair<std::int32_t, std::string>, std::vector<DistributionSample>> rows_;
  std::size_t bytes_ = 0;
};

// False when the store refused a write, which it then has said itself.
bool ImportLines(LineReader& lines, TallyLedger& ledger, ImportCounts& counts) {
  PendingValues pending(ledger);
  while (const auto line = lines.next()) {
    auto parsed = ParseTallyLine(*line);
    if (const auto* why = std::get_if<std::string>(&parsed)) {
      throw Failure(lines.wrong(line->empty() ? "is empty" : "is wrong: " + why->substr(0, 200)));
    }
    if (const auto* scalar = std::get_if<ScalarLine>(&parsed)) {
      if (!ledger.setScalar(scalar->key, scalar->day, scalar->value)) return false;
      ++counts.scalars;
    } else {
      if (!pending.add(std::get<SampleLine>(std::move(parsed)))) return false;
      ++counts.values;
    }
  }
  return pending.flush();
}

}  // namespace

ImportCounts ImportTallies(const std::string& file, TallyLedger& ledger, const Messages& messages) {
  const File input = OpenInput(file);
  LineReader lines(input.get(), file == "-" ? "standard input" : file);
  ImportCounts counts;
  std::optional<Failure> failure;
  const bool kept = ledger.inTransaction([&] {
    try {
      return ImportLines(lines, ledger, counts);
    } catch (const Failure& wrongLine) {  // must not pass through the store
      failure = wrongLine;
      return false;
    }
  });
  if (failure) throw *failure;
  if (!kept) throw Failure(messages.lastErrorOr("the counters could not be stored"));
  return counts;
}

}  // namespace quorlet
