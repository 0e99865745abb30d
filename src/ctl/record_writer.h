// Writes what the recording socket took in, while more is taken in.
#ifndef QUORLET_CTL_RECORD_WRITER_H_
#define QUORLET_CTL_RECORD_WRITER_H_

#include <condition_variable>
#include <mutex>
#include <optional>
#include <thread>

#include "platform/counter_store.h"
#include "platform/linux/base/descriptor.h"

namespace quorlet {

// A thread of its own that writes one batch at a time, each in one transaction, and tries again
// until it is written or the end has come.
class RecordWriter {
 public:
  // An operation of the store, which outlives the writer, must have returned on this thread.
  explicit RecordWriter(CounterStore& store);
  RecordWriter(const RecordWriter&) = delete;
  RecordWriter& operator=(const RecordWriter&) = delete;
  ~RecordWriter();

  // Whether a batch is being written.
  bool isBusy();
  // Takes over a batch; only while it is not busy.
  void write(StoreChanges batch);
  // Becomes readable when a batch was written.
  int doneEvent() const { return done_.get(); }
  void clearDoneEvent();
  // Waits until the last batch is written, trying some times more. False when it is lost.
  [[nodiscard]] bool finish();

 private:
  void run();

  CounterStore& store_;
  Descriptor done_;
  std::mutex mutex_;
  std::condition_variable changed_;
  std::optional<StoreChanges> batch_;
  bool isEnding_ = false;
  bool isLost_ = false;
  std::thread thread_;  // last: it uses the others
};

}  // namespace quorlet

#endif  // QUORLET_CTL_RECORD_WRITER_H_
