#pragma once

#include "platform/QVFunction.h"
#include "platform/QVRunLoop.h"
#include "platform/fake/QVFakeClock.h"

#include <memory>
#include <mutex>
#include <optional>

class QVFakeRunLoopThread;

// A timer in virtual time. Made by QVFakeRunLoopThreads. Attaching it twice ends the program with a
// message.
//
// Threads: any.
class QVFakeRunLoopTimer final : public QVRunLoopTimer {
 public:
  QVFakeRunLoopTimer(const QVFakeClock& clock, QVDuration delay, QVFunction<void()> action);

  void fireAfter(QVDuration delay) override;
  void invalidate() override;

  // For the loop. Remembers whom to wake when the fire date moves.
  void attachTo(std::weak_ptr<QVFakeRunLoopThread> thread);
  // Nothing once it is spent.
  std::optional<QVDuration> fireDate() const;
  // Makes it a spent one and answers its action; an empty one where it already was.
  QVFunction<void()> spend();

 private:
  QVDuration momentAfter(QVDuration delay) const;
  void wakeThread() const;

  const QVFakeClock& clock_;
  mutable std::mutex mutex_;
  // All below are guarded by the mutex.
  QVDuration fireDate_;
  QVFunction<void()> action_;
  bool isSpent_ = false;
  bool isAttached_ = false;
  std::weak_ptr<QVFakeRunLoopThread> thread_;
};
