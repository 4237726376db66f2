#include "client/QVRealtimeRings.h"

#include <algorithm>
#include <utility>

QVClientError::Code QVRealtimeRings::admitLocked(std::size_t bytes) const {
  if (isClosed_) return QVClientError::Code::closed;
  for (const auto& ring : rings_) bytes += ring->bytes();
  const bool fits = rings_.size() < kMaximum && bytes <= kMaximumBytes;
  return fits ? QVClientError::Code::none : QVClientError::Code::queueFull;
}

QVClientError::Code QVRealtimeRings::admit(std::size_t bytes) {
  removeOver();
  QVMutexLock lock(mutex_);
  return admitLocked(bytes);
}

QVClientError::Code QVRealtimeRings::add(std::shared_ptr<QVRealtimeRing> ring) {
  removeOver();
  QVMutexLock lock(mutex_);
  const QVClientError::Code code = admitLocked(ring->bytes());
  if (code == QVClientError::Code::none) rings_.push_back(std::move(ring));
  return code;
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

void QVRealtimeRings::admitMessages(const QVReporterSessionState& session) {
  QVMutexLock lock(mutex_);
  for (const auto& ring : rings_) {
    if (ring->owner == &session) ring->admit();
  }
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
