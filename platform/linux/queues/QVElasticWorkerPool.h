#pragma once

#include "platform/QVLog.h"
#include "platform/linux/QVThreadAnnotations.h"
#include "platform/linux/queues/QVWorkExecutor.h"
#include "platform/linux/queues/QVWorkLedger.h"

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <deque>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

// An executor whose number of threads follows the work: as many run as there are processors, and
// one more for each that is blocked in a wait (QVWorkerBlocking tells), so that work that can run
// does run. Threads are made when a task finds none free. One worker is on its way at a time: when
// it has come and finds more than it can do at once, it sends for the next, so a burst of short
// tasks costs few wake-ups. The worker that rested last is the first to be used again, so those in
// excess stay idle and retire; the last one stays, asleep without a time limit. (Asio's own
// io_context cannot serve here: it wakes its idle threads in turn, so that none would ever retire,
// and those that may retire once a second.)
//
// Used by QVAsioWorkQueues, one pool per quality of service. Threads: as QVWorkExecutor.
// Failures: where no thread can be had, tasks wait for the next submission or a free worker, or for
// runUnattended(); one error line says so for as long as it lasts.
class QVElasticWorkerPool final : public QVWorkExecutor {
 public:
  struct Limits {
    // Threads that may run at once, blocked ones not counted.
    std::size_t concurrency = 2;
    // Threads in all. One waiting session takes one; beyond this, tasks wait until a worker is
    // free. 1,024 stacks of 8 MiB are address space, not memory, and far below what the kernel
    // allows a process.
    std::size_t workers = 1'024;
    // How long a worker in excess rests before it retires. Longer than the pauses between bursts,
    // short against the life of the service.
    std::chrono::milliseconds rest{5'000};
  };

  QVElasticWorkerPool(std::string name, int niceness, QVLog& log, QVWorkLedger& ledger,
                      Limits limits);
  ~QVElasticWorkerPool() override;
  QVElasticWorkerPool(const QVElasticWorkerPool&) = delete;
  QVElasticWorkerPool& operator=(const QVElasticWorkerPool&) = delete;

  [[nodiscard]] bool submit(QVWorkItem& task) override;
  void close() override;
  // Runs tasks on the calling thread for as long as there is no worker at all and none to be had.
  void runUnattended();

  // The pool whose worker the calling thread is; null for other threads.
  static QVElasticWorkerPool* current() noexcept;
  // Told by the calling worker before and after it waits for something that other work may bring
  // about.
  void willBlock();
  void didBlock();

 private:
  // A resting worker, on its own stack.
  struct Worker {
    std::condition_variable wake;
    bool isWanted = false;
  };

  void sendForWorker() QV_REQUIRES(mutex_);
  void addWorker() QV_REQUIRES(mutex_);
  bool sayWhyThereIsNoThread(std::string_view reason) const noexcept;
  void work();
  QVWorkItem takeFirst() QV_REQUIRES(mutex_);
  void run(QVWorkItem& task);
  bool rest(QVMutexLock& lock) QV_REQUIRES(mutex_);
  std::thread retire() QV_REQUIRES(mutex_);

  const std::string name_;
  const int niceness_;
  QVLog& log_;
  QVWorkLedger& ledger_;
  const Limits limits_;

  QVMutex mutex_;
  std::deque<QVWorkItem> ready_ QV_GUARDED_BY(mutex_);
  std::vector<Worker*> resting_ QV_GUARDED_BY(mutex_);  // the last to rest is the last
  std::size_t workerCount_ QV_GUARDED_BY(mutex_) = 0;
  std::size_t blockedCount_ QV_GUARDED_BY(mutex_) = 0;
  bool workerIsComing_ QV_GUARDED_BY(mutex_) = false;  // woken or made, and has not looked yet
  bool closed_ QV_GUARDED_BY(mutex_) = false;
  bool lacksThreads_ QV_GUARDED_BY(mutex_) = false;
  std::vector<std::thread> threads_ QV_GUARDED_BY(mutex_);
  // The thread that retired last; the next one to retire joins it, so that no stack is kept.
  std::thread retired_ QV_GUARDED_BY(mutex_);
  std::condition_variable lastGone_;
};
