#pragma once

#include "platform/QVLog.h"
#include "platform/QVRunLoopThread.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <memory>
#include <thread>
#include <vector>

// Dedicated threads of the standard library, each with a QVAsioRunLoop. As long as none is started
// there is nothing but this object; a thread that has ended is collected when the next one starts,
// or at the end.
//
// Threads: as QVRunLoopThreads. Made and destroyed by the composition root; the end waits for every
// body.
class QVAsioRunLoopThreads final : public QVRunLoopThreads {
 public:
  explicit QVAsioRunLoopThreads(QVLog& log) : log_(log) {}
  ~QVAsioRunLoopThreads() override;
  QVAsioRunLoopThreads(const QVAsioRunLoopThreads&) = delete;
  QVAsioRunLoopThreads& operator=(const QVAsioRunLoopThreads&) = delete;

  std::shared_ptr<QVRunLoopThread> startThread(std::string_view name, Body body) override;
  std::shared_ptr<QVRunLoopTimer> makeTimer(QVDuration delay, QVFunction<void()> action) override;
  // A pool's worker that pauses lets another one run meanwhile.
  void pause(QVDuration duration) override;

 private:
  class Handle;
  struct Started {
    std::shared_ptr<Handle> handle;
    std::thread thread;
  };

  QVLog& log_;
  QVMutex mutex_;
  std::vector<Started> threads_ QV_GUARDED_BY(mutex_);
};
