#pragma once

#include "platform/QVLog.h"
#include "platform/QVRunLoopThread.h"
#include "platform/fake/QVFakeClock.h"
#include "platform/fake/QVFakeRunLoopThread.h"
#include "platform/fake/QVFakeWorkQueues.h"

#include <memory>
#include <mutex>
#include <vector>

// Threads in the virtual time of a QVFakeWorkQueues: they run while the test runs items or moves
// the time, one at a time, and what they wait for counts there as delayed items. A test that pauses
// lets the time pass and the others go on.
//
// Threads: makes threads and timers for any; pause() is for the thread that runs the items and for
// those made here.
// Ownership: ends its threads at its own end, or earlier by discard(); a test tells their bodies to
// return before. Outlived by queues, clock and log.
class QVFakeRunLoopThreads final : public QVRunLoopThreads {
 public:
  QVFakeRunLoopThreads(QVFakeWorkQueues& queues, QVFakeClock& clock, QVLog& log)
      : queues_(queues), clock_(clock), log_(log) {}
  ~QVFakeRunLoopThreads() override { discard(); }
  QVFakeRunLoopThreads(const QVFakeRunLoopThreads&) = delete;
  QVFakeRunLoopThreads& operator=(const QVFakeRunLoopThreads&) = delete;

  std::shared_ptr<QVRunLoopThread> startThread(std::string_view name, Body body) override;
  std::shared_ptr<QVRunLoopTimer> makeTimer(QVDuration delay, QVFunction<void()> action) override;
  void pause(QVDuration duration) override;

  // From now on there are no threads to be had.
  void refuseThreads();
  // Every thread started so far, in order.
  std::vector<std::shared_ptr<QVRunLoopThread>> threads() const;
  // Ends all threads: their waits end at once and their timers do not fire any more.
  void discard();

 private:
  QVFakeWorkQueues& queues_;
  QVFakeClock& clock_;
  QVLog& log_;
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  std::vector<std::shared_ptr<QVFakeRunLoopThread>> threads_;
  bool refusesThreads_ = false;
};
