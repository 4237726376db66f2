#pragma once

#include "client/QVClientThread.h"
#include "platform/linux/QVDescriptor.h"

#include <atomic>
#include <chrono>

#include <unistd.h>

// Says that the service is waited for, where that takes longer than a moment and somebody sits
// before standard error, a terminal: a line that stays.
//
// Threads: made and ended on one; the line is written by one of its own, which takes no signals.
class QVWaitNotice {
 public:
  explicit QVWaitNotice(std::chrono::milliseconds after, int descriptor = STDERR_FILENO);
  ~QVWaitNotice() { end(); }
  QVWaitNotice(const QVWaitNotice&) = delete;
  QVWaitNotice& operator=(const QVWaitNotice&) = delete;

  // The wait is over. Whether it was said.
  bool end();

 private:
  void run(std::chrono::milliseconds after, int descriptor);

  const QVDescriptor over_;  // readable when it is
  std::atomic<bool> isSaid_{false};
  QVClientThread thread_;
};
