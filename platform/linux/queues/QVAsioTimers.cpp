#include "platform/linux/queues/QVAsioTimers.h"

#include "platform/linux/QVThreads.h"

#include <algorithm>
#include <system_error>
#include <utility>
#include <vector>

#include <asio/io_context.hpp>
#include <asio/post.hpp>
#include <asio/steady_timer.hpp>

namespace {

// Far beyond every delay in use; keeps the sum of now and a delay within the clock's range.
constexpr QVDuration kLongestDelay = std::chrono::hours{24 * 365};

}  // namespace

struct QVAsioTimers::Loop {
  asio::io_context context{1};
  asio::steady_timer timer{context};  // the timer thread's
};

QVAsioTimers::QVAsioTimers() : loop_(std::make_unique<Loop>()) {}

QVAsioTimers::~QVAsioTimers() {
  hurry();
}

void QVAsioTimers::enqueueAfter(QVDuration delay, std::shared_ptr<QVWorkQueue> queue,
                                QVWorkItem item) {
  if (delay > QVDuration::zero()) {
    const auto due = Clock::now() + std::min(delay, kLongestDelay);
    const QVMutexLock lock(mutex_);
    if (!isHurried_ && startThread()) {
      const bool isEarliest = delayed_.empty() || due < delayed_.begin()->first;
      delayed_.emplace(due, Delayed{std::move(queue), std::move(item)});
      if (isEarliest) interruptWait();
      return;
    }
  }
  queue->async(std::move(item));
}

bool QVAsioTimers::startThread() {
  if (isRunning_) return true;
  // An earlier thread has let go of the mutex for good.
  if (thread_.joinable()) thread_.join();
  try {
    thread_ = std::thread([this] { run(); });
    isRunning_ = true;
  } catch (const std::system_error&) {
    // Too early is better than never.
  }
  return isRunning_;
}

// Makes the thread look at the earliest item anew.
void QVAsioTimers::interruptWait() {
  asio::post(loop_->context, [this] { loop_->timer.cancel(); });
}

void QVAsioTimers::run() {
  QVPrepareThread("qv-timer", 0);
  for (;;) {
    for (Delayed& delayed : takeDue()) delayed.queue->async(std::move(delayed.item));
    {
      const QVMutexLock lock(mutex_);
      if (isHurried_ || delayed_.empty()) {
        isRunning_ = false;
        return;
      }
      loop_->timer.expires_at(delayed_.begin()->first);
    }
    loop_->timer.async_wait([](const asio::error_code&) {});
    loop_->context.restart();
    loop_->context.run();
  }
}

std::vector<QVAsioTimers::Delayed> QVAsioTimers::takeDue() {
  std::vector<Delayed> due;
  const QVMutexLock lock(mutex_);
  const auto firstLater = delayed_.upper_bound(Clock::now());
  for (auto item = delayed_.begin(); item != firstLater; ++item) {
    due.push_back(std::move(item->second));
  }
  delayed_.erase(delayed_.begin(), firstLater);
  return due;
}

void QVAsioTimers::hurry() {
  std::thread thread;
  {
    const QVMutexLock lock(mutex_);
    isHurried_ = true;
    interruptWait();
    thread.swap(thread_);
  }
  // First what it has taken out as due, then the rest.
  if (thread.joinable()) thread.join();
  std::multimap<Clock::time_point, Delayed> rest;
  {
    const QVMutexLock lock(mutex_);
    rest.swap(delayed_);
  }
  for (auto& [due, delayed] : rest) delayed.queue->async(std::move(delayed.item));
}
