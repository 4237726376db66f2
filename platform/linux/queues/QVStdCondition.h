#pragma once

#include "platform/QVCondition.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <atomic>
#include <condition_variable>
#include <deque>
#include <memory>

class QVStdConditions;

// A condition on the standard library's. Each wait has a wake-up of its own and waits end in the
// order in which they began, so that a signal ends exactly one, and none that began after it. A
// signal that finds nobody waiting is gone, as with any condition.
//
// Made by QVStdConditions, which outlives its waits. Threads: as QVCondition. A wait on a worker of
// a pool lets the pool use another one meanwhile.
class QVStdCondition final : public QVCondition,
                             public std::enable_shared_from_this<QVStdCondition> {
 public:
  explicit QVStdCondition(QVStdConditions& conditions) : conditions_(conditions) {}

  void lock() override QV_ACQUIRE(mutex_) { mutex_.lock(); }
  void unlock() override QV_RELEASE(mutex_) { mutex_.unlock(); }
  bool waitForTimeout(QVDuration timeout) override QV_REQUIRES(mutex_);
  void signal() override QV_REQUIRES(mutex_);

  // Makes the present waits look whether they are to end.
  void wakeAll();

 private:
  // One wait, on the stack of the thread that waits.
  struct Waiter {
    std::condition_variable_any wake;
    bool isSignalled = false;
  };

  QVStdConditions& conditions_;
  QVMutex mutex_;
  std::deque<Waiter*> waiters_ QV_GUARDED_BY(mutex_);  // not yet signalled, the oldest first
};
