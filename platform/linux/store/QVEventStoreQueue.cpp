#include "platform/linux/store/QVEventStoreQueue.h"

#include <algorithm>
#include <iterator>
#include <utility>

namespace {

// Batches kept for their memory: some fill while those of a transaction are written.
constexpr std::size_t kSpareBatches = 8;

}  // namespace

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

void QVEventStoreQueue::recycle(QVEventRows&& batch) {
  batch.clear();
  const QVMutexLock lock(mutex_);
  if (spare_.size() < kSpareBatches) spare_.push_back(std::move(batch));
}

void QVEventStoreQueue::giveMemoryBack() {
  std::vector<QVEventRows> spare;
  const QVMutexLock lock(mutex_);
  spare.swap(spare_);
}

void QVEventStoreQueue::beginBatch() {
  if (spare_.empty()) {
    waiting_.emplace_back();
  } else {
    waiting_.push_back(std::move(spare_.back()));
    spare_.pop_back();
  }
}

void QVEventStoreQueue::moveWaiting(std::deque<QVEventRows>& batches) {
  std::move(waiting_.begin(), waiting_.end(), std::back_inserter(batches));
  waiting_.clear();
  waitingRows_ = 0;
  urgent_ = false;
}
