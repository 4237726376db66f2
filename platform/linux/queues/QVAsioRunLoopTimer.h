#pragma once

#include "platform/QVFunction.h"
#include "platform/QVRunLoop.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <chrono>
#include <memory>
#include <optional>

class QVAsioRunLoopWaits;

// A timer of a QVAsioRunLoop: a moment and an action; the waiting is done by the loop. Made by
// QVAsioRunLoopThreads. Threads: any.
class QVAsioRunLoopTimer final : public QVRunLoopTimer {
 public:
  using Clock = std::chrono::steady_clock;

  QVAsioRunLoopTimer(QVDuration delay, QVFunction<void()> action);

  // Wakes the loop only where the fire date comes earlier. A wait that ends too early begins anew,
  // so a timer that is put off again and again costs no wake-up each time.
  void fireAfter(QVDuration delay) override;
  void invalidate() override;

  // For the loop. Remembers whom to wake.
  void attachTo(std::weak_ptr<QVAsioRunLoopWaits> waits);
  // Nothing once it is spent.
  std::optional<Clock::time_point> fireDate() const;
  // Makes it a spent one and answers its action; an empty one where it already was.
  QVFunction<void()> spend();

 private:
  void wakeLoop();

  mutable QVMutex mutex_;
  Clock::time_point fireDate_ QV_GUARDED_BY(mutex_);
  QVFunction<void()> action_ QV_GUARDED_BY(mutex_);
  bool isSpent_ QV_GUARDED_BY(mutex_) = false;
  std::weak_ptr<QVAsioRunLoopWaits> waits_ QV_GUARDED_BY(mutex_);
};
