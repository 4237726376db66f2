#include "platform/linux/queues/QVAsioSerialQueue.h"

#include "platform/linux/QVLogException.h"
#include "platform/linux/QVWakeUpBatch.h"
#include "platform/linux/queues/QVRunWorkItem.h"

#include <utility>

namespace {

// Items of a batch between two wake-ups: what they answer and enqueue does not wait for the end of
// a long batch.
constexpr std::size_t kItemsPerWakeUp = 64;

}  // namespace

QVAsioSerialQueue::QVAsioSerialQueue(std::string_view label, QVWorkExecutor& executor,
                                     QVAsioTimers& timers, QVLog& log)
    : label_(label), executor_(executor), timers_(timers), log_(log) {}

void QVAsioSerialQueue::async(QVWorkItem item) {
  {
    const QVMutexLock lock(mutex_);
    enqueued_.add(std::move(item));
    if (std::exchange(isScheduled_, true)) return;
  }
  try {
    if (auto* const wakeUps = QVWakeUpBatch::current()) {
      wakeUps->add([self = shared_from_this()] { self->submitLater(); });
    } else {
      submit();
    }
  } catch (...) {
    unschedule();
    throw;
  }
}

void QVAsioSerialQueue::asyncAfter(QVDuration delay, QVWorkItem item) {
  timers_.enqueueAfter(delay, shared_from_this(), std::move(item));
}

// At the end of a batch of wake-ups there is nobody left to be told of a failure.
void QVAsioSerialQueue::submitLater() noexcept {
  try {
    submit();
  } catch (...) {
    unschedule();
    QVLogException(log_, "-[QVAsioSerialQueue submit]", "work queue", label_);
  }
}

void QVAsioSerialQueue::unschedule() noexcept {
  const QVMutexLock lock(mutex_);
  isScheduled_ = false;
}

void QVAsioSerialQueue::submit() {
  QVWorkItem task = [self = shared_from_this()] { self->run(); };
  if (executor_.submit(task)) return;
  QVWorkItems refused;
  {
    const QVMutexLock lock(mutex_);
    std::swap(refused, enqueued_);
    isScheduled_ = false;
  }
  // In their order, and without the lock: an item may hold whatever enqueues again on its way out.
  refused.consume([](QVWorkItem& item) { item = nullptr; });
}

void QVAsioSerialQueue::run() {
  while (runBatch()) {
    // Behind the executor's other tasks, so that a busy queue does not keep a thread to itself.
    try {
      submit();
      return;
    } catch (...) {
      // For want of memory: then the thread is kept.
      QVLogException(log_, "-[QVAsioSerialQueue run]", "work queue", label_);
    }
  }
}

// Are there more items?
bool QVAsioSerialQueue::runBatch() {
  QVWorkItems batch;
  {
    const QVMutexLock lock(mutex_);
    std::swap(batch, enqueued_);
  }
  {
    const QVWakeUpBatch wakeUps;
    std::size_t untilWakeUp = kItemsPerWakeUp;
    batch.consume([&](QVWorkItem& item) {
      QVRunWorkItem(item, label_, log_);
      if (--untilWakeUp != 0) return;
      untilWakeUp = kItemsPerWakeUp;
      QVWakeUpBatch::wakeNow();
    });
  }
  const QVMutexLock lock(mutex_);
  isScheduled_ = !enqueued_.isEmpty();
  return isScheduled_;
}
