#pragma once

#include "platform/linux/log/QVLogSink.h"

#include <sys/types.h>
#include <sys/uio.h>

// Lines to the system's journal, with their parts as fields: MESSAGE, PRIORITY, CODE_FILE,
// CODE_LINE, CODE_FUNC, QV_SCOPE, and QV_SUBSYSTEM where there is a scope.
class QVJournalLogSink final : public QVLogSink {
 public:
  // The journal's sending function, and what stands for it in tests.
  using Send = int (*)(const iovec* fields, int count);

  QVJournalLogSink();
  explicit QVJournalLogSink(Send send) : send_(send) {}

  void write(std::span<const QVLogLine> lines, const std::atomic<bool>& giveUp) override;

 private:
  const Send send_;
};

// Is the file of this device and inode the stream to the journal that the environment variable
// JOURNAL_STREAM names ("device:inode", decimal)? `journalStream` may be null.
bool QVIsJournalStream(const char* journalStream, dev_t device, ino_t inode);
