#pragma once

#include "platform/fake/QVFakeConditions.h"
#include "platform/fake/QVFakeLog.h"
#include "platform/fake/QVFakeRunLoopThreads.h"
#include "platform/fake/QVFakeWorkQueues.h"
#include "platform/linux/queues/QVAsioRunLoopThreads.h"
#include "platform/linux/queues/QVAsioWorkQueues.h"
#include "platform/linux/queues/QVStdConditions.h"

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>

#include <gtest/gtest.h>
#include <sys/resource.h>

// Counts down to an event that a test waits for. Threads: any.
class QVCountdown {
 public:
  explicit QVCountdown(int count) : count_(count) {}

  void expectMore(int count) {
    const std::lock_guard lock(mutex_);
    count_ += count;
  }
  void hit() {
    const std::lock_guard lock(mutex_);
    --count_;
    changed_.notify_all();
  }
  bool isOver() const {
    const std::lock_guard lock(mutex_);
    return count_ <= 0;
  }
  bool waitUntilOver(std::chrono::steady_clock::duration limit) {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, limit, [this] { return count_ <= 0; });
  }

 private:
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  int count_;
};

// Fake queues, conditions and threads in one virtual time, and how a test lets them work until an
// event: by running them on its thread. The limit only ends a test that has failed.
class QVFakeQueueHarness {
 public:
  QVWorkQueues& queues() { return queues_; }
  QVFakeConditions& conditions() { return conditions_; }
  QVFakeRunLoopThreads& runLoopThreads() { return runLoopThreads_; }
  QVFakeLog& log() { return log_; }

  bool runUntil(QVCountdown& countdown) {
    return queues_.runOthersUntil(clock_.steadyTime() + std::chrono::minutes{1},
                                  [&countdown] { return countdown.isOver(); });
  }
  // Does the calling thread wait in `act`? Then virtual time moves on.
  template <class Act>
  bool waitsDuring(Act act) {
    const QVDuration before = clock_.steadyTime();
    act();
    return clock_.steadyTime() != before;
  }

 private:
  QVFakeClock clock_;
  QVFakeLog log_;
  QVFakeWorkQueues queues_{clock_, log_};
  QVFakeConditions conditions_{queues_, clock_};
  QVFakeRunLoopThreads runLoopThreads_{queues_, clock_, log_};
};

// The adapters in the same shape: their threads work by themselves and the test waits.
class QVRealQueueHarness {
 public:
  QVWorkQueues& queues() { return queues_; }
  QVStdConditions& conditions() { return conditions_; }
  QVAsioRunLoopThreads& runLoopThreads() { return runLoopThreads_; }
  QVFakeLog& log() { return log_; }

  static bool runUntil(QVCountdown& countdown) {
    return countdown.waitUntilOver(std::chrono::minutes{1});
  }
  // Then it gives up its processor of its own accord.
  template <class Act>
  static bool waitsDuring(Act act) {
    const long before = waitCount();
    act();
    return waitCount() != before;
  }

 private:
  // Of the calling thread, as the kernel counts.
  static long waitCount() {
    rusage usage{};
    EXPECT_EQ(getrusage(RUSAGE_THREAD, &usage), 0);
    return usage.ru_nvcsw;
  }

  QVFakeLog log_;
  QVStdConditions conditions_;
  QVAsioWorkQueues queues_{log_};
  QVAsioRunLoopThreads runLoopThreads_{log_};
};
