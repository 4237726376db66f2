#pragma once

#include "platform/QVDate.h"
#include "platform/QVFunction.h"

#include <chrono>
#include <memory>

namespace asio {
class io_context;
}

// The event loop of the IPC thread: an Asio io_context, kept out of everybody's headers.
//
// Threads: post() from any, at any time of the loop's life; everything else on the thread that runs
// the loop. What is posted is destroyed unrun when the loop goes.
class QVBusLoop {
 public:
  QVBusLoop();
  ~QVBusLoop();
  QVBusLoop(const QVBusLoop&) = delete;
  QVBusLoop& operator=(const QVBusLoop&) = delete;

  void post(QVFunction<void()> work);

  // Runs what is posted and what is waited for, until stop().
  void run();
  void stop();
  // Told by whoever found that a peer sends without waiting for answers. While such peers keep the
  // loop busy it takes short pauses, so that a wake-up is for a handful of messages and not for
  // each. Peers that wait for an answer before they go on do not meet a pause of their own making.
  void noteStream() noexcept { streamed_ = true; }
  // Runs one piece of work, waiting for it no longer than `longest`; false where there was none.
  bool runOne(QVDuration longest);

  asio::io_context& context() noexcept { return *context_; }

 private:
  void runBatch();
  void pauseForStream();

  const std::unique_ptr<asio::io_context> context_;
  bool streamed_ = false;  // since the last pause
  std::chrono::steady_clock::time_point streamedAt_{};
};
