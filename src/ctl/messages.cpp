#include "ctl/messages.h"

#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <system_error>

#include "ctl/output.h"
#include "platform/linux/base/files.h"
#include "platform/linux/base/services.h"

namespace quorlet {
namespace {

// A damaged whitelist can have a message for each of its entries.
constexpr std::size_t kMaxMessages = 1000;
constexpr std::size_t kMaxMessageBytes = 4096;

class CollectingLog final : public SystemLog {
 public:
  CollectingLog(Messages& messages, Access access)
      : messages_(messages),
        systemLog_(access == Access::kReadWrite
                       ? MakeLinuxSystemLog(Root::FromEnvironment(), access, *clock_)
                       : nullptr) {}
  void write(LogLevel level, std::string_view text) override {
    messages_.add(level, text);
    if (level == LogLevel::kError && systemLog_ != nullptr) systemLog_->write(level, text);
  }

 private:
  Messages& messages_;
  const std::unique_ptr<Clock> clock_ = MakeLinuxClock();
  const std::unique_ptr<SystemLog> systemLog_;
};

}  // namespace

std::vector<std::string> NamesIn(const std::string& directory) {
  std::error_code error;
  std::vector<std::string> names;
  std::filesystem::directory_iterator at(directory, error);
  for (; !error && at != std::filesystem::directory_iterator(); at.increment(error)) {
    names.push_back(at->path().filename().string());
  }
  if (error && error != std::errc::no_such_file_or_directory) {
    throw Failure("cannot read " + directory + ": " + ErrnoText(error.value()));
  }
  std::ranges::sort(names);
  return names;
}

void PrintErrorLine(std::string_view text) {
  const std::string line = "quorletctl: " + Escape(text) + "\n";
  // Nothing is left to say when standard error fails.
  [[maybe_unused]] const ssize_t written = ::write(STDERR_FILENO, line.data(), line.size());
}

std::unique_ptr<SystemLog> Messages::makeLog(Access access) {
  return std::make_unique<CollectingLog>(*this, access);
}

void Messages::add(LogLevel level, std::string_view text) {
  if (level < lowest_) return;
  if (kept_.size() == kMaxMessages) {
    ++dropped_;
    if (level == LogLevel::kError) errors_.back() = text.substr(0, kMaxMessageBytes);
    return;
  }
  kept_.emplace_back(text.substr(0, kMaxMessageBytes));
  if (level == LogLevel::kError) errors_.push_back(kept_.back());
}

std::string Messages::lastErrorOr(std::string_view otherwise) const {
  return errors_.empty() ? std::string(otherwise) : errors_.back();
}

void Messages::print() const {
  for (const std::string& message : kept_) PrintErrorLine(message);
  if (dropped_ != 0) PrintErrorLine("and " + Counted(dropped_, "more message"));
}

}  // namespace quorlet
