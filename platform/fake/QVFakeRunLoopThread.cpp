#include "platform/fake/QVFakeRunLoopThread.h"

#include "platform/fake/QVFakeAbort.h"
#include "platform/fake/QVFakeRunLoop.h"

#include <exception>
#include <utility>

namespace {

// A body that pauses more often than this after its end was asked for does not mean to return.
constexpr std::size_t kMostPausesWhileEnding = 1'000;

}  // namespace

QVFakeRunLoopThread::QVFakeRunLoopThread(std::string_view name, QVFakeWorkQueues& queues,
                                         const QVFakeClock& clock, QVLog& log)
    : name_(name), queues_(queues), clock_(clock), log_(log) {}

QVFakeRunLoopThread::~QVFakeRunLoopThread() {
  end();
}

void QVFakeRunLoopThread::start(QVRunLoopThreads::Body body) {
  thread_ = std::thread([this, body = std::move(body)]() mutable { main(std::move(body)); });
  resumeAfter(QVDuration::zero(), waitNumber_);
}

void QVFakeRunLoopThread::main(QVRunLoopThreads::Body body) {
  current_ = this;
  {
    std::unique_lock lock(mutex_);
    waitForTurn(lock, Turn::thread);
  }
  if (!isEnding_) {
    QVFakeRunLoop loop(*this, clock_, log_);
    try {
      body(loop);
    } catch (const std::exception& exception) {
      log_.error(nullptr, __func__, "exception in thread ", name_, ": ", exception.what());
    } catch (...) {
      log_.error(nullptr, __func__, "exception in thread ", name_, ": of unknown type");
    }
  }
  body = nullptr;
  isFinished_ = true;
  const std::lock_guard lock(mutex_);
  turn_ = Turn::others;
  changed_.notify_all();
}

void QVFakeRunLoopThread::end() {
  if (!thread_.joinable()) return;
  isEnding_ = true;
  if (!isFinished_) handOver();
  thread_.join();
}

void QVFakeRunLoopThread::waitUntil(QVDuration deadline) {
  uint64_t waitNumber = 0;
  {
    const std::lock_guard lock(mutex_);
    if (isEnding_ || std::exchange(isWoken_, false)) return;
    waitNumber = ++waitNumber_;
    isWaiting_ = true;
  }
  resumeAfter(deadline - clock_.steadyTime(), waitNumber);
  std::unique_lock lock(mutex_);
  turn_ = Turn::others;
  changed_.notify_all();
  waitForTurn(lock, Turn::thread);
}

void QVFakeRunLoopThread::pause(QVDuration duration) {
  if (isEnding_ && ++pausesWhileEnding_ > kMostPausesWhileEnding) {
    QVFakeAbort("QVFakeRunLoopThread: nobody told the body of this thread to return: " + name_);
  }
  const QVDuration deadline = clock_.steadyTime() + duration;
  while (!isEnding_ && clock_.steadyTime() < deadline) waitUntil(deadline);
}

void QVFakeRunLoopThread::wake() {
  uint64_t waitNumber = 0;
  {
    const std::lock_guard lock(mutex_);
    if (!isWaiting_) {
      isWoken_ = true;
      return;
    }
    waitNumber = waitNumber_;
  }
  resumeAfter(QVDuration::zero(), waitNumber);
}

void QVFakeRunLoopThread::resumeAfter(QVDuration delay, uint64_t waitNumber) {
  queues_.after(delay, [weak = weak_from_this(), waitNumber] {
    if (const auto self = weak.lock()) self->resume(waitNumber);
  });
}

// One wait may be ended by several items: by its deadline's and by those of wake(). The first does.
void QVFakeRunLoopThread::resume(uint64_t waitNumber) {
  {
    const std::lock_guard lock(mutex_);
    if (!isWaiting_ || waitNumber_ != waitNumber) return;
  }
  handOver();
}

void QVFakeRunLoopThread::handOver() {
  std::unique_lock lock(mutex_);
  isWaiting_ = false;
  turn_ = Turn::thread;
  changed_.notify_all();
  waitForTurn(lock, Turn::others);
}

void QVFakeRunLoopThread::waitForTurn(std::unique_lock<std::mutex>& lock, Turn turn) {
  changed_.wait(lock, [this, turn] { return turn_ == turn; });
}
