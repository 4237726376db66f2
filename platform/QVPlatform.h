#pragma once

#include "platform/QVBeacon.h"
#include "platform/QVClock.h"
#include "platform/QVCondition.h"
#include "platform/QVCountwise.h"
#include "platform/QVDeviceInformation.h"
#include "platform/QVFileSystem.h"
#include "platform/QVIPC.h"
#include "platform/QVJSONOutput.h"
#include "platform/QVJoulewell.h"
#include "platform/QVLog.h"
#include "platform/QVNotifications.h"
#include "platform/QVOrientation.h"
#include "platform/QVPreferences.h"
#include "platform/QVProcess.h"
#include "platform/QVRandom.h"
#include "platform/QVRunLoopThread.h"
#include "platform/QVTally.h"
#include "platform/QVTracePoints.h"
#include "platform/QVWorkQueue.h"

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>

// The platform services that the core stands on, and their owner. The composition root (or a test)
// fills one and installs it before anything else runs; from then on it is only read, by any
// thread. Nothing of the core outlives it.
//
// Members are destroyed in reverse order: those that log, or run work, go before the log and the
// queues that they use.
class QVPlatform {
 public:
  std::unique_ptr<QVLog> log;
  std::unique_ptr<QVClock> clock;
  std::unique_ptr<QVRandom> random;
  std::unique_ptr<QVProcess> process;
  std::unique_ptr<QVTracePoints> tracePoints;
  std::unique_ptr<QVPreferences> preferences;
  std::unique_ptr<QVDeviceInformation> deviceInformation;
  std::unique_ptr<QVFileSystem> fileSystem;
  std::unique_ptr<QVJSONOutput> jsonOutput;
  std::unique_ptr<QVConditions> conditions;
  std::unique_ptr<QVWorkQueues> queues;
  std::unique_ptr<QVBeacon> beacon;
  std::unique_ptr<QVCountwise> countwise;
  std::unique_ptr<QVJoulewell> joulewell;
  std::unique_ptr<QVTally> tally;
  std::unique_ptr<QVOrientation> orientation;
  std::unique_ptr<QVNotifications> notifications;
  std::unique_ptr<QVRunLoopThreads> runLoopThreads;
  std::unique_ptr<QVIPCListener> listener;

  // Makes `platform` the one that shared() answers, in place of an earlier one; null takes it
  // away. The caller keeps it alive. Only while no other thread uses the core.
  static void install(QVPlatform* platform);
  static QVPlatform& shared();

  // Counts installations, so that state kept once per process starts anew for a new platform.
  static uint64_t generation();
};

// A value made once per installed platform, which in the service is once per process. Safe when
// several threads ask at the same time: one makes it, all see it.
template <class Value>
class QVOncePerPlatform {
 public:
  template <class Maker>
  Value get(Maker&& make) {
    if (isMade()) return value_;
    const std::lock_guard lock(mutex_);
    if (!isMade()) {
      value_ = make();
      generation_.store(QVPlatform::generation(), std::memory_order_release);
    }
    return value_;
  }

  // The value if it has been made, else an empty one.
  Value peek() const { return isMade() ? value_ : Value{}; }

 private:
  bool isMade() const {
    return generation_.load(std::memory_order_acquire) == QVPlatform::generation();
  }

  std::mutex mutex_;
  std::atomic<uint64_t> generation_{0};
  Value value_{};  // written before generation_, once per platform
};
