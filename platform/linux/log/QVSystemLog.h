#pragma once

#include "platform/QVLog.h"
#include "platform/QVPreferences.h"
#include "platform/linux/QVThreadAnnotations.h"
#include "platform/linux/log/QVLogSink.h"
#include "platform/linux/log/QVLogWriter.h"

#include <atomic>
#include <chrono>
#include <map>
#include <memory>
#include <string>
#include <string_view>

// The service's log: lines go through a bounded queue to a writer thread, which hands them to the
// sink in batches. The thread begins with the first line and sleeps without a time limit while
// there is none.
//
// Threads: as QVLog; callers contend for a short lock only, however stuck the destination is. The
// composition root makes it before everything else and drops it last.
// Limits: those of QVLogWriter, and 16 KiB of text a line; what finds no room is counted, and one
// line says how many were lost.
// Failures: where no writer thread can be had, lines wait in the queue for the next attempt.
class QVSystemLog final : public QVLog {
 public:
  // A destination that is stuck holds up flush() and the end of the log for `patience` at most.
  explicit QVSystemLog(std::unique_ptr<QVLogSink> sink,
                       std::chrono::milliseconds patience = std::chrono::seconds{2});
  // Writes what is there.
  ~QVSystemLog() override;
  QVSystemLog(const QVSystemLog&) = delete;
  QVSystemLog& operator=(const QVSystemLog&) = delete;

  // The journal where standard error is its stream, else standard error.
  static std::unique_ptr<QVLogSink> standardSink();

  // Where verbose switches are read from; none before this is called, all are off then. The
  // preferences may log themselves. They outlive the last registration.
  void readSwitchesFrom(QVPreferences* preferences) { preferences_ = preferences; }

  QVLogScope* registerScope(bool enabled, uint32_t code, std::string_view name,
                            std::string_view domain, std::string_view verboseKey,
                            int32_t registration) override;
  void write(const QVLogScope* scope, QVLogLevel level, const QVLogSite& site,
             std::string text) override;
  void flush() override;

 private:
  struct Scopes {
    QVMutex mutex;
    std::map<std::string, QVLogScope, std::less<>> byName QV_GUARDED_BY(mutex);
  };

  std::atomic<QVPreferences*> preferences_{nullptr};
  const std::shared_ptr<Scopes> scopes_;
  const std::shared_ptr<QVLogWriter> writer_;
};
