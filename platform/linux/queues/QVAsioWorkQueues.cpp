#include "platform/linux/queues/QVAsioWorkQueues.h"

#include "platform/linux/QVThreads.h"
#include "platform/linux/queues/QVAsioSerialQueue.h"
#include "platform/linux/queues/QVAsioThread.h"
#include "platform/linux/queues/QVConcurrentQueue.h"

#include <algorithm>
#include <chrono>
#include <string>
#include <thread>

namespace {

constexpr std::string_view kBackgroundLabel = "background";

// At the end, between looks for work that has no worker.
constexpr std::chrono::milliseconds kLookForWorkers{50};

// One runs, one more goes on where that one waits for something that is not a condition.
QVElasticWorkerPool::Limits defaultLimits() {
  QVElasticWorkerPool::Limits limits;
  limits.concurrency = std::max<std::size_t>(std::thread::hardware_concurrency(), 2);
  return limits;
}

// "qv-server" for "net.quillon.quietvox.reporting.server".
std::string threadName(std::string_view label) {
  return "qv-" + std::string(label.substr(label.rfind('.') + 1));
}

}  // namespace

QVAsioWorkQueues::QVAsioWorkQueues(QVLog& log, QVElasticWorkerPool::Limits limits)
    : log_(log),
      standardPool_("standard", QVNicenessForQuality(QVQualityOfService::standard, 0), log, ledger_,
                    limits),
      utilityPool_("utility", QVNicenessForQuality(QVQualityOfService::utility, 0), log, ledger_,
                   limits),
      backgroundPool_(std::string(kBackgroundLabel),
                      QVNicenessForQuality(QVQualityOfService::background, 0), log, ledger_,
                      limits),
      backgroundQueue_(
          std::make_shared<QVConcurrentQueue>(kBackgroundLabel, backgroundPool_, timers_)) {}

QVAsioWorkQueues::QVAsioWorkQueues(QVLog& log) : QVAsioWorkQueues(log, defaultLimits()) {}

QVAsioWorkQueues::~QVAsioWorkQueues() {
  drain();
}

QVWorkExecutor& QVAsioWorkQueues::poolOf(QVQualityOfService quality) {
  if (quality <= QVQualityOfService::background) return backgroundPool_;
  if (quality <= QVQualityOfService::utility) return utilityPool_;
  return standardPool_;
}

std::shared_ptr<QVWorkQueue> QVAsioWorkQueues::makeSerialQueue(std::string_view label,
                                                               QVQualityOfService quality,
                                                               int32_t relativePriority) {
  if (quality < QVQualityOfService::userInitiated) {
    return std::make_shared<QVAsioSerialQueue>(label, poolOf(quality), timers_, log_);
  }
  auto thread = std::make_unique<QVAsioThread>(
      threadName(label), QVNicenessForQuality(quality, relativePriority), log_, ledger_);
  auto queue = std::make_shared<QVAsioSerialQueue>(label, *thread, timers_, log_);
  const QVMutexLock lock(mutex_);
  ownThreads_.push_back(std::move(thread));
  return queue;
}

std::shared_ptr<QVWorkQueue> QVAsioWorkQueues::backgroundQueue() {
  return backgroundQueue_;
}

void QVAsioWorkQueues::drain() {
  timers_.hurry();
  // Nobody submits any more who would have workers made that could not be made before.
  while (!ledger_.waitUntilEmpty(kLookForWorkers)) {
    for (QVElasticWorkerPool* const pool : {&standardPool_, &utilityPool_, &backgroundPool_}) {
      pool->runUnattended();
    }
  }
  std::vector<QVWorkExecutor*> executors{&standardPool_, &utilityPool_, &backgroundPool_};
  {
    const QVMutexLock lock(mutex_);
    for (const auto& thread : ownThreads_) executors.push_back(thread.get());
  }
  for (QVWorkExecutor* const executor : executors) executor->close();
}
