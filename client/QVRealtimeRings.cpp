#include "client/QVRealtimeRings.h"

#include <utility>

namespace {

void add(QVDropCounts& sum, const QVDropCounts& more) {
  for (std::size_t i = 0; i < kQVDropReasonCount; ++i) sum.counts[i] += more.counts[i];
}

}  // namespace

void QVRealtimeRings::add(std::shared_ptr<QVRealtimeRing> ring) {
  QVMutexLock lock(mutex_);
  rings_.push_back(std::move(ring));
}

void QVRealtimeRings::remove(const QVRealtimeRing& ring) {
  QVMutexLock lock(mutex_);
  std::erase_if(rings_, [this, &ring](const std::shared_ptr<QVRealtimeRing>& one) {
    if (one.get() != &ring) return false;
    ::add(dropsOfRemoved_, one->takeDrops());
    return true;
  });
}

QVRealtimeRings::List QVRealtimeRings::all() {
  QVMutexLock lock(mutex_);
  return rings_;
}

QVDropCounts QVRealtimeRings::takeDrops() {
  QVMutexLock lock(mutex_);
  QVDropCounts sum = std::exchange(dropsOfRemoved_, {});
  for (const auto& ring : rings_) ::add(sum, ring->takeDrops());
  return sum;
}
