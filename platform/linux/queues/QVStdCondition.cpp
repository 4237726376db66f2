#include "platform/linux/queues/QVStdCondition.h"

#include "platform/linux/QVWakeUpBatch.h"
#include "platform/linux/queues/QVStdConditions.h"
#include "platform/linux/queues/QVWorkerBlocking.h"

#include <algorithm>
#include <chrono>

bool QVStdCondition::waitForTimeout(QVDuration timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  const auto self = shared_from_this();
  QVWakeUpBatch::wakeNow();
  Waiter waiter;
  waiters_.push_back(&waiter);
  {
    const QVWorkerBlocking blocking;
    conditions_.waitBegins(self);
    while (!waiter.isSignalled && !conditions_.waitsAreCutShort()) {
      if (waiter.wake.wait_until(mutex_, deadline) == std::cv_status::timeout) break;
    }
    conditions_.waitEnds(self);
  }
  if (!waiter.isSignalled) std::erase(waiters_, &waiter);
  return waiter.isSignalled;
}

void QVStdCondition::signal() {
  if (waiters_.empty()) return;
  waiters_.front()->isSignalled = true;
  waiters_.front()->wake.notify_one();
  waiters_.pop_front();
}

void QVStdCondition::wakeAll() {
  const QVMutexLock lock(mutex_);
  for (Waiter* const waiter : waiters_) waiter->wake.notify_one();
}
