#include "client/QVRealtimeRing.h"

QVRealtimeRing::QVRealtimeRing(std::size_t slots, std::size_t slotBytes,
                               QVReporterSessionState* ofSession)
    : owner(ofSession),
      session(ofSession),
      mask_(slots - 1),
      slotBytes_(slotBytes),
      slots_(new Slot[slots]()),
      memory_(new char[slots * slotBytes]()) {}

std::span<char> QVRealtimeRing::nextSlot() noexcept {
  const uint64_t written = written_.load(std::memory_order_relaxed) & ~(kClosed | kRefusing);
  if (written - takenSeen_ > mask_) {
    takenSeen_ = taken_.load(std::memory_order_acquire);
    if (written - takenSeen_ > mask_) return {};
  }
  return {memory_.get() + (written & mask_) * slotBytes_, slotBytes_};
}

bool QVRealtimeRing::push(std::size_t bytes, uint32_t category, uint16_t type) noexcept {
  uint64_t written = written_.load(std::memory_order_relaxed);
  if ((written & (kClosed | kRefusing)) != 0) return false;
  slots_[written & mask_] = {bytes, category, type};
  // Nobody else changes it but for the bits: what comes at that moment may be refused.
  return written_.compare_exchange_strong(written, written + 1, std::memory_order_release,
                                          std::memory_order_relaxed);
}

bool QVRealtimeRing::front(Message& message) noexcept {
  const uint64_t taken = taken_.load(std::memory_order_relaxed);
  if (taken == writtenSeen_) {
    writtenSeen_ = written();
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

bool QVRealtimeRing::isOver() const noexcept {
  // In this order: what was pushed before it was abandoned is seen.
  return abandoned_.load(std::memory_order_acquire) && taken() == written();
}
