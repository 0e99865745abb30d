#include "ctl/record_writer.h"

#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <utility>

#include "ctl/messages.h"
#include "platform/linux/base/files.h"

namespace quorlet {
namespace {

constexpr std::chrono::seconds kFirstPause{1};
constexpr std::chrono::seconds kLongestPause{5};
constexpr int kLastTries = 3;

}  // namespace

RecordWriter::RecordWriter(CounterStore& store)
    : store_(store), done_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  if (!done_.isOpen()) throw Failure("cannot make an event: " + ErrnoText(errno));
  thread_ = std::thread([this] { run(); });
}

RecordWriter::~RecordWriter() {
  static_cast<void>(finish());
  if (thread_.joinable()) thread_.join();
}

bool RecordWriter::isBusy() {
  const std::lock_guard lock(mutex_);
  return batch_.has_value();
}

void RecordWriter::write(StoreChanges batch) {
  const std::lock_guard lock(mutex_);
  batch_ = std::move(batch);
  changed_.notify_all();
}

void RecordWriter::clearDoneEvent() {
  eventfd_t ignored = 0;
  static_cast<void>(eventfd_read(done_.get(), &ignored));
}

bool RecordWriter::finish() {
  std::unique_lock lock(mutex_);
  isEnding_ = true;
  changed_.notify_all();
  changed_.wait(lock, [this] { return !batch_; });
  return !isLost_;
}

void RecordWriter::run() {
  std::unique_lock lock(mutex_);
  std::chrono::seconds pause = kFirstPause;
  int triesLeft = kLastTries;
  while (true) {
    changed_.wait(lock, [this] { return batch_ || isEnding_; });
    if (!batch_) return;
    lock.unlock();
    const bool written = store_.write(*batch_);
    lock.lock();
    if (written || (isEnding_ && --triesLeft <= 0)) {
      isLost_ |= !written;
      batch_.reset();
      pause = kFirstPause;
      changed_.notify_all();
      static_cast<void>(eventfd_write(done_.get(), 1));
      continue;
    }
    const bool wasEnding = isEnding_;
    changed_.wait_for(lock, pause, [&] { return isEnding_ && !wasEnding; });
    pause = isEnding_ ? kFirstPause : std::min(pause * 2, kLongestPause);
  }
}

}  // namespace quorlet
