#pragma once

#include "client/QVRealtimeRing.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <memory>
#include <vector>

// The rings of one reporter's real-time queues.
//
// Threads: any, at once. A ring is emptied by the reporter's thread, outside of the lock.
class QVRealtimeRings {
 public:
  using List = std::vector<std::shared_ptr<QVRealtimeRing>>;

  void add(std::shared_ptr<QVRealtimeRing> ring);
  void remove(const QVRealtimeRing& ring);
  List all();
  // What producers dropped since this was last asked, in all.
  QVDropCounts takeDrops();

 private:
  QVMutex mutex_;
  List rings_ QV_GUARDED_BY(mutex_);
  QVDropCounts dropsOfRemoved_ QV_GUARDED_BY(mutex_);
};
