#pragma once

#include "platform/QVLog.h"
#include "platform/QVRunLoop.h"
#include "platform/fake/QVFakeClock.h"
#include "platform/fake/QVFakeRunLoopTimer.h"

#include <memory>
#include <vector>

// The run loop of a QVFakeRunLoopThread, in virtual time; timers of one moment fire in the order in
// which they were attached. Wrong use (from another thread, run() from an action) ends the program
// with a message.
class QVFakeRunLoop final : public QVRunLoop {
 public:
  QVFakeRunLoop(QVFakeRunLoopThread& thread, const QVFakeClock& clock, QVLog& log)
      : thread_(thread), clock_(clock), log_(log) {}
  ~QVFakeRunLoop() override { spendAll(); }
  QVFakeRunLoop(const QVFakeRunLoop&) = delete;
  QVFakeRunLoop& operator=(const QVFakeRunLoop&) = delete;

  void attach(std::shared_ptr<QVRunLoopTimer> timer) override;
  // Once the thread is to end, returns at once, and the attached timers are spent without firing.
  void run() override;

 private:
  // The one that fires next; end() where none is left.
  std::vector<std::shared_ptr<QVFakeRunLoopTimer>>::iterator earliest();
  void fire(QVFakeRunLoopTimer& timer);
  void spendAll();

  QVFakeRunLoopThread& thread_;
  const QVFakeClock& clock_;
  QVLog& log_;
  std::vector<std::shared_ptr<QVFakeRunLoopTimer>> attached_;
  bool isRunning_ = false;
};
