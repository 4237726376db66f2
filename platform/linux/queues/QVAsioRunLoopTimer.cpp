#include "platform/linux/queues/QVAsioRunLoopTimer.h"

#include "platform/linux/queues/QVAsioRunLoopWaits.h"

#include <algorithm>
#include <utility>

namespace {

QVAsioRunLoopTimer::Clock::time_point momentAfter(QVDuration delay) {
  return QVAsioRunLoopTimer::Clock::now() +
         std::clamp(delay, QVDuration::zero(), QVRunLoopTimer::kLongestDelay);
}

}  // namespace

QVAsioRunLoopTimer::QVAsioRunLoopTimer(QVDuration delay, QVFunction<void()> action)
    : fireDate_(momentAfter(delay)), action_(std::move(action)) {}

void QVAsioRunLoopTimer::fireAfter(QVDuration delay) {
  const auto fireDate = momentAfter(delay);
  {
    const QVMutexLock lock(mutex_);
    if (std::exchange(fireDate_, fireDate) <= fireDate) return;
  }
  wakeLoop();
}

void QVAsioRunLoopTimer::invalidate() {
  spend();
  wakeLoop();
}

void QVAsioRunLoopTimer::attachTo(std::weak_ptr<QVAsioRunLoopWaits> waits) {
  const QVMutexLock lock(mutex_);
  waits_ = std::move(waits);
}

std::optional<QVAsioRunLoopTimer::Clock::time_point> QVAsioRunLoopTimer::fireDate() const {
  const QVMutexLock lock(mutex_);
  if (isSpent_) return std::nullopt;
  return fireDate_;
}

QVFunction<void()> QVAsioRunLoopTimer::spend() {
  const QVMutexLock lock(mutex_);
  isSpent_ = true;
  return std::move(action_);
}

void QVAsioRunLoopTimer::wakeLoop() {
  std::shared_ptr<QVAsioRunLoopWaits> waits;
  {
    const QVMutexLock lock(mutex_);
    waits = waits_.lock();
  }
  if (waits != nullptr) waits->lookAt(this);
}
