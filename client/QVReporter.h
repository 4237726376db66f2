#pragma once

#include "client/QVClientExport.h"
#include "client/QVClientPayload.h"
#include "client/QVClientResult.h"
#include "client/QVClientVocabulary.h"
#include "client/QVReporterCounters.h"
#include "client/QVReporterOptions.h"
#include "client/QVReporterSession.h"

#include <chrono>
#include <memory>

struct QVReporterCore;

// A program's way to the reporting service that is kept: what most programs use.
//
//   auto reporter = QVReporter::open();
//   auto session = reporter.value()->openSession({.serviceType = QVClientServiceType::telephony});
//   session.value()->start();
//   session.value()->sendMessage(payload, category, type);
//
// Nothing that is sent waits for the service: it goes through a bounded queue, which a thread of
// the reporter's works off. It connects when there is first something to send, which starts the
// service where that is arranged for, and again, with growing pauses, after the service has ended.
// Its sessions are then made anew (QVReporterOptions::restoreSessions). What does not reach the
// service is counted by reason. Messages that were under way when the connection was lost, at most
// 256 or 256 KiB, count as lost, though the service may have taken some of them.
//
// While the reporting switch is off (the preference and the notification that the service itself
// goes by) messages are dropped at once. Sessions are opened, started and stopped all the same.
//
// Threads: every member may be called on any thread, at once, the destructor last. Signals are
// blocked in the reporter's thread. After a fork, only the parent may use it.
// Ownership: sessions and real-time queues may outlive it; their messages are then dropped.
class QV_CLIENT_API QVReporter {
 public:
  // Connects to nothing yet. Fails where the system has no descriptors or threads left, or where an
  // option is out of its limits.
  static QVClientResult<std::unique_ptr<QVReporter>> open(QVReporterOptions options = {});

  // Waits up to QVReporterOptions::endTimeLimit for what is still to be sent; what then is left
  // counts as lost. The service stops the sessions. In a drop callback it does not wait.
  ~QVReporter();
  QVReporter(const QVReporter&) = delete;
  QVReporter& operator=(const QVReporter&) = delete;

  // A session of the service's, created but not started. Answers reporterIDTaken, tooManySessions
  // (65,536 for one reporter) or queueFull.
  QVClientResult<std::unique_ptr<QVReporterSession>> openSession(
      QVReporterSessionOptions options = {});

  // Sends a message to every started session of every program, as QVReporterSession::sendMessage().
  QVClientError::Code sendToEverySession(const QVClientPayload& message, QVClientCategory category,
                                         QVClientMessageType type);

  // Waits until everything that was sent before has been taken by the service or dropped, stops and
  // starts included. Answers timedOut after the limit, wouldDeadlock in a drop callback.
  QVClientError::Code flush(std::chrono::milliseconds timeLimit);

  // What the reporting switch says, as it was last read.
  bool isReportingEnabled() const noexcept;
  QVReporterCounters counters() const;
  // What keeps it from the service, as a socket that this program may not open: what the last
  // attempt to connect said, or the loss of the connection. No error while there is a connection,
  // and before one was needed.
  QVClientError connectionError() const;

 private:
  explicit QVReporter(std::shared_ptr<QVReporterCore> core);

  std::shared_ptr<QVReporterCore> core_;
};
