#include "platform/linux/queues/QVStdConditions.h"

#include <utility>

std::shared_ptr<QVCondition> QVStdConditions::makeCondition() {
  return std::make_shared<QVStdCondition>(*this);
}

// A wait that is not found here has yet to look at the flag, and will, after it has begun.
void QVStdConditions::cutWaitsShort() {
  std::multiset<std::shared_ptr<QVStdCondition>> waiting;
  {
    const QVMutexLock lock(mutex_);
    waitsAreCutShort_ = true;
    waiting = waiting_;
  }
  for (const auto& condition : waiting) condition->wakeAll();
}

void QVStdConditions::waitBegins(std::shared_ptr<QVStdCondition> condition) {
  const QVMutexLock lock(mutex_);
  waiting_.insert(std::move(condition));
}

void QVStdConditions::waitEnds(const std::shared_ptr<QVStdCondition>& condition) {
  const QVMutexLock lock(mutex_);
  waiting_.erase(waiting_.find(condition));
}
