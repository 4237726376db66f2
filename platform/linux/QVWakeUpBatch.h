#pragma once

#include "platform/QVFunction.h"

#include <vector>

// For its life, queues that get work from the calling thread are woken only at the end, once each:
// the IPC thread handles all calls of one read within a batch and so pays one wake-up for them, not
// one for each. What is enqueued within must not be waited for within.
//
// Threads: made, used and destroyed on one thread; they nest, the outermost one counts.
class QVWakeUpBatch {
 public:
  // Room for what wakes one queue: a handle to it.
  using WakeUp = QVFunction<void(), 16>;

  QVWakeUpBatch() : isOutermost_(current_ == nullptr) {
    if (isOutermost_) current_ = this;
  }
  ~QVWakeUpBatch() {
    if (!isOutermost_) return;
    current_ = nullptr;
    for (WakeUp& wakeUp : wakeUps_) wakeUp();
  }
  QVWakeUpBatch(const QVWakeUpBatch&) = delete;
  QVWakeUpBatch& operator=(const QVWakeUpBatch&) = delete;

  // The calling thread's; null where there is none.
  static QVWakeUpBatch* current() noexcept { return current_; }

  void add(WakeUp wakeUp) { wakeUps_.push_back(std::move(wakeUp)); }

 private:
  static inline thread_local QVWakeUpBatch* current_ = nullptr;

  const bool isOutermost_;
  std::vector<WakeUp> wakeUps_;
};
