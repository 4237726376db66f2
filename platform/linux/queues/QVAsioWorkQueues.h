#pragma once

#include "platform/QVLog.h"
#include "platform/QVWorkQueue.h"
#include "platform/linux/QVThreadAnnotations.h"
#include "platform/linux/queues/QVAsioTimers.h"
#include "platform/linux/queues/QVElasticWorkerPool.h"
#include "platform/linux/queues/QVWorkExecutor.h"
#include "platform/linux/queues/QVWorkLedger.h"

#include <memory>
#include <vector>

// The process's work queues. A serial queue of user-initiated quality and above has a thread of its
// own (QVAsioThread) until the end, so there are to be few of them; the others share an elastic
// pool of workers (QVElasticWorkerPool) per quality, the background queue that of its quality.
// Threads are made when first needed; a pool that is idle has one, asleep. Quality and relative
// priority show as the niceness of threads, the latter only where a queue has its own.
//
// Threads: as QVWorkQueues. The composition root makes it and ends it with drain().
// States: open -> draining -> closed. While draining, nothing is delayed any more. Once closed,
// items are destroyed unrun by whoever enqueues them.
class QVAsioWorkQueues final : public QVWorkQueues {
 public:
  QVAsioWorkQueues(QVLog& log, QVElasticWorkerPool::Limits limits);
  explicit QVAsioWorkQueues(QVLog& log);
  ~QVAsioWorkQueues() override;
  QVAsioWorkQueues(const QVAsioWorkQueues&) = delete;
  QVAsioWorkQueues& operator=(const QVAsioWorkQueues&) = delete;

  std::shared_ptr<QVWorkQueue> makeSerialQueue(std::string_view label, QVQualityOfService quality,
                                               int32_t relativePriority) override;
  std::shared_ptr<QVWorkQueue> backgroundQueue() override;

  // The end of the service: runs everything that is enqueued, and what that enqueues, on all
  // queues; delayed items at once, in the order in which they would have been due (a message that
  // was put off to spread load is not lost with the service). Then ends and joins all threads.
  // Waits as long as the items take; conditions' waits are to be cut short before. Not from an
  // item. Doing it again does nothing.
  void drain();

 private:
  QVWorkExecutor& poolOf(QVQualityOfService quality);

  QVLog& log_;
  // In this order: threads leave the ledger and are gone before it, timers' queues need executors.
  QVWorkLedger ledger_;
  QVElasticWorkerPool standardPool_;
  QVElasticWorkerPool utilityPool_;
  QVElasticWorkerPool backgroundPool_;
  QVMutex mutex_;
  std::vector<std::unique_ptr<QVWorkExecutor>> ownThreads_ QV_GUARDED_BY(mutex_);
  QVAsioTimers timers_;
  const std::shared_ptr<QVWorkQueue> backgroundQueue_;
};
