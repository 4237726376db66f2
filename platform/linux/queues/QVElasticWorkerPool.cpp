#include "platform/linux/queues/QVElasticWorkerPool.h"

#include "platform/linux/QVThreads.h"
#include "platform/linux/queues/QVRunWorkItem.h"

#include <algorithm>
#include <exception>
#include <utility>

namespace {

thread_local QVElasticWorkerPool* poolOfThisThread = nullptr;

}  // namespace

QVElasticWorkerPool* QVElasticWorkerPool::current() noexcept {
  return poolOfThisThread;
}

QVElasticWorkerPool::QVElasticWorkerPool(std::string name, int niceness, QVLog& log,
                                         QVWorkLedger& ledger, Limits limits)
    : name_(std::move(name)), niceness_(niceness), log_(log), ledger_(ledger), limits_(limits) {}

QVElasticWorkerPool::~QVElasticWorkerPool() {
  close();
}

bool QVElasticWorkerPool::submit(QVWorkItem& task) {
  const QVMutexLock lock(mutex_);
  if (closed_) return false;
  // From here on the worker that takes it accounts for it; nobody does before the lock is dropped.
  ready_.push_back(std::move(task));
  ledger_.enter();
  sendForWorker();
  return true;
}

void QVElasticWorkerPool::runUnattended() {
  QVMutexLock lock(mutex_);
  while (!ready_.empty()) {
    sendForWorker();
    if (workerCount_ > 0) return;
    QVWorkItem task = takeFirst();
    lock.unlock();
    run(task);
    lock.lock();
  }
}

void QVElasticWorkerPool::willBlock() {
  const QVMutexLock lock(mutex_);
  ++blockedCount_;
  if (!ready_.empty()) sendForWorker();
}

void QVElasticWorkerPool::didBlock() {
  const QVMutexLock lock(mutex_);
  --blockedCount_;
}

// Wakes or makes one more worker, where one may run and none is on its way already.
void QVElasticWorkerPool::sendForWorker() {
  if (workerIsComing_) return;
  if (workerCount_ - blockedCount_ - resting_.size() >= limits_.concurrency) return;
  if (resting_.empty()) {
    addWorker();
    return;
  }
  Worker& worker = *resting_.back();
  resting_.pop_back();
  worker.isWanted = true;
  workerIsComing_ = true;
  worker.wake.notify_one();
}

void QVElasticWorkerPool::addWorker() {
  if (workerCount_ >= limits_.workers) return;
  try {
    threads_.emplace_back([this] { work(); });
    ++workerCount_;
    workerIsComing_ = true;
    lacksThreads_ = false;
  } catch (const std::exception& failure) {
    if (!lacksThreads_) lacksThreads_ = sayWhyThereIsNoThread(failure.what());
  }
}

// False where there is no memory even for that. The log takes no lock of ours and never waits.
bool QVElasticWorkerPool::sayWhyThereIsNoThread(std::string_view reason) const noexcept {
  try {
    log_.error(nullptr, "-[QVElasticWorkerPool addWorker]", "no thread for ", name_, ": ", reason);
    return true;
  } catch (const std::exception&) {
    return false;
  }
}

void QVElasticWorkerPool::work() {
  poolOfThisThread = this;
  QVPrepareThread("qv-" + name_, niceness_);
  QVMutexLock lock(mutex_);
  workerIsComing_ = false;
  do {
    while (!ready_.empty()) {
      QVWorkItem task = takeFirst();
      lock.unlock();
      run(task);
      lock.lock();
    }
  } while (rest(lock));
  std::thread previous = retire();
  lock.unlock();
  if (previous.joinable()) previous.join();
}

// The task that has waited longest.
QVWorkItem QVElasticWorkerPool::takeFirst() {
  QVWorkItem task = std::move(ready_.front());
  ready_.pop_front();
  if (!ready_.empty()) sendForWorker();
  return task;
}

void QVElasticWorkerPool::run(QVWorkItem& task) {
  QVRunWorkItem(task, name_, log_);
  ledger_.leave();
}

// Waits to be wanted; false where the worker is not needed any more.
bool QVElasticWorkerPool::rest(QVMutexLock& lock) {
  if (closed_) return false;
  Worker self;
  resting_.push_back(&self);
  auto deadline = std::chrono::steady_clock::now() + limits_.rest;
  while (!self.isWanted && !closed_) {
    if (workerCount_ == 1) {
      lock.wait(self.wake);
    } else if (lock.waitUntil(self.wake, deadline) == std::cv_status::timeout && !self.isWanted) {
      if (workerCount_ > 1) break;
      deadline = std::chrono::steady_clock::now() + limits_.rest;
    }
  }
  if (self.isWanted) {
    workerIsComing_ = false;
    return true;
  }
  std::erase(resting_, &self);
  return false;
}

// Takes the calling worker off the books; answers the thread that it has to join.
std::thread QVElasticWorkerPool::retire() {
  const auto self = std::ranges::find_if(threads_, [](const std::thread& thread) {
    return thread.get_id() == std::this_thread::get_id();
  });
  std::thread previous = std::exchange(retired_, std::move(*self));
  threads_.erase(self);
  if (--workerCount_ == 0) lastGone_.notify_all();
  return previous;
}

void QVElasticWorkerPool::close() {
  std::thread last;
  {
    QVMutexLock lock(mutex_);
    closed_ = true;
    for (Worker* const worker : resting_) worker->wake.notify_one();
    while (workerCount_ > 0) lock.wait(lastGone_);
    last = std::exchange(retired_, {});
  }
  if (last.joinable()) last.join();
}
