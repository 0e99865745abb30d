#include "ctl/record_writer.h"

#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <tuple>
#include <utility>
#include <vector>

#include "ctl/messages.h"
#include "platform/linux/base/files.h"

namespace quorlet {
namespace {

constexpr std::chrono::seconds kFirstPause{1};
constexpr std::chrono::seconds kLongestPause{5};
constexpr int kLastTries = 3;

bool WriteValues(const RecordedValues& recorded, TallyLedger& ledger) {
  std::vector<DistributionSample> samples;
  samples.reserve(recorded.values.size());
  auto value = recorded.values.begin();
  for (const RecordedValues::Run& run : recorded.runs) {
    for (std::size_t i = 0; i < run.count; ++i) samples.push_back({*value++, run.second});
  }
  return ledger.recordValues(recorded.key, recorded.day, samples);
}

}  // namespace

bool WriteRecordBatch(const RecordBatch& batch, TallyLedger& ledger) {
  return ledger.inTransaction([&] {
    for (const ScalarChange& change : batch.scalars) {
      const bool kept = change.kind == ScalarChange::Kind::kSet
                            ? ledger.setScalar(change.key, change.day, change.value)
                            : ledger.addToScalar(change.key, change.day, change.value);
      if (!kept) return false;
    }
    for (const RecordedValues& recorded : batch.values) {
      if (!WriteValues(recorded, ledger)) return false;
    }
    return !batch.keyOwners || ledger.setNote(kKeyOwnersNote, batch.keyOwners);
  });
}

RecordWriter::RecordWriter(TallyLedger& ledger)
    : ledger_(ledger), done_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
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

void RecordWriter::write(RecordBatch batch) {
  // In the order of the rows, so that pages are changed one after the other; changes of one key
  // stay in their order.
  const auto row = [](const auto& item) {
    return std::tuple<std::int32_t, std::string_view>(item.day, item.key);
  };
  std::ranges::stable_sort(batch.scalars, {}, row);
  std::ranges::stable_sort(batch.values, {}, row);
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
    const bool written = WriteRecordBatch(*batch_, ledger_);
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
