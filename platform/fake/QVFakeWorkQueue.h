#pragma once

#include "platform/QVWorkQueue.h"
#include "platform/fake/QVFakeClock.h"

#include <cstddef>
#include <deque>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

// One queue's own data. Lives as long as a handle, an item or the record of it.
struct QVFakeQueueData {
  std::string label;
  QVQualityOfService quality;
  int32_t relativePriority;
  bool serial;
  std::size_t enqueuedCount = 0;
  std::size_t runCount = 0;
  std::size_t onStackCount = 0;
};

// What QVFakeWorkQueues and its handles share.
struct QVFakeWorkQueuesState {
  struct Entry {
    std::shared_ptr<QVFakeQueueData> queue;
    QVWorkItem item;
  };

  explicit QVFakeWorkQueuesState(const QVFakeClock& virtualClock) : clock(virtualClock) {}

  const QVFakeClock& clock;  // not used once `closed`
  mutable std::mutex mutex;
  // All below are guarded by the mutex; items run and are destroyed without it.
  bool closed = false;
  uint64_t nextSequence = 0;
  std::deque<Entry> ready;
  std::map<std::pair<QVDuration, uint64_t>, Entry> delayed;  // by due time, then order of arrival
  std::vector<std::shared_ptr<QVFakeQueueData>> queues;
  std::shared_ptr<QVFakeQueueData> background;
  std::vector<std::shared_ptr<QVFakeQueueData>> stack;  // whose items are running, outermost first
};

// A handle to a queue of QVFakeWorkQueues. Threads: any.
class QVFakeWorkQueue final : public QVWorkQueue {
 public:
  QVFakeWorkQueue(std::shared_ptr<QVFakeWorkQueuesState> state,
                  std::shared_ptr<QVFakeQueueData> queue);

  void async(QVWorkItem item) override;
  void asyncAfter(QVDuration delay, QVWorkItem item) override;
  std::string_view label() const override { return queue_->label; }

 private:
  const std::shared_ptr<QVFakeWorkQueuesState> state_;
  const std::shared_ptr<QVFakeQueueData> queue_;
};
