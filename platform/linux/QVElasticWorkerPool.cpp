#include "platform/linux/QVElasticWorkerPool.h"

#include "platform/linux/QVRunWorkItem.h"
#include "platform/linux/QVThreads.h"

#include <algorithm>
#include <system_error>
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
  ledger_.enter();
  if (!resting_.empty()) {
    Worker& worker = *resting_.back();
    resting_.pop_back();
    worker.task = std::move(task);
    worker.wake.notify_one();
  } else {
    ready_.push_back(std::move(task));
    addWorkerIfUseful();
  }
  return true;
}

void QVElasticWorkerPool::willBlock() {
  const QVMutexLock lock(mutex_);
  ++blockedCount_;
  if (!ready_.empty()) addWorkerIfUseful();
}

void QVElasticWorkerPool::didBlock() {
  const QVMutexLock lock(mutex_);
  --blockedCount_;
}

void QVElasticWorkerPool::addWorkerIfUseful() {
  if (workerCount_ >= limits_.workers) return;
  if (workerCount_ - blockedCount_ >= limits_.concurrency) return;
  try {
    threads_.emplace_back([this] { work(); });
    ++workerCount_;
    lacksThreads_ = false;
  } catch (const std::system_error& error) {
    // The log takes no lock of ours and never waits.
    if (!lacksThreads_) log_.error(nullptr, __func__, "no thread for ", name_, ": ", error.what());
    lacksThreads_ = true;
  }
}

void QVElasticWorkerPool::work() {
  poolOfThisThread = this;
  QVPrepareThread("qv-" + name_, niceness_);
  QVMutexLock lock(mutex_);
  QVWorkItem task;
  for (;;) {
    if (!ready_.empty()) {
      task = std::move(ready_.front());
      ready_.pop_front();
    } else if (!rest(lock, task)) {
      break;
    }
    lock.unlock();
    QVRunWorkItem(task, name_, log_);
    ledger_.leave();
    lock.lock();
  }
  std::thread previous = retire();
  lock.unlock();
  if (previous.joinable()) previous.join();
}

// Waits for a task; false where the worker is not needed any more.
bool QVElasticWorkerPool::rest(QVMutexLock& lock, QVWorkItem& task) {
  if (closed_) return false;
  Worker self;
  resting_.push_back(&self);
  auto deadline = std::chrono::steady_clock::now() + limits_.rest;
  while (!self.task && !closed_) {
    if (workerCount_ == 1) {
      lock.wait(self.wake);
    } else if (lock.waitUntil(self.wake, deadline) == std::cv_status::timeout && !self.task) {
      if (workerCount_ > 1) break;
      deadline = std::chrono::steady_clock::now() + limits_.rest;
    }
  }
  if (self.task) {
    task = std::move(self.task);
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
