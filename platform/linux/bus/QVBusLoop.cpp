#include "platform/linux/bus/QVBusLoop.h"

#include "platform/linux/QVWakeUpBatch.h"

#include <cstddef>
#include <thread>
#include <utility>

#include <asio/executor_work_guard.hpp>
#include <asio/io_context.hpp>
#include <asio/post.hpp>

namespace {

// More would keep the other threads waiting for what they could do meanwhile.
constexpr std::size_t kHandlersPerWakeUp = 8;

// Long enough for a peer to send a handful of messages, short against what anybody waits for. The
// kernel adds up to 50 us of its own.
constexpr std::chrono::microseconds kStreamPause{30};
// Wake-ups of a stream that come closer than this are worth a pause.
constexpr std::chrono::microseconds kStreamGap{500};

}  // namespace

// A concurrency hint of 1: one thread runs the loop, others only post.
QVBusLoop::QVBusLoop() : context_(std::make_unique<asio::io_context>(1)) {}

QVBusLoop::~QVBusLoop() = default;

void QVBusLoop::post(QVFunction<void()> work) {
  asio::post(*context_, [work = std::move(work)]() mutable { work(); });
}

void QVBusLoop::run() {
  const auto guard = asio::make_work_guard(*context_);
  while (!context_->stopped()) {
    runBatch();
    if (std::exchange(streamed_, false)) pauseForStream();
  }
}

void QVBusLoop::runBatch() {
  // Connections that are readable together wake whoever works for them once. Nothing is held back
  // while the loop sleeps: the batch is empty then.
  const QVWakeUpBatch wakeUps;
  std::size_t handlers = context_->run_one();
  while (handlers > 0 && handlers < kHandlersPerWakeUp) {
    if (context_->poll_one() == 0) break;
    ++handlers;
  }
}

void QVBusLoop::pauseForStream() {
  const auto now = std::chrono::steady_clock::now();
  // A burst now and then is not worth the timer.
  const bool isDense = now - streamedAt_ < kStreamGap;
  streamedAt_ = now;
  if (isDense) std::this_thread::sleep_for(kStreamPause);
}

void QVBusLoop::stop() {
  context_->stop();
}

bool QVBusLoop::runOne(QVDuration longest) {
  const auto guard = asio::make_work_guard(*context_);
  context_->restart();
  return context_->poll_one() != 0 || context_->run_one_for(longest) != 0;
}
