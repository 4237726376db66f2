#include "client/QVRealtimeRings.h"

#include <algorithm>
#include <utility>

QVClientError::Code QVRealtimeRings::add(std::shared_ptr<QVRealtimeRing> ring) {
  removeOver();
  QVMutexLock lock(mutex_);
  if (isClosed_) return QVClientError::Code::closed;
  std::size_t bytes = ring->bytes();
  for (const auto& other : rings_) bytes += other->bytes();
  if (rings_.size() >= kMaximum || bytes > kMaximumBytes) return QVClientError::Code::queueFull;
  rings_.push_back(std::move(ring));
  return QVClientError::Code::none;
}

void QVRealtimeRings::remove(const QVRealtimeRing& ring) {
  QVMutexLock lock(mutex_);
  const auto found = std::ranges::find(rings_, &ring, &std::shared_ptr<QVRealtimeRing>::get);
  if (found != rings_.end()) rings_.erase(found);
}

void QVRealtimeRings::removeOver() {
  QVMutexLock lock(mutex_);
  std::erase_if(rings_, [](const auto& ring) { return ring->isOver(); });
}

QVRealtimeRings::List QVRealtimeRings::all() {
  QVMutexLock lock(mutex_);
  return rings_;
}

void QVRealtimeRings::forEach(const std::function<void(QVRealtimeRing&)>& visit) {
  QVMutexLock lock(mutex_);
  for (const auto& ring : rings_) visit(*ring);
}

QVRealtimeRings::List QVRealtimeRings::close() {
  QVMutexLock lock(mutex_);
  isClosed_ = true;
  return std::exchange(rings_, {});
}
