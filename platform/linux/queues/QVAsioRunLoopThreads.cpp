#include "platform/linux/queues/QVAsioRunLoopThreads.h"

#include "platform/linux/QVLogException.h"
#include "platform/linux/QVThreads.h"
#include "platform/linux/QVWakeUpBatch.h"
#include "platform/linux/queues/QVAsioRunLoop.h"
#include "platform/linux/queues/QVAsioRunLoopTimer.h"
#include "platform/linux/queues/QVWorkerBlocking.h"

#include <atomic>
#include <string>
#include <system_error>
#include <utility>

class QVAsioRunLoopThreads::Handle final : public QVRunLoopThread {
 public:
  explicit Handle(std::string_view name) : name_(name) {}

  std::string_view name() const override { return name_; }
  bool isFinished() const override { return isFinished_; }

  // The thread's whole life.
  void run(Body body, QVLog& log) {
    QVPrepareThread(name_, 0);
    {
      QVAsioRunLoop loop(name_, log);
      try {
        body(loop);
      } catch (...) {
        QVLogException(log, "-[QVAsioRunLoopThreads startThread:body:]", "thread", name_);
      }
    }
    body = nullptr;
    isFinished_ = true;
  }

 private:
  const std::string name_;
  std::atomic<bool> isFinished_{false};
};

QVAsioRunLoopThreads::~QVAsioRunLoopThreads() {
  std::vector<Started> threads;
  {
    const QVMutexLock lock(mutex_);
    threads.swap(threads_);
  }
  for (Started& started : threads) started.thread.join();
}

std::shared_ptr<QVRunLoopThread> QVAsioRunLoopThreads::startThread(std::string_view name,
                                                                   Body body) {
  const QVMutexLock lock(mutex_);
  std::erase_if(threads_, [](Started& started) {
    if (!started.handle->isFinished()) return false;
    started.thread.join();
    return true;
  });
  threads_.push_back({std::make_shared<Handle>(name), {}});
  auto& [handle, thread] = threads_.back();
  try {
    thread = std::thread([shared = handle, body = std::move(body), &log = log_]() mutable {
      shared->run(std::move(body), log);
    });
  } catch (const std::system_error& failure) {
    log_.error(nullptr, "-[QVAsioRunLoopThreads startThread:body:]", "no thread for ", name, ": ",
               failure.what());
    threads_.pop_back();
    return nullptr;
  }
  return handle;
}

std::shared_ptr<QVRunLoopTimer> QVAsioRunLoopThreads::makeTimer(QVDuration delay,
                                                                QVFunction<void()> action) {
  return std::make_shared<QVAsioRunLoopTimer>(delay, std::move(action));
}

void QVAsioRunLoopThreads::pause(QVDuration duration) {
  if (duration <= QVDuration::zero()) return;
  QVWakeUpBatch::wakeNow();
  const QVWorkerBlocking blocking;
  std::this_thread::sleep_for(duration);
}
