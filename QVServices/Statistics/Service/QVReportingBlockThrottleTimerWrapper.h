#pragma once

#include "platform/QVFunction.h"
#include "platform/QVRunLoop.h"

#include <memory>
#include <utility>

// What QVReportingBlockThrottle keeps for a pending key: the block that is to run, and the timer
// that says when.
//
// Threads: every operation with the throttle's lock on timersInFlight held.
class QVReportingBlockThrottleTimerWrapper {
 public:
  using Block = QVFunction<void()>;

  explicit QVReportingBlockThrottleTimerWrapper(Block block) : block_(std::move(block)) {}

  // Puts a block in the place of the present one and answers that one, so that what it holds can be
  // destroyed without the lock.
  [[nodiscard]] Block setBlock(Block block) { return std::exchange(block_, std::move(block)); }

  // Set once, before the wrapper is stored.
  const std::shared_ptr<QVRunLoopTimer>& timer() const { return timer_; }
  void setTimer(std::shared_ptr<QVRunLoopTimer> timer) { timer_ = std::move(timer); }

  // Moves the timer to fire that many seconds from now.
  void sleepFor(double seconds);

 private:
  Block block_;
  std::shared_ptr<QVRunLoopTimer> timer_;
};
