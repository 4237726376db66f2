#pragma once

#include "platform/linux/QVThreadAnnotations.h"
#include "platform/linux/log/QVLogLine.h"
#include "platform/linux/log/QVLogSink.h"

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <thread>
#include <vector>

// The bounded queue of log lines and the thread that writes them.
//
// Made and ended by QVSystemLog. Threads: any, at once; no call but flush() and stop() waits, and
// those two for a bounded time.
// Ownership: the thread shares the object, since a destination may hold it in a write for ever.
// States: open -> stopped, by stop(); lines are ignored from then on.
class QVLogWriter : public std::enable_shared_from_this<QVLogWriter> {
 public:
  // A debug session of a busy second. Beyond, a log that nobody takes would eat the memory that
  // the service needs.
  static constexpr std::size_t kMaximumLines = 8'192;
  static constexpr std::size_t kMaximumBytes =
      std::size_t{4} * 1024 * 1024;  // of text, in those lines

  // `scopes` is kept as long as lines that may name one. `patience` is how long flush() and stop()
  // wait for a destination that does not take lines.
  QVLogWriter(std::unique_ptr<QVLogSink> sink, std::shared_ptr<const void> scopes,
              std::chrono::milliseconds patience);

  void enqueue(QVLogLine line);
  void flush();
  void stop();

 private:
  void wake() QV_REQUIRES(mutex_);
  void run();
  void writeBatch(std::vector<QVLogLine>& batch, std::size_t lostCount);

  const std::unique_ptr<QVLogSink> sink_;  // the thread's
  const std::shared_ptr<const void> scopes_;
  const std::chrono::milliseconds patience_;
  std::atomic<bool> giveUp_{false};

  QVMutex mutex_;
  std::condition_variable wake_;
  std::condition_variable progress_;
  std::vector<QVLogLine> enqueued_ QV_GUARDED_BY(mutex_);
  // Of the lines that are enqueued or being written.
  std::size_t lineCount_ QV_GUARDED_BY(mutex_) = 0;
  std::size_t byteCount_ QV_GUARDED_BY(mutex_) = 0;
  std::size_t lostCount_ QV_GUARDED_BY(mutex_) = 0;
  uint64_t takenTotal_ QV_GUARDED_BY(mutex_) = 0;
  uint64_t writtenTotal_ QV_GUARDED_BY(mutex_) = 0;
  bool isRunning_ QV_GUARDED_BY(mutex_) = false;
  bool isResting_ QV_GUARDED_BY(mutex_) = false;
  bool isStopped_ QV_GUARDED_BY(mutex_) = false;
  std::thread thread_ QV_GUARDED_BY(mutex_);
};
