#pragma once

#include "platform/QVDate.h"

#include <memory>

// A lock with a wake-up channel. Signals are counted: a wake-up of the operating system's own
// making is not a signal and does not move the deadline; one signal ends one wait.
//
// Threads: any. lock() and unlock() follow a mutex's rules (not recursive); waitForTimeout() and
// signal() are called with the lock held.
class QVCondition {
 public:
  virtual ~QVCondition() = default;
  virtual void lock() = 0;
  virtual void unlock() = 0;
  // Releases the lock, sleeps until signalled or until `timeout` of steady time has passed since
  // the call, takes the lock again. True where it was signalled. While the service is ending,
  // waits end at once as if the time had passed.
  virtual bool waitForTimeout(QVDuration timeout) = 0;
  virtual void signal() = 0;
};

// Makes conditions. Threads: any.
class QVConditions {
 public:
  virtual ~QVConditions() = default;
  virtual std::shared_ptr<QVCondition> makeCondition() = 0;
};
