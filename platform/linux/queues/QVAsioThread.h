#pragma once

#include "platform/QVLog.h"
#include "platform/linux/QVThreadAnnotations.h"
#include "platform/linux/queues/QVWorkExecutor.h"
#include "platform/linux/queues/QVWorkLedger.h"

#include <memory>
#include <string>
#include <thread>

namespace asio {
class io_context;
}

// An executor of one thread of its own, which runs an Asio io_context: for a queue that must not
// wait behind others, such as the server queue. The thread sleeps without a time limit while there
// is nothing to do.
//
// Used by QVAsioWorkQueues. Threads: as QVWorkExecutor.
// Failures: the constructor throws std::system_error where no thread can be had.
class QVAsioThread final : public QVWorkExecutor {
 public:
  QVAsioThread(std::string name, int niceness, QVLog& log, QVWorkLedger& ledger);
  ~QVAsioThread() override;
  QVAsioThread(const QVAsioThread&) = delete;
  QVAsioThread& operator=(const QVAsioThread&) = delete;

  [[nodiscard]] bool submit(QVWorkItem& task) override;
  void close() override;

 private:
  struct WorkGuard;

  const std::string name_;
  QVLog& log_;
  QVWorkLedger& ledger_;
  const std::unique_ptr<asio::io_context> context_;
  QVMutex mutex_;
  // Keeps the thread in the loop; null once closed.
  std::unique_ptr<WorkGuard> guard_ QV_GUARDED_BY(mutex_);
  std::thread thread_;
};
