#pragma once

#include "platform/QVCondition.h"
#include "platform/linux/QVThreadAnnotations.h"
#include "platform/linux/queues/QVStdCondition.h"

#include <atomic>
#include <memory>
#include <set>

// Makes conditions, and ends their waits when the service ends. Threads: any.
class QVStdConditions final : public QVConditions {
 public:
  std::shared_ptr<QVCondition> makeCondition() override;

  // From now on every wait, present or future, ends at once as timed out. Not with the lock of a
  // condition held.
  void cutWaitsShort();

  // For the conditions: brackets a wait, with the condition's lock held.
  void waitBegins(std::shared_ptr<QVStdCondition> condition);
  void waitEnds(const std::shared_ptr<QVStdCondition>& condition);
  bool waitsAreCutShort() const noexcept { return waitsAreCutShort_; }

 private:
  std::atomic<bool> waitsAreCutShort_{false};
  QVMutex mutex_;  // taken after a condition's, never before
  // One entry for each wait.
  std::multiset<std::shared_ptr<QVStdCondition>> waiting_ QV_GUARDED_BY(mutex_);
};
