#include "client/QVReporterFlushes.h"

#include <algorithm>
#include <utility>

QVClientError::Code QVReporterFlushes::wait(uint64_t lastRecord,
                                            std::chrono::milliseconds timeLimit,
                                            const std::function<void()>& wake) {
  // Beyond this the sum with the current time could overflow.
  constexpr std::chrono::milliseconds kLongest = std::chrono::hours(24 * 365);
  const auto deadline = std::chrono::steady_clock::now() +
                        std::clamp(timeLimit, std::chrono::milliseconds::zero(), kLongest);
  QVMutexLock lock(mutex_);
  const uint64_t mine = ++requested_;
  lastRecord_ = std::max(lastRecord_, lastRecord);
  wake();
  while (settled_ < mine) {
    if (hasEnded_) return QVClientError::Code::closed;
    if (lock.waitUntil(changed_, deadline) == std::cv_status::timeout && settled_ < mine) {
      return QVClientError::Code::timedOut;
    }
  }
  return QVClientError::Code::none;
}

bool QVReporterFlushes::begin(uint64_t& lastRecord) {
  QVMutexLock lock(mutex_);
  if (underWay_ != 0 || requested_ == settled_) return false;
  underWay_ = requested_;
  lastRecord = lastRecord_;
  return true;
}

void QVReporterFlushes::settle() {
  QVMutexLock lock(mutex_);
  settled_ = std::exchange(underWay_, 0);
  changed_.notify_all();
}

void QVReporterFlushes::end() {
  QVMutexLock lock(mutex_);
  hasEnded_ = true;
  changed_.notify_all();
}
