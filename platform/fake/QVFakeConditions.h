#pragma once

#include "platform/QVCondition.h"
#include "platform/fake/QVFakeCondition.h"

#include <atomic>
#include <memory>
#include <vector>

// Makes conditions that wait in the virtual time of a QVFakeWorkQueues, and keeps them for tests
// to look at. Threads: the one that runs the items. Outlived by the queues and the clock; outlives
// its conditions' waits.
class QVFakeConditions final : public QVConditions {
 public:
  QVFakeConditions(QVFakeWorkQueues& queues, const QVFakeClock& clock)
      : queues_(queues), clock_(clock) {}

  std::shared_ptr<QVCondition> makeCondition() override {
    made_.push_back(std::make_shared<QVFakeCondition>(queues_, clock_, waitsAreCutShort_));
    return made_.back();
  }

  // As at the end of the service: present and future waits end at once, as timed out.
  void cutWaitsShort() { waitsAreCutShort_ = true; }

  const std::vector<std::shared_ptr<QVFakeCondition>>& made() const { return made_; }

 private:
  QVFakeWorkQueues& queues_;
  const QVFakeClock& clock_;
  std::atomic<bool> waitsAreCutShort_{false};
  std::vector<std::shared_ptr<QVFakeCondition>> made_;
};
