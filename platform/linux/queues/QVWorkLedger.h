#pragma once

#include "platform/linux/QVThreadAnnotations.h"

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>

// Counts the work that the queues of one process have accepted and not finished, over all their
// threads, so that the end of the service can wait for none. Work that makes more work enters it
// before it leaves itself, so the count does not touch 0 in between.
//
// Used by the executors. Threads: any.
class QVWorkLedger {
 public:
  void enter() noexcept { count_.fetch_add(1, std::memory_order_relaxed); }
  void leave() noexcept {
    if (count_.fetch_sub(1, std::memory_order_acq_rel) != 1) return;
    const QVMutexLock lock(mutex_);
    empty_.notify_all();
  }
  void waitUntilEmpty() {
    while (!waitUntilEmpty(std::chrono::hours(24))) {
    }
  }
  // False where it was not empty for so long.
  bool waitUntilEmpty(std::chrono::steady_clock::duration longest) {
    const auto deadline = std::chrono::steady_clock::now() + longest;
    QVMutexLock lock(mutex_);
    while (count_.load(std::memory_order_acquire) != 0) {
      if (lock.waitUntil(empty_, deadline) == std::cv_status::timeout) return false;
    }
    return true;
  }

 private:
  std::atomic<uint64_t> count_{0};
  QVMutex mutex_;  // only makes sure that the wake-up is not missed
  std::condition_variable empty_;
};
