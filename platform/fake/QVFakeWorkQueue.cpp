#include "platform/fake/QVFakeWorkQueue.h"

QVFakeWorkQueue::QVFakeWorkQueue(std::shared_ptr<QVFakeWorkQueuesState> state,
                                 std::shared_ptr<QVFakeQueueData> queue)
    : state_(std::move(state)), queue_(std::move(queue)) {}

void QVFakeWorkQueue::async(QVWorkItem item) {
  asyncAfter(QVDuration::zero(), std::move(item));
}

// An item that is not taken any more is destroyed by the caller's argument, after the lock.
void QVFakeWorkQueue::asyncAfter(QVDuration delay, QVWorkItem item) {
  const std::lock_guard lock(state_->mutex);
  if (state_->closed) return;
  ++queue_->enqueuedCount;
  QVFakeWorkQueuesState::Entry entry{queue_, std::move(item)};
  if (delay <= QVDuration::zero()) {
    state_->ready.push_back(std::move(entry));
  } else {
    state_->delayed.emplace(std::pair(state_->clock.steadyTime() + delay, state_->nextSequence++),
                            std::move(entry));
  }
}
