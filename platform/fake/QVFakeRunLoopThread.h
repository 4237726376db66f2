#pragma once

#include "platform/QVLog.h"
#include "platform/QVRunLoopThread.h"
#include "platform/fake/QVFakeClock.h"
#include "platform/fake/QVFakeWorkQueues.h"

#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

// A thread in virtual time. It is a real thread, but it runs only while the one that moves the time
// stands still for it: a turn is handed to it by an item of the fake queues, at the moment until
// which it waits, and it hands the turn back when it waits again or ends. So exactly one of all
// threads runs at any time, and always in the same order.
//
// Made by QVFakeRunLoopThreads, which ends it. Threads: what the comments say; handle and wake()
// any.
// States: not begun -> running <-> waiting -> finished; end() leads to finished from all.
class QVFakeRunLoopThread final : public QVRunLoopThread,
                                  public std::enable_shared_from_this<QVFakeRunLoopThread> {
 public:
  QVFakeRunLoopThread(std::string_view name, QVFakeWorkQueues& queues, const QVFakeClock& clock,
                      QVLog& log);
  ~QVFakeRunLoopThread() override;
  QVFakeRunLoopThread(const QVFakeRunLoopThread&) = delete;
  QVFakeRunLoopThread& operator=(const QVFakeRunLoopThread&) = delete;

  std::string_view name() const override { return name_; }
  bool isFinished() const override { return isFinished_; }

  // Its first turn comes with the next items that are run.
  void start(QVRunLoopThreads::Body body);
  // Lets it run until its body returns, without waits from now on; a body that has not begun never
  // does. On the thread that runs the items. A body that goes on pausing ends the program with a
  // message.
  void end();
  bool isEnding() const { return isEnding_; }

  // The one that calls; null on every other thread.
  static QVFakeRunLoopThread* current() { return current_; }

  // On the thread itself: lets others run until virtual time is at `deadline`, or until wake().
  void waitUntil(QVDuration deadline);
  // On the thread itself, as QVRunLoopThreads.
  void pause(QVDuration duration);
  // Ends the present wait, or the next one where there is none, early.
  void wake();

 private:
  enum class Turn { others, thread };

  void main(QVRunLoopThreads::Body body);
  void handOver();
  void waitForTurn(std::unique_lock<std::mutex>& lock, Turn turn);
  void resumeAfter(QVDuration delay, uint64_t waitNumber);
  void resume(uint64_t waitNumber);

  static inline thread_local QVFakeRunLoopThread* current_ = nullptr;

  const std::string name_;
  QVFakeWorkQueues& queues_;
  const QVFakeClock& clock_;
  QVLog& log_;
  std::atomic<bool> isEnding_{false};
  std::atomic<bool> isFinished_{false};
  std::size_t pausesWhileEnding_ = 0;  // the thread's own

  std::mutex mutex_;
  std::condition_variable changed_;
  // All below are guarded by the mutex.
  Turn turn_ = Turn::others;
  bool isWaiting_ = true;    // for its turn; at first for the one to begin
  bool isWoken_ = false;     // by wake() while it did not wait
  uint64_t waitNumber_ = 0;  // of the present wait or the last one
  std::thread thread_;       // the owner's
};
