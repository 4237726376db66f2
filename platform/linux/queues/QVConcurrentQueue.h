#pragma once

#include "platform/QVWorkQueue.h"
#include "platform/linux/queues/QVAsioTimers.h"
#include "platform/linux/queues/QVWorkExecutor.h"

#include <memory>
#include <string>

// The concurrent queue of an executor with several threads: each item is a task.
//
// Made by QVAsioWorkQueues. Threads, ownership: as QVAsioSerialQueue.
class QVConcurrentQueue final : public QVWorkQueue,
                                public std::enable_shared_from_this<QVConcurrentQueue> {
 public:
  QVConcurrentQueue(std::string_view label, QVWorkExecutor& executor, QVAsioTimers& timers)
      : label_(label), executor_(executor), timers_(timers) {}

  void async(QVWorkItem item) override {
    // One that is refused is destroyed here.
    static_cast<void>(executor_.submit(item));
  }
  void asyncAfter(QVDuration delay, QVWorkItem item) override {
    timers_.enqueueAfter(delay, shared_from_this(), std::move(item));
  }
  std::string_view label() const override { return label_; }

 private:
  const std::string label_;
  QVWorkExecutor& executor_;
  QVAsioTimers& timers_;
};
