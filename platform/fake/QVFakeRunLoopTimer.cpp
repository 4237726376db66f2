#include "platform/fake/QVFakeRunLoopTimer.h"

#include "platform/fake/QVFakeAbort.h"
#include "platform/fake/QVFakeRunLoopThread.h"

#include <algorithm>
#include <utility>

QVFakeRunLoopTimer::QVFakeRunLoopTimer(const QVFakeClock& clock, QVDuration delay,
                                       QVFunction<void()> action)
    : clock_(clock), fireDate_(momentAfter(delay)), action_(std::move(action)) {}

void QVFakeRunLoopTimer::fireAfter(QVDuration delay) {
  {
    const std::lock_guard lock(mutex_);
    fireDate_ = momentAfter(delay);
  }
  wakeThread();
}

void QVFakeRunLoopTimer::invalidate() {
  spend();
  wakeThread();
}

void QVFakeRunLoopTimer::attachTo(std::weak_ptr<QVFakeRunLoopThread> thread) {
  const std::lock_guard lock(mutex_);
  if (std::exchange(isAttached_, true)) {
    QVFakeAbort("QVFakeRunLoopTimer: wrong use: attached twice");
  }
  thread_ = std::move(thread);
}

std::optional<QVDuration> QVFakeRunLoopTimer::fireDate() const {
  const std::lock_guard lock(mutex_);
  if (isSpent_) return std::nullopt;
  return fireDate_;
}

QVFunction<void()> QVFakeRunLoopTimer::spend() {
  const std::lock_guard lock(mutex_);
  isSpent_ = true;
  return std::move(action_);
}

QVDuration QVFakeRunLoopTimer::momentAfter(QVDuration delay) const {
  return clock_.steadyTime() + std::clamp(delay, QVDuration::zero(), kLongestDelay);
}

void QVFakeRunLoopTimer::wakeThread() const {
  std::weak_ptr<QVFakeRunLoopThread> thread;
  {
    const std::lock_guard lock(mutex_);
    thread = thread_;
  }
  if (const auto held = thread.lock()) held->wake();
}
