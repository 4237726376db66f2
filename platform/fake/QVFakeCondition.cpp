#include "platform/fake/QVFakeCondition.h"

#include "platform/fake/QVFakeAbort.h"

namespace {

void require(bool fulfilled, const char* rule) {
  if (!fulfilled) QVFakeAbort(std::string("QVFakeCondition: wrong use: ") + rule);
}

}  // namespace

QVFakeCondition::QVFakeCondition(QVFakeWorkQueues& queues, const QVFakeClock& clock,
                                 const std::atomic<bool>& waitsAreCutShort)
    : queues_(queues), clock_(clock), waitsAreCutShort_(waitsAreCutShort) {}

void QVFakeCondition::lock() {
  require(!locked_, "lock() while it is locked");
  locked_ = true;
}

void QVFakeCondition::unlock() {
  require(locked_, "unlock() without the lock");
  locked_ = false;
}

bool QVFakeCondition::waitForTimeout(QVDuration timeout) {
  require(locked_, "waitForTimeout() without the lock");
  ++waitCount_;
  ++waiterCount_;
  locked_ = false;
  bool signalled = false;
  if (!waitsAreCutShort_) {
    signalled = queues_.runOthersUntil(clock_.steadyTime() + timeout, [this] {
      return pendingSignalCount_ > 0 || waitsAreCutShort_;
    }) && pendingSignalCount_ > 0;
  }
  require(!locked_, "a work item that ran meanwhile kept it locked");
  locked_ = true;
  --waiterCount_;
  if (signalled) --pendingSignalCount_;
  return signalled;
}

void QVFakeCondition::signal() {
  require(locked_, "signal() without the lock");
  if (pendingSignalCount_ < waiterCount_) ++pendingSignalCount_;
}
