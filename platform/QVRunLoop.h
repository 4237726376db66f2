#pragma once

#include "platform/QVDate.h"

#include <chrono>
#include <memory>

// A timer that fires once, on the thread of the run loop that it is attached to. Made by
// QVRunLoopThreads.
//
// The moment at which it fires, its fire date, is a moment of steady time that counts from when it
// was made or last moved, attached or not: one whose fire date has passed fires at once when it is
// attached.
//
// States: waiting -> spent, when it fires (before its action begins) or is invalidated. A spent
// timer never fires again, whatever is done with it.
// Threads: any, at once, also from its own action. No call waits for an action.
// Ownership: the loop holds an attached timer until it is spent. The timer owns its action, and
// destroys it on the loop's thread once it has run, or in invalidate(), or with itself.
class QVRunLoopTimer {
 public:
  // Longer delays are cut to this, which keeps every fire date within a clock's range.
  static constexpr QVDuration kLongestDelay = std::chrono::hours{24 * 365};

  virtual ~QVRunLoopTimer() = default;
  // Moves the fire date to `delay` from now; one that is not positive is now.
  virtual void fireAfter(QVDuration delay) = 0;
  virtual void invalidate() = 0;
};

// What a dedicated thread waits in for its timers.
//
// Threads: its own alone; not from the action of one of its timers.
// Ownership: belongs to the thread, lives as long as its body. Timers that are still attached then
// are spent.
class QVRunLoop {
 public:
  virtual ~QVRunLoop() = default;
  // From the next run() on the timer fires here. To be attached once; a spent one is passed over.
  virtual void attach(std::shared_ptr<QVRunLoopTimer> timer) = 0;
  // Waits for the attached timers and calls their actions, one at a time, in the order of their
  // fire dates. Returns when no attached timer is left. An exception that escapes an action is
  // logged once at error level on the default log, and the loop goes on.
  virtual void run() = 0;
};
