#pragma once

#include "platform/QVWorkQueue.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <chrono>
#include <map>
#include <memory>
#include <thread>
#include <vector>

// Enqueues items later: one Asio timer for the earliest of all delayed items, on a thread that
// exists only while there are some (an event loop without anything left to wait for returns).
//
// Used by the queues. Threads: any. Holds a queue until its delayed items are enqueued.
// States: open -> hurried, by hurry(): from then on nothing is delayed any more.
// Failures: where no thread can be had, the item is enqueued at once.
class QVAsioTimers {
 public:
  QVAsioTimers();
  ~QVAsioTimers();
  QVAsioTimers(const QVAsioTimers&) = delete;
  QVAsioTimers& operator=(const QVAsioTimers&) = delete;

  void enqueueAfter(QVDuration delay, std::shared_ptr<QVWorkQueue> queue, QVWorkItem item);
  // Enqueues every delayed item now, in the order in which they are due, and ends the thread.
  void hurry();

 private:
  using Clock = std::chrono::steady_clock;
  struct Delayed {
    std::shared_ptr<QVWorkQueue> queue;
    QVWorkItem item;
  };
  struct Loop;

  bool startThread() QV_REQUIRES(mutex_);
  void interruptWait();
  void run();
  std::vector<Delayed> takeDue();

  const std::unique_ptr<Loop> loop_;
  QVMutex mutex_;
  // Equal moments keep the order of arrival.
  std::multimap<Clock::time_point, Delayed> delayed_ QV_GUARDED_BY(mutex_);
  bool isRunning_ QV_GUARDED_BY(mutex_) = false;
  bool isHurried_ QV_GUARDED_BY(mutex_) = false;
  std::thread thread_ QV_GUARDED_BY(mutex_);
};
