#include "client/QVRealtimeRing.h"

QVRealtimeRing::QVRealtimeRing(std::size_t slots, std::size_t slotBytes,
                               QVReporterSessionState* owner)
    : session(owner),
      mask_(slots - 1),
      slotBytes_(slotBytes),
      slots_(new Slot[slots]()),
      memory_(new char[slots * slotBytes]()) {}

std::span<char> QVRealtimeRing::nextSlot() noexcept {
  const std::size_t written = written_.load(std::memory_order_relaxed);
  if (written - takenSeen_ > mask_) {
    takenSeen_ = taken_.load(std::memory_order_acquire);
    if (written - takenSeen_ > mask_) return {};
  }
  return {memory_.get() + (written & mask_) * slotBytes_, slotBytes_};
}

void QVRealtimeRing::push(std::size_t bytes, uint32_t category, uint16_t type) noexcept {
  const std::size_t written = written_.load(std::memory_order_relaxed);
  slots_[written & mask_] = {bytes, category, type};
  written_.store(written + 1, std::memory_order_release);
}

void QVRealtimeRing::countDrop(QVDropReason reason) noexcept {
  // Nobody else writes it, so that it takes no locked addition.
  std::atomic<uint64_t>& count = drops_[static_cast<std::size_t>(reason)];
  count.store(count.load(std::memory_order_relaxed) + 1, std::memory_order_relaxed);
}

bool QVRealtimeRing::front(Message& message) noexcept {
  const std::size_t taken = taken_.load(std::memory_order_relaxed);
  if (taken == writtenSeen_) {
    writtenSeen_ = written_.load(std::memory_order_acquire);
    if (taken == writtenSeen_) return false;
  }
  const std::size_t at = taken & mask_;
  const Slot& slot = slots_[at];
  message = {{memory_.get() + at * slotBytes_, slot.bytes}, slot.category, slot.type};
  return true;
}

void QVRealtimeRing::pop() noexcept {
  taken_.store(taken_.load(std::memory_order_relaxed) + 1, std::memory_order_release);
}

QVDropCounts QVRealtimeRing::takeDrops() noexcept {
  QVDropCounts news;
  for (std::size_t i = 0; i < kQVDropReasonCount; ++i) {
    const uint64_t all = drops_[i].load(std::memory_order_relaxed);
    news.counts[i] = all - dropsTaken_.counts[i];
    dropsTaken_.counts[i] = all;
  }
  return news;
}
