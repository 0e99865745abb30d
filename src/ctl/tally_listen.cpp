#include "ctl/tally_listen.h"

#include <poll.h>
#include <pthread.h>
#include <sys/signalfd.h>
#include <sys/stat.h>
#include <sys/statvfs.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <csignal>
#include <memory>
#include <mutex>
#include <vector>

#include "ctl/options.h"
#include "ctl/record_book.h"
#include "ctl/record_refusals.h"
#include "ctl/record_sockets.h"
#include "ctl/record_whitelist.h"
#include "ctl/record_writer.h"
#include "ctl/session.h"
#include "ctl/statsd_line.h"
#include "platform/linux/base/paths.h"
#include "platform/linux/base/services.h"

namespace quorlet {
namespace {

using Steady = std::chrono::steady_clock;

constexpr char kDefaultSocket[] = "/run/quorlet/statsd";
constexpr std::chrono::seconds kFlushInterval{1};
constexpr std::chrono::minutes kTellInterval{1};
constexpr std::chrono::milliseconds kWaitInterval{20};
constexpr std::uint64_t kLargestStore = std::uint64_t{256} << 20;
constexpr std::uint64_t kLeastFreePercent = 5;
// What may wait in the sockets when the end has come; senders that go on must not put it off.
constexpr std::size_t kMostLastReads = 1024;

struct ListenArguments {
  std::string socket = kDefaultSocket;
  std::uint32_t idleSeconds = 10;
  bool anyKey = false;
};

// The system log, which also knows the last error; in bounded memory, however long this runs.
class ListenLog final : public SystemLog {
 public:
  explicit ListenLog(std::string& lastError) : lastError_(lastError) {}
  void write(LogLevel level, std::string_view text) override {
    const std::lock_guard lock(mutex_);
    if (level == LogLevel::kError) lastError_ = text.substr(0, 4096);
    log_->write(level, text);
  }

 private:
  std::mutex mutex_;
  std::string& lastError_;
  const std::unique_ptr<Clock> clock_ = MakeLinuxClock();
  const std::unique_ptr<SystemLog> log_ =
      MakeLinuxSystemLog(Root::FromEnvironment(), Access::kReadWrite, *clock_);
};

// The socket's place below the root; one that is given with the root in front is there already.
std::string SocketPath(const Root& root, const std::string& given) {
  const std::string prefix = root.path("/");
  return !root.isMachine() && given.starts_with(prefix) ? given : root.path(given);
}

// Ends the process no more, but can be waited for. Threads that are started later have it blocked.
Descriptor CatchEnd() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  Descriptor caught(signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
  if (!caught.isOpen()) throw Failure("cannot wait for signals: " + ErrnoText(errno));
  return caught;
}

std::uint64_t FileSize(const std::string& path) {
  struct stat status {};
  return ::stat(path.c_str(), &status) == 0 ? static_cast<std::uint64_t>(status.st_size) : 0;
}

// Whether the store has no room for more.
bool IsStoreFull(const std::string& store) {
  if (FileSize(store) + FileSize(store + "-wal") > kLargestStore) return true;
  // The file system of the nearest directory that is there.
  struct statvfs space {};
  std::string at = store;
  while (::statvfs(at.empty() ? "/" : at.c_str(), &space) != 0) {
    if (at.empty()) return false;
    at.resize(std::min(at.rfind('/'), at.size() - 1));
  }
  return std::uint64_t{space.f_bavail} * 100 < std::uint64_t{space.f_blocks} * kLeastFreePercent;
}

class TallyListener {
 public:
  TallyListener(const ListenArguments& arguments, LinuxPlatform& platform)
      : platform_(platform),
        idle_(arguments.idleSeconds),
        end_(CatchEnd()),
        sockets_(OpenRecordSockets(SocketPath(platform.root(), arguments.socket))),
        storePath_(StorePath(platform)),
        book_(Whitelist(arguments, platform), geteuid()) {
    enterNow();
    writer_.emplace(platform.services().counterStore);
  }

  void run();
  // Takes in what waits and writes everything. False when the last of it is lost.
  [[nodiscard]] bool finish();

 private:
  static std::string StorePath(LinuxPlatform& platform) {
    const auto home = platform.services().queries.dataHomePath();
    if (!home) throw Failure("there is no place for the counters");
    return platform.root().path(*home + kCounterStorePath);
  }
  static RecordWhitelist Whitelist(const ListenArguments& arguments, LinuxPlatform& platform) {
    RecordWhitelist whitelist = RecordWhitelist::Load(platform.root(), platform.services());
    if (arguments.anyKey) whitelist.nameEvery();
    return whitelist;
  }

  bool isOver() const;
  void wait();
  std::size_t readSockets(DatagramReader::Patience patience);
  void take(std::string_view text, Sender sender, bool isCut);
  void enterNow();
  void checkStore();
  void flushIfDue();
  void tellIfDue();

  LinuxPlatform& platform_;
  const std::chrono::seconds idle_;
  const Descriptor end_;
  std::vector<ListeningSocket> sockets_;
  const std::string storePath_;
  RecordBook book_;
  std::optional<RecordWriter> writer_;
  DatagramReader reader_;
  StatsdLine line_;
  RecordRefusals refusals_;
  RecordTime now_;
  bool hasEnded_ = false;
  bool isStoreFull_ = false;
  Steady::time_point time_ = Steady::now();
  Steady::time_point lastDatagram_ = time_;
  Steady::time_point nextWait_ = time_;
  Steady::time_point nextFlush_ = time_;
  Steady::time_point nextCheck_ = time_;
  Steady::time_point nextTell_ = time_ + kTellInterval;
};

void TallyListener::enterNow() {
  const double seconds = std::floor(platform_.services().clock.now().secondsSince1970);
  now_.day = platform_.services().counterStore.TLDaysSince1970();
  now_.second =
      static_cast<std::int32_t>(std::clamp(seconds - now_.day * 86400.0, 0.0, double{kLastSecond}));
  static_cast<void>(book_.enterDay(now_.day, platform_.services().counterStore));
}

bool TallyListener::isOver() const {
  if (hasEnded_) return true;
  return idle_.count() != 0 && time_ - lastDatagram_ >= idle_ && book_.empty();
}

void TallyListener::run() {
  using enum DatagramReader::Patience;
  bool isComing = false;
  while (!isOver()) {
    // While datagrams come one upon the other, reading is the waiting, which spares a call for
    // each. Now and then the rest is looked at.
    if (isComing && sockets_.size() == 1 && !book_.isFull() && time_ < nextWait_) {
      isComing = readSockets(kAMoment) != 0;
    } else {
      wait();
      isComing = !book_.isFull() && readSockets(kNone) != 0;
    }
    flushIfDue();
    tellIfDue();
  }
}

void TallyListener::wait() {
  std::vector<pollfd> waited = {{end_.get(), POLLIN, 0}, {writer_->doneEvent(), POLLIN, 0}};
  // With a full book the senders wait.
  if (!book_.isFull()) {
    for (const ListeningSocket& socket : sockets_) waited.push_back({socket.get(), POLLIN, 0});
  }
  auto until = nextTell_;
  if (idle_.count() != 0) until = std::min(until, std::max(lastDatagram_ + idle_, time_));
  // While a batch is being written, its end wakes us.
  if (!book_.empty() && !writer_->isBusy()) until = std::min(until, nextFlush_);
  if (book_.empty() && writer_->isBusy()) until = std::max(until, nextFlush_);
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(until - Steady::now()).count();
  const int timeout = static_cast<int>(std::clamp<std::int64_t>(left, 0, 60'000));
  if (::poll(waited.data(), waited.size(), timeout) < 0 && errno != EINTR) {
    throw Failure("cannot wait for datagrams: " + ErrnoText(errno));
  }
  time_ = Steady::now();
  nextWait_ = time_ + kWaitInterval;
  hasEnded_ |= waited[0].revents != 0;
  if (waited[1].revents != 0) writer_->clearDoneEvent();
}

std::size_t TallyListener::readSockets(DatagramReader::Patience patience) {
  checkStore();
  std::size_t count = 0;
  for (const ListeningSocket& socket : sockets_) {
    bool isFirst = true;
    const auto handler = [&](std::string_view text, Sender sender, bool isCut) {
      if (isFirst) enterNow();
      isFirst = false;
      take(text, sender, isCut);
    };
    count += reader_.read(socket.get(), patience, handler);
  }
  time_ = Steady::now();
  if (count != 0) lastDatagram_ = time_;
  return count;
}

void TallyListener::take(std::string_view text, Sender sender, bool isCut) {
  // The last line of a datagram that was cut may look whole.
  if (isCut) {
    refusals_.add(Refusal::kUnreadable, sender);
    text = text.substr(0, text.rfind('\n') + 1);
  }
  while (const auto line = NextStatsdLine(text)) {
    Refusal refusal = ParseStatsdLine(*line, line_);
    if (refusal == Refusal::kNone && isStoreFull_) refusal = Refusal::kStoreFull;
    if (refusal == Refusal::kNone) refusal = book_.add(line_, sender, now_.second);
    if (refusal != Refusal::kNone) refusals_.add(refusal, sender);
  }
}

void TallyListener::checkStore() {
  if (time_ < nextCheck_) return;
  isStoreFull_ = IsStoreFull(storePath_);
  nextCheck_ = time_ + kFlushInterval;
}

void TallyListener::flushIfDue() {
  if (book_.empty() || time_ < nextFlush_ || writer_->isBusy()) return;
  writer_->write(book_.take());
  nextFlush_ = time_ + kFlushInterval;
}

void TallyListener::tellIfDue() {
  if (time_ < nextTell_) return;
  if (const auto text = refusals_.take()) platform_.services().log.log("%@", *text);
  nextTell_ = time_ + kTellInterval;
}

bool TallyListener::finish() {
  using enum DatagramReader::Patience;
  for (std::size_t i = 0; i < kMostLastReads && !book_.isFull() && readSockets(kNone) != 0; ++i) {
  }
  // What senders find from now on is no listener, rather than one that does not read.
  sockets_.clear();
  if (const auto text = refusals_.take()) platform_.services().log.log("%@", *text);
  bool isKept = true;
  if (!book_.empty()) {
    StoreChanges last = book_.take();
    isKept = writer_->finish();
    writer_.emplace(platform_.services().counterStore);
    writer_->write(std::move(last));
  }
  return writer_->finish() && isKept;
}

void Listen(const ListenArguments& arguments) {
  std::string lastError;
  LinuxPlatform platform(Root::FromEnvironment(), Access::kReadWrite,
                         std::make_unique<ListenLog>(lastError));
  TallyListener listener(arguments, platform);
  listener.run();
  if (!listener.finish()) throw Failure("what was recorded last is lost: " + lastError);
}

}  // namespace

void AddListenCommand(CLI::App& tally, Session& session) {
  const auto arguments = std::make_shared<ListenArguments>();
  CLI::App* command = AddCommand(
      tally, "listen", "Record what programs send in the StatsD line format",
      "Lines are taken from the sockets that the service manager passes, or else from a new Unix\n"
      "datagram socket. They are written once a second.",
      "quorletctl tally listen --idle 0");
  const auto parseSocket = [arguments](const std::string& text) {
    if (!text.starts_with('/') || text.ends_with('/')) {
      throw CLI::ValidationError("--socket", "not an absolute path of a socket: " + text);
    }
    arguments->socket = text;
  };
  command
      ->add_option_function<std::string>("--socket", parseSocket,
                                         "The socket (default: /run/quorlet/statsd)")
      ->type_name("PATH");
  const auto parseIdle = [arguments](const std::string& text) {
    const auto seconds = ParseNumber<std::uint32_t>(text);
    if (!seconds) throw CLI::ValidationError("--idle", "not a number of seconds: " + text);
    arguments->idleSeconds = *seconds;
  };
  command
      ->add_option_function<std::string>(
          "--idle", parseIdle, "End after so long without a datagram, 0: never (default: 10)")
      ->type_name("SECONDS");
  command->add_flag("--any-key", arguments->anyKey, "Take keys that no whitelist entry names");
  command->callback(
      [&session, arguments] { session.command = [arguments] { Listen(*arguments); }; });
}

}  // namespace quorlet
