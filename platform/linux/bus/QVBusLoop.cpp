#include "platform/linux/bus/QVBusLoop.h"

#include <utility>

#include <asio/executor_work_guard.hpp>
#include <asio/io_context.hpp>
#include <asio/post.hpp>

// A concurrency hint of 1: one thread runs the loop, others only post.
QVBusLoop::QVBusLoop() : context_(std::make_unique<asio::io_context>(1)) {}

QVBusLoop::~QVBusLoop() = default;

void QVBusLoop::post(QVFunction<void()> work) {
  asio::post(*context_, [work = std::move(work)]() mutable { work(); });
}

void QVBusLoop::run() {
  const auto guard = asio::make_work_guard(*context_);
  context_->run();
}

void QVBusLoop::stop() {
  context_->stop();
}

bool QVBusLoop::runOne(QVDuration longest) {
  const auto guard = asio::make_work_guard(*context_);
  context_->restart();
  return context_->poll_one() != 0 || context_->run_one_for(longest) != 0;
}
