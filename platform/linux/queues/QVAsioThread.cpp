#include "platform/linux/queues/QVAsioThread.h"

#include "platform/linux/QVThreads.h"
#include "platform/linux/queues/QVRunWorkItem.h"

#include <utility>

#include <asio/executor_work_guard.hpp>
#include <asio/io_context.hpp>
#include <asio/post.hpp>

struct QVAsioThread::WorkGuard {
  asio::executor_work_guard<asio::io_context::executor_type> guard;
};

// The hint says that one thread runs the context, which spares it wake-ups; any may still post.
QVAsioThread::QVAsioThread(std::string name, int niceness, QVLog& log, QVWorkLedger& ledger)
    : name_(std::move(name)),
      log_(log),
      ledger_(ledger),
      context_(std::make_unique<asio::io_context>(1)),
      guard_(std::make_unique<WorkGuard>(WorkGuard{asio::make_work_guard(*context_)})),
      thread_([this, niceness] {
        QVPrepareThread(name_, niceness);
        context_->run();
      }) {}

QVAsioThread::~QVAsioThread() {
  close();
}

bool QVAsioThread::submit(QVWorkItem& task) {
  const QVMutexLock lock(mutex_);
  if (guard_ == nullptr) return false;
  ledger_.enter();
  try {
    asio::post(*context_, [this, work = std::move(task)]() mutable {
      QVRunWorkItem(work, name_, log_);
      ledger_.leave();
    });
  } catch (...) {
    ledger_.leave();
    throw;
  }
  return true;
}

void QVAsioThread::close() {
  {
    const QVMutexLock lock(mutex_);
    guard_ = nullptr;
  }
  if (thread_.joinable()) thread_.join();
}
