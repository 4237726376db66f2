#include "platform/linux/log/QVLogWriter.h"

#include "platform/QVText.h"
#include "platform/linux/QVThreads.h"

#include <system_error>
#include <utility>

namespace {

// For the sink to notice that it should give up.
constexpr std::chrono::seconds kGivingUp{1};

// How long to wait for memory where there was none; a line that comes ends it.
constexpr std::chrono::seconds kRetry{1};

// Lines for which the buffers keep room while nothing is logged.
constexpr std::size_t kKeptLines = 64;

// A log line is never worth the delay of what the service does.
constexpr int kNiceness = 5;

}  // namespace

QVLogWriter::QVLogWriter(std::unique_ptr<QVLogSink> sink, std::shared_ptr<const void> scopes,
                         std::chrono::milliseconds patience)
    : sink_(std::move(sink)), scopes_(std::move(scopes)), patience_(patience) {}

void QVLogWriter::enqueue(QVLogLine line) {
  const std::size_t bytes = line.text.size();
  const QVMutexLock lock(mutex_);
  if (isStopped_) return;
  if (lineCount_ < kMaximumLines && byteCount_ + bytes <= kMaximumBytes) {
    enqueued_.push_back(std::move(line));
    ++lineCount_;
    byteCount_ += bytes;
    ++takenTotal_;
  } else {
    ++lostCount_;
  }
  wake();
}

void QVLogWriter::wake() {
  if (!isRunning_) {
    try {
      thread_ = std::thread([self = shared_from_this()] { self->run(); });
      isRunning_ = true;
    } catch (const std::system_error&) {
      // The next line tries again.
    }
  } else if (std::exchange(isResting_, false)) {
    wake_.notify_one();
  }
}

void QVLogWriter::run() {
  QVPrepareThread("qv-log", kNiceness);
  std::vector<QVLogLine> batch;
  QVMutexLock lock(mutex_);
  for (;;) {
    while (enqueued_.empty() && lostCount_ == 0 && !isStopped_) {
      isResting_ = true;
      lock.wait(wake_);
    }
    if ((enqueued_.empty() && lostCount_ == 0) || giveUp_) break;
    batch.swap(enqueued_);
    const std::size_t lostCount = std::exchange(lostCount_, 0);
    lock.unlock();
    std::size_t bytes = 0;
    for (const QVLogLine& line : batch) bytes += line.text.size();
    const std::size_t lines = batch.size();
    bool isLost = false;
    try {
      writeBatch(batch, lostCount);
    } catch (...) {
      // For want of memory. The lines are counted as lost, whoever waits for them goes on.
      batch.clear();
      isLost = true;
    }
    lock.lock();
    if (isLost) lostCount_ += lostCount + lines;
    lineCount_ -= lines;
    byteCount_ -= bytes;
    writtenTotal_ += lines;
    progress_.notify_all();
    if (isLost && !isStopped_) {
      isResting_ = true;
      lock.waitUntil(wake_, std::chrono::steady_clock::now() + kRetry);
      isResting_ = false;
    }
  }
  isRunning_ = false;
  progress_.notify_all();
}

// Lines are lost after those that fill the queue, so that is where the count stands.
void QVLogWriter::writeBatch(std::vector<QVLogLine>& batch, std::size_t lostCount) {
  if (lostCount > 0) {
    QVLogLine lost;
    lost.level = QVLogLevel::error;
    lost.function = "-[QVLogWriter writeBatch:lostCount:]";
    lost.file = "QVLogWriter.cpp";
    lost.line = __LINE__;
    lost.text = QVText(lostCount, " log lines were lost, the log's queue was full");
    batch.push_back(std::move(lost));
  }
  sink_->write(batch, giveUp_);
  batch.clear();
  if (batch.capacity() > kKeptLines) std::vector<QVLogLine>().swap(batch);
}

void QVLogWriter::flush() {
  const auto deadline = std::chrono::steady_clock::now() + patience_;
  QVMutexLock lock(mutex_);
  const uint64_t total = takenTotal_;
  while (writtenTotal_ < total && isRunning_) {
    if (lock.waitUntil(progress_, deadline) == std::cv_status::timeout) return;
  }
}

void QVLogWriter::stop() {
  std::thread thread;
  bool hasEnded = false;
  {
    auto deadline = std::chrono::steady_clock::now() + patience_;
    QVMutexLock lock(mutex_);
    isStopped_ = true;
    wake_.notify_one();
    while (isRunning_) {
      if (lock.waitUntil(progress_, deadline) != std::cv_status::timeout) continue;
      if (giveUp_.exchange(true)) break;
      deadline = std::chrono::steady_clock::now() + kGivingUp;
    }
    hasEnded = !isRunning_;
    thread.swap(thread_);
  }
  if (!thread.joinable()) return;
  if (hasEnded) {
    thread.join();
  } else {
    thread.detach();
  }
}
