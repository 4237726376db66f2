#pragma once

#include "platform/linux/queues/QVAsioRunLoopTimer.h"

#include <memory>
#include <unordered_map>

#include <asio/io_context.hpp>
#include <asio/steady_timer.hpp>

// What a QVAsioRunLoop waits for: an Asio timer for each of its attached timers. An event loop
// without anything left to wait for returns, which is just what the loop is to do.
//
// Threads: the loop's; lookAt() any.
// Ownership: the loop's. Timers know it weakly, and hold it while they wake it.
class QVAsioRunLoopWaits {
 public:
  // Begins to wait for the timer.
  void add(std::shared_ptr<QVAsioRunLoopTimer> timer);
  // Returns when no timer is left, or throws what an action throws; then it is called again.
  void run() { context_.run(); }
  void prepareRun() { context_.restart(); }
  // Makes the attached timers spent ones.
  void spendAll();

  // Looks anew at what became of the timer, on the loop's thread.
  void lookAt(const QVAsioRunLoopTimer* timer);

 private:
  struct Wait {
    std::shared_ptr<QVAsioRunLoopTimer> timer;
    asio::steady_timer wakeUp;
  };

  void begin(Wait& wait, QVAsioRunLoopTimer::Clock::time_point moment);
  void waitEnded(const QVAsioRunLoopTimer* timer);

  asio::io_context context_{1};
  std::unordered_map<const QVAsioRunLoopTimer*, Wait> waits_;
};
