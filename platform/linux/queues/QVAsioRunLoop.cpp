#include "platform/linux/queues/QVAsioRunLoop.h"

#include "platform/linux/QVLogException.h"
#include "platform/linux/queues/QVAsioRunLoopTimer.h"
#include "platform/linux/queues/QVAsioRunLoopWaits.h"

#include <utility>

QVAsioRunLoop::QVAsioRunLoop(std::string threadName, QVLog& log)
    : threadName_(std::move(threadName)),
      log_(log),
      waits_(std::make_shared<QVAsioRunLoopWaits>()) {}

QVAsioRunLoop::~QVAsioRunLoop() {
  waits_->spendAll();
}

void QVAsioRunLoop::attach(std::shared_ptr<QVRunLoopTimer> timer) {
  // Timers come from the same maker as the loop.
  auto attached = std::static_pointer_cast<QVAsioRunLoopTimer>(std::move(timer));
  // First, so that a move from now on is noticed.
  attached->attachTo(waits_);
  waits_->add(std::move(attached));
}

void QVAsioRunLoop::run() {
  waits_->prepareRun();
  for (;;) {
    try {
      waits_->run();
      return;
    } catch (...) {
      QVLogException(log_, "-[QVAsioRunLoop run]", "run loop", threadName_);
    }
  }
}
