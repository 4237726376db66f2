#pragma once

#include "client/QVClientError.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>

// Threads that wait until what was sent before has become of something. One flush is worked off at
// a time; those that come meanwhile share the next one.
//
// Threads: as marked.
class QVReporterFlushes {
 public:
  // Any thread. `lastRecord` is how many records were sent until now; `wake` wakes the reporter's
  // thread. Answers none, timedOut or closed.
  QVClientError::Code wait(uint64_t lastRecord, std::chrono::milliseconds timeLimit,
                           const std::function<void()>& wake);

  // The reporter's thread. Begins the next flush, behind that many records; false where there is
  // none, or one is under way.
  bool begin(uint64_t& lastRecord);
  // The one under way is done.
  void settle();
  // No flush will ever be done any more.
  void end();

 private:
  QVMutex mutex_;
  std::condition_variable changed_;
  uint64_t requested_ QV_GUARDED_BY(mutex_) = 0;
  uint64_t lastRecord_ QV_GUARDED_BY(mutex_) = 0;
  uint64_t underWay_ QV_GUARDED_BY(mutex_) = 0;  // 0: none
  uint64_t settled_ QV_GUARDED_BY(mutex_) = 0;
  bool hasEnded_ QV_GUARDED_BY(mutex_) = false;
};
