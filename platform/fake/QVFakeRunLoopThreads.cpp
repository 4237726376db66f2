#include "platform/fake/QVFakeRunLoopThreads.h"

#include "platform/fake/QVFakeRunLoopTimer.h"

#include <utility>

std::shared_ptr<QVRunLoopThread> QVFakeRunLoopThreads::startThread(std::string_view name,
                                                                   Body body) {
  const std::lock_guard lock(mutex_);
  if (refusesThreads_) {
    log_.error(nullptr, __func__, "no thread for ", name, ": refused");
    return nullptr;
  }
  threads_.push_back(std::make_shared<QVFakeRunLoopThread>(name, queues_, clock_, log_));
  threads_.back()->start(std::move(body));
  return threads_.back();
}

std::shared_ptr<QVRunLoopTimer> QVFakeRunLoopThreads::makeTimer(QVDuration delay,
                                                                QVFunction<void()> action) {
  return std::make_shared<QVFakeRunLoopTimer>(clock_, delay, std::move(action));
}

void QVFakeRunLoopThreads::pause(QVDuration duration) {
  if (auto* const thread = QVFakeRunLoopThread::current()) {
    thread->pause(duration);
  } else if (duration > QVDuration::zero()) {
    queues_.runOthersUntil(clock_.steadyTime() + duration, [] { return false; });
  }
}

void QVFakeRunLoopThreads::refuseThreads() {
  const std::lock_guard lock(mutex_);
  refusesThreads_ = true;
}

std::vector<std::shared_ptr<QVRunLoopThread>> QVFakeRunLoopThreads::threads() const {
  const std::lock_guard lock(mutex_);
  return {threads_.begin(), threads_.end()};
}

// What bodies hold may start threads on its way out; they end unbegun.
void QVFakeRunLoopThreads::discard() {
  for (;;) {
    std::vector<std::shared_ptr<QVFakeRunLoopThread>> threads;
    {
      const std::lock_guard lock(mutex_);
      threads.swap(threads_);
    }
    if (threads.empty()) return;
    for (const auto& thread : threads) thread->end();
  }
}
