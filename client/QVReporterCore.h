#pragma once

#include "client/QVClientBell.h"
#include "client/QVClientPayload.h"
#include "client/QVClientThread.h"
#include "client/QVRealtimeRings.h"
#include "client/QVReporterConnection.h"
#include "client/QVReporterFlushes.h"
#include "client/QVReporterLedger.h"
#include "client/QVReporterOptions.h"
#include "client/QVReporterQueue.h"
#include "client/QVReporterSessions.h"
#include "client/QVReportingSwitch.h"

#include <atomic>
#include <chrono>
#include <thread>

// What a reporter, its sessions, its real-time queues and its thread have in common. Shared by all
// of them, so that each may be the last to go.
//
// Threads: every part has its own synchronisation; the functions any.
struct QVReporterCore {
  using TimePoint = std::chrono::steady_clock::time_point;

  explicit QVReporterCore(QVReporterOptions given);

  // Costs an atomic load and a branch.
  bool isReportingOff() const noexcept { return reportingSwitch.isOff(); }
  // Counts what it does not take in.
  QVClientError::Code send(QVReporterSessionState* session, const QVClientPayload& message,
                           QVClientCategory category, QVClientMessageType type);
  // Puts a step of a session's life into the queue.
  QVClientError::Code take(const QVReporterRecord& record);
  void countDrop(QVDropReason reason, uint64_t count = 1);

  const QVReporterOptions options;
  QVClientBell bell;
  QVReportingSwitch reportingSwitch;
  QVReporterQueue queue;
  QVReporterLedger ledger;
  QVReporterSessions sessions;
  QVRealtimeRings rings;
  QVReporterFlushes flushes;
  QVReporterConnection connection;
  // Started, joined or detached by the reporter.
  QVClientThread thread;
  std::atomic<std::thread::id> threadID{};  // while it runs
  // When the thread has to end at the latest.
  std::atomic<TimePoint> deadline{TimePoint::max()};
};
