#pragma once

#include "client/QVClientExport.h"
#include "client/QVClientPayload.h"
#include "client/QVClientVocabulary.h"
#include "client/QVReporterCounters.h"

#include <cstddef>
#include <memory>

struct QVReporterCore;
class QVRealtimeRing;

// How large a real-time queue is to be. A value.
struct QVRealtimeQueueOptions {
  std::size_t messages = 256;           // 1 to 65,536; rounded up to a power of 2
  std::size_t bytesPerMessage = 1'024;  // of one payload, 64 to 65,536; 64 MiB in all
};

// A session's queue for one thread that must never wait, as an audio callback must not:
//
//   if (QVClientPayload* message = queue.begin()) {
//     message->set("frames", 480).set("xruns", 0);
//     queue.commit(category, type);
//   }
//
// begin(), the payload's members but error(), and commit() take a number of steps that is bounded
// by the payload's bytes: no lock, no memory, no system call, no waiting. The payload is written
// where the reporter's thread reads it. That thread looks at the queue once in
// QVReporterOptions::realtimePeriod while the session is started; what is committed before the
// start is sent after it. A program without such queues has no such wake-ups.
//
// Threads: begin(), the payload and commit() one thread at a time; the rest any. Making and
// destroying it is not for a real-time thread. Ownership: made by
// QVReporterSession::makeRealtimeQueue(), may outlive session and reporter; its messages are then
// dropped and counted as connectionLost. What was committed before it is destroyed is still sent.
class QV_CLIENT_API QVRealtimeQueue {
 public:
  ~QVRealtimeQueue();
  QVRealtimeQueue(const QVRealtimeQueue&) = delete;
  QVRealtimeQueue& operator=(const QVRealtimeQueue&) = delete;

  // The next message's payload, empty, which stays the queue's: nothing may be moved out of it.
  // Null where the message would be dropped, because reporting is off, the queue is full or closed,
  // or its session was lost (QVReporterOptions::restoreSessions); that is counted. Beginning again
  // starts the message anew.
  QVClientPayload* begin() noexcept;
  // Hands over what begin() gave, which from then on takes nothing in. False where it is not in
  // order or did not fit, another payload was moved into it, or the queue was closed meanwhile,
  // which is counted, or where nothing was begun.
  bool commit(QVClientCategory category, QVClientMessageType type) noexcept;
  // Is its session destroyed, or its reporter gone? Real-time safe.
  bool isClosed() const noexcept;

 private:
  friend class QVReporterSession;
  QVRealtimeQueue(std::shared_ptr<QVReporterCore> core, std::shared_ptr<QVRealtimeRing> ring);

  void detach() noexcept;
  std::nullptr_t drop(QVDropReason reason) noexcept;

  const std::shared_ptr<QVReporterCore> core_;
  const std::shared_ptr<QVRealtimeRing> ring_;
  QVClientPayload payload_;
  const char* slot_ = nullptr;  // where the payload is written, while one is begun
};
