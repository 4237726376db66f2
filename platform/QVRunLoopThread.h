#pragma once

#include "platform/QVDate.h"
#include "platform/QVFunction.h"
#include "platform/QVRunLoop.h"

#include <memory>
#include <string_view>

// A thread of one's own, with a run loop. Threads: any. The handle may go at any time, also on the
// thread itself; the thread goes on until its body returns.
class QVRunLoopThread {
 public:
  virtual ~QVRunLoopThread() = default;
  virtual std::string_view name() const = 0;
  // Has its body returned, and is it destroyed?
  virtual bool isFinished() const = 0;
};

// Makes dedicated threads and the timers for their run loops. No thread exists until one is asked
// for.
//
// Threads: any.
// Ownership: outlives its threads: its end waits for them, so whoever starts one sees to it that
// its body returns. A timer may outlive it, but only to be destroyed.
class QVRunLoopThreads {
 public:
  using Body = QVFunction<void(QVRunLoop& runLoop)>;

  virtual ~QVRunLoopThreads() = default;
  // Starts a thread that calls `body` once and then destroys it. An exception that escapes the
  // body is logged once at error level on the default log and ends the thread. Null, with the body
  // destroyed and an error line, where there is no thread to be had.
  virtual std::shared_ptr<QVRunLoopThread> startThread(std::string_view name, Body body) = 0;
  // A timer that fires `delay` from now, once it is attached to a loop.
  virtual std::shared_ptr<QVRunLoopTimer> makeTimer(QVDuration delay,
                                                    QVFunction<void()> action) = 0;
  // Blocks the calling thread, whichever it is, for `duration` of steady time; returns at once
  // where that is not positive.
  virtual void pause(QVDuration duration) = 0;
};
