#include "client/QVRealtimeRings.h"

#include <algorithm>
#include <utility>

void QVRealtimeRings::add(std::shared_ptr<QVRealtimeRing> ring) {
  QVMutexLock lock(mutex_);
  rings_.push_back(std::move(ring));
}

void QVRealtimeRings::remove(const QVRealtimeRing& ring) {
  QVMutexLock lock(mutex_);
  const auto found = std::ranges::find(rings_, &ring, &std::shared_ptr<QVRealtimeRing>::get);
  if (found == rings_.end()) return;
  dropsOfRemoved_ += (*found)->takeDrops();
  rings_.erase(found);
}

QVRealtimeRings::List QVRealtimeRings::all() {
  QVMutexLock lock(mutex_);
  return rings_;
}

QVDropCounts QVRealtimeRings::takeDrops() {
  QVMutexLock lock(mutex_);
  QVDropCounts sum = std::exchange(dropsOfRemoved_, {});
  for (const auto& ring : rings_) sum += ring->takeDrops();
  return sum;
}
