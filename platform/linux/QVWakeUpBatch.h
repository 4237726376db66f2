#pragma once

#include "platform/QVFunction.h"

#include <utility>
#include <vector>

// For its life, whoever gets work from the calling thread is woken only at the end, once: the IPC
// thread handles all calls of one read within a batch, a serial queue all items that it found
// waiting, and so they pay one wake-up for them, not one for each. Whoever waits within for what
// others do calls wakeNow() first.
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

  // Wakes at once whoever the calling thread's batch, if there is one, would wake at its end.
  static void wakeNow() {
    if (current_ == nullptr) return;
    for (WakeUp& wakeUp : std::exchange(current_->wakeUps_, {})) wakeUp();
  }

  void add(WakeUp wakeUp) { wakeUps_.push_back(std::move(wakeUp)); }

 private:
  static inline thread_local QVWakeUpBatch* current_ = nullptr;

  const bool isOutermost_;
  std::vector<WakeUp> wakeUps_;
};
