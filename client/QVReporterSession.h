#pragma once

#include "client/QVClientError.h"
#include "client/QVClientExport.h"
#include "client/QVClientPayload.h"
#include "client/QVClientResult.h"
#include "client/QVClientVocabulary.h"
#include "client/QVRealtimeQueue.h"

#include <cstdint>
#include <memory>

struct QVReporterCore;
struct QVReporterSessionState;

// How a session is to be opened. A value.
struct QVReporterSessionOptions {
  // 0: one that is picked, at random of 52 bits, because the service finds sessions by their IDs
  // across all programs.
  int64_t reporterID = 0;
  QVClientServiceType serviceType = QVClientServiceType::generic;
};

// A reporting session that a QVReporter keeps. Its calls are worked off in the order in which they
// are made, by the reporter's thread, also across a loss of the connection.
//
// None of its members waits for the service. Each takes a lock for as long as the copy of a payload
// takes, and may make a system call to wake the reporter's thread, so none is for a real-time
// thread: makeRealtimeQueue() is. They answer none where the call was taken in, else queueFull,
// outOfMemory, closed (the reporter is gone), messageTooLarge or invalidPayload.
//
// Threads: any, at once, the destructor last. Made by QVReporter::openSession().
// Limits: beyond those of the queue, calls that control sessions have 64 KiB of their own.
class QV_CLIENT_API QVReporterSession {
 public:
  // Destroys the session; the service stops it where it runs. Its ID may be used again at once.
  ~QVReporterSession();
  QVReporterSession(const QVReporterSession&) = delete;
  QVReporterSession& operator=(const QVReporterSession&) = delete;

  int64_t reporterID() const noexcept;

  QVClientError::Code setServiceType(QVClientServiceType serviceType);
  // Adds entries to the session's configuration; at most 64 KiB.
  QVClientError::Code setConfiguration(const QVClientPayload& configuration);
  QVClientError::Code start();
  // Answers disabled as well, which costs an atomic load, a branch and an atomic addition.
  QVClientError::Code sendMessage(const QVClientPayload& message, QVClientCategory category,
                                  QVClientMessageType type);
  QVClientError::Code stop();

  // A way into the session for a thread that must never wait. Answers invalidArgument,
  // outOfMemory, closed, or queueFull: a reporter has at most 1,024 of them, with 128 MiB in all,
  // those included that are destroyed and whose messages are not sent yet.
  QVClientResult<std::unique_ptr<QVRealtimeQueue>> makeRealtimeQueue(
      QVRealtimeQueueOptions options = {});

 private:
  friend class QVReporter;
  QVReporterSession(std::shared_ptr<QVReporterCore> core, QVReporterSessionState& state) noexcept;

  const std::shared_ptr<QVReporterCore> core_;
  QVReporterSessionState& state_;  // lives in the core until the destruction is worked off
  const int64_t reporterID_;
  bool isOpen_ = false;  // its opening lies in the queue: it has to be destroyed
};
