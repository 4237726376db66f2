#pragma once

#include "platform/linux/queues/QVElasticWorkerPool.h"

// For the time of a wait: the calling thread, if it is a pool's worker, does not count as running,
// and the pool makes up for it.
class QVWorkerBlocking {
 public:
  QVWorkerBlocking() : pool_(QVElasticWorkerPool::current()) {
    if (pool_ != nullptr) pool_->willBlock();
  }
  ~QVWorkerBlocking() {
    if (pool_ != nullptr) pool_->didBlock();
  }
  QVWorkerBlocking(const QVWorkerBlocking&) = delete;
  QVWorkerBlocking& operator=(const QVWorkerBlocking&) = delete;

 private:
  QVElasticWorkerPool* const pool_;
};
