#pragma once

#include "platform/QVLog.h"
#include "platform/QVWorkQueue.h"
#include "platform/linux/QVThreadAnnotations.h"
#include "platform/linux/queues/QVAsioTimers.h"
#include "platform/linux/queues/QVWorkExecutor.h"
#include "platform/linux/queues/QVWorkItems.h"

#include <memory>
#include <string>

// A serial queue on an executor: items collect in a buffer, and the queue submits itself when the
// buffer stops being empty; it then runs what is there as one batch. So an item costs a move into
// the buffer, and only a batch costs a task and a wake-up; Asio's strand would allocate for each
// item. There may be many queues, most of them idle: those have no buffer.
//
// Made by QVAsioWorkQueues. Threads: as QVWorkQueue.
// Ownership: a submitted task holds the queue, so a handle may go at any time. Executor, timers and
// log outlive every use but the destruction of the queue; once the executor is closed, items are
// destroyed at once by whoever enqueues them.
// Failures: async() throws std::bad_alloc where there is no memory for the item or for the task. In
// the second case the items stay, and the next one submits the queue again; within a batch of
// wake-ups that is one error line.
// States: idle (buffer empty) -> scheduled (submitted or running) -> idle.
class QVAsioSerialQueue final : public QVWorkQueue,
                                public std::enable_shared_from_this<QVAsioSerialQueue> {
 public:
  QVAsioSerialQueue(std::string_view label, QVWorkExecutor& executor, QVAsioTimers& timers,
                    QVLog& log);

  void async(QVWorkItem item) override;
  void asyncAfter(QVDuration delay, QVWorkItem item) override;
  std::string_view label() const override { return label_; }

 private:
  void submit();
  void submitLater() noexcept;
  void unschedule() noexcept;
  void run();
  bool runBatch();

  const std::string label_;
  QVWorkExecutor& executor_;
  QVAsioTimers& timers_;
  QVLog& log_;

  QVMutex mutex_;
  QVWorkItems enqueued_ QV_GUARDED_BY(mutex_);
  bool isScheduled_ QV_GUARDED_BY(mutex_) = false;
};
