#include "platform/linux/store/QVEventStoreQueue.h"

#include <algorithm>
#include <iterator>
#include <utility>

bool QVEventStoreQueue::search(Search& search) {
  {
    const QVMutexLock lock(mutex_);
    if (stopped_) return false;
    searches_.push_back(std::move(search));
  }
  wake_.notify_one();
  return true;
}

void QVEventStoreQueue::stop() {
  {
    const QVMutexLock lock(mutex_);
    stopped_ = true;
  }
  wake_.notify_one();
}

QVEventStoreQueue::Work QVEventStoreQueue::take(std::optional<SteadyTime> retryAt) {
  Work work;
  QVMutexLock lock(mutex_);
  for (;;) {
    const SteadyTime now = std::chrono::steady_clock::now();
    const SteadyTime dueAt = firstRowAt_ + commitInterval_;
    work.stop = stopped_;
    work.searches = std::exchange(searches_, {});
    if (waitingRows_ > 0 && (stopped_ || urgent_ || waitingRows_ >= kCommitRows || now >= dueAt)) {
      moveWaiting(work.batches);
    }
    if (work.stop || !work.searches.empty() || !work.batches.empty()) return work;
    if (retryAt && now >= *retryAt) return work;

    if (waitingRows_ > 0) {
      lock.waitUntil(wake_, retryAt ? std::min(*retryAt, dueAt) : dueAt);
    } else if (retryAt) {
      lock.waitUntil(wake_, *retryAt);
    } else {
      lock.wait(wake_);
    }
  }
}

std::vector<QVEventStoreQueue::Search> QVEventStoreQueue::takeSearches() {
  const QVMutexLock lock(mutex_);
  return std::exchange(searches_, {});
}

bool QVEventStoreQueue::takeWaiting(std::deque<QVEventRows>& batches) {
  const QVMutexLock lock(mutex_);
  if (waitingRows_ == 0) return false;
  moveWaiting(batches);
  return true;
}

bool QVEventStoreQueue::isEmpty() {
  const QVMutexLock lock(mutex_);
  return waitingRows_ == 0;
}

void QVEventStoreQueue::recycle(QVEventRows&& batch) noexcept {
  batch.clear();
  const QVMutexLock lock(mutex_);
  if (spareCount_ < kSpareBatches) spare_[spareCount_++] = std::move(batch);
}

void QVEventStoreQueue::giveMemoryBack() noexcept {
  std::array<QVEventRows, kSpareBatches> spare;
  const QVMutexLock lock(mutex_);
  spare.swap(spare_);
  spareCount_ = 0;
}

void QVEventStoreQueue::beginBatch() {
  waiting_.emplace_back();
  if (spareCount_ > 0) waiting_.back() = std::move(spare_[--spareCount_]);
}

void QVEventStoreQueue::moveWaiting(std::deque<QVEventRows>& batches) {
  std::move(waiting_.begin(), waiting_.end(), std::back_inserter(batches));
  waiting_.clear();
  waitingRows_ = 0;
  urgent_ = false;
}
