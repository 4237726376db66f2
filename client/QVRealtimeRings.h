#pragma once

#include "client/QVClientError.h"
#include "client/QVRealtimeRing.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <cstddef>
#include <functional>
#include <memory>
#include <vector>

// The rings of one reporter's real-time queues, those included whose queue is gone and whose
// messages are not sent yet.
//
// Threads: any, at once. A ring is emptied by the reporter's thread, outside of the lock.
class QVRealtimeRings {
 public:
  using List = std::vector<std::shared_ptr<QVRealtimeRing>>;

  // How many there may be, and bytes of theirs in all: a program that makes a queue for each track
  // while there is no service must not take all memory.
  static constexpr std::size_t kMaximum = 1'024;
  static constexpr std::size_t kMaximumBytes = std::size_t{128} << 20;

  // May one more of so many bytes be added? Answers none, queueFull beyond the bounds, or closed
  // once they are closed.
  QVClientError::Code admit(std::size_t bytes);
  // Answers the same, and takes it in where that is none.
  QVClientError::Code add(std::shared_ptr<QVRealtimeRing> ring);
  void remove(const QVRealtimeRing& ring);
  // Lets go of those that are over.
  void removeOver();
  List all();
  // Has those of a session take messages in again.
  void admitMessages(const QVReporterSessionState& session);
  // Each in its turn, under the lock; needs no memory.
  void forEach(const std::function<void(QVRealtimeRing&)>& visit);
  // Hands all of them out and takes in no more. Needs no memory.
  List close();

 private:
  QVMutex mutex_;
  QVClientError::Code admitLocked(std::size_t bytes) const QV_REQUIRES(mutex_);

  List rings_ QV_GUARDED_BY(mutex_);
  bool isClosed_ QV_GUARDED_BY(mutex_) = false;
};
