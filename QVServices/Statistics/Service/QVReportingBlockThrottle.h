#pragma once

#include "QVServices/Statistics/Service/QVReportingBlockThrottleTimerWrapper.h"
#include "platform/QVRunLoopThread.h"
#include "platform/QVValue.h"

#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

// Delays the sending of a message and folds repeated messages into one: a block runs once, a delay
// after the last message that means the same arrived, and the blocks before it never run. The delay
// is the message's own ("_throttle_seconds"), else half a second. Stands alone, to be put in front
// of whatever sends.
//
// States of a key: absent -> created, its timer not yet attached to the thread's run loop (in
// timersInFlight and unscheduledTimerKeys) -> attached (in timersInFlight) -> absent, once its
// block has run.
// Threads: any for all operations. Blocks run on a thread of the throttle's own, one at a time,
// without a lock; that thread wakes ten times a second.
// Ownership: shared; the thread holds it too, so it lives on until the thread is told to end.
// Limits: none on the number of pending keys. A timer fires at most 5 s after the last message of
// its key once it is attached; it is attached when all that were attached before have fired, so a
// stream of equal messages that does not end holds back the keys that come after it. One that
// cannot be attached is tried again with each pass, with an error line.
class QVReportingBlockThrottle {
 public:
  using Block = QVReportingBlockThrottleTimerWrapper::Block;

  // A new one with its thread; null where there is no thread to be had.
  static std::shared_ptr<QVReportingBlockThrottle> init();

  // Schedules the block, or puts it in the place of the one that is pending for an equal message
  // and moves that one's timer. A block that comes for a key whose block is running is dropped: the
  // key is removed after it. An exception of a block frees its key and passes on to the run loop,
  // which logs it. An empty block does nothing when its time has come. Throws where there is no
  // memory; a key that was not pending is free then.
  void addMessageBlock(Block block, int64_t reporterID, const QVDictionary& message,
                       uint32_t category, uint16_t type);

  // Blocks the caller until a poll, twice a second, finds no key pending, for at most 5 s.
  void waitForCompletion();

  // The text that is equal for messages that mean the same. Ignored keys (the reserved ones, those
  // that the message lists under "_comparison_field_blacklist", and both volume keys where it has
  // both) take part by name, not by value.
  static std::string buildMessageKey(const QVDictionary& message, int64_t reporterID,
                                     uint32_t category, uint16_t type);
  // Seconds; a number below 5 of the message's own, else 0.5.
  static double determineSleepTime(const QVDictionary& message);

  // The thread ends after the pass in which it finds this switched off. Nothing of the service
  // does; what is added after that stays pending.
  bool shouldKeepRunning() const { return shouldKeepRunning_; }
  void setShouldKeepRunning(bool shouldKeepRunning) { shouldKeepRunning_ = shouldKeepRunning; }

  // The keys that are pending, in ascending order; those whose timers are not yet attached, in the
  // order in which they came; the thread.
  std::vector<std::string> timersInFlight() const;
  std::vector<std::string> unscheduledTimerKeys() const;
  const std::shared_ptr<QVRunLoopThread>& queueThread() const { return queueThread_; }

 private:
  using Wrapper = QVReportingBlockThrottleTimerWrapper;

  QVReportingBlockThrottle();
  void runThread(QVRunLoop& workingRunLoop);
  void attachUnscheduledTimers(QVRunLoop& workingRunLoop);
  std::shared_ptr<QVRunLoopTimer> timerOfUnscheduledKey(std::size_t index) const;
  void fire(const std::string& key);
  Block takeBlock(const std::string& key);
  void removeKey(const std::string& key);
  std::size_t timersInFlightCount() const;
  std::size_t unscheduledTimerKeysCount() const;

  // Of the bundle, whose member is taken away while the thread may still look for it.
  QVRunLoopThreads& threads_;
  std::atomic<bool> shouldKeepRunning_{true};
  std::shared_ptr<QVRunLoopThread> queueThread_;  // set by init

  // Each collection has its lock; the two are never held together.
  mutable std::recursive_mutex timersInFlightLock_;
  std::map<std::string, std::shared_ptr<Wrapper>, std::less<>> timersInFlight_;
  mutable std::recursive_mutex unscheduledTimerKeysLock_;
  std::vector<std::string> unscheduledTimerKeys_;
};
