#include "client/QVRealtimeQueue.h"

#include "client/QVRealtimeRing.h"
#include "client/QVReporterCore.h"

#include <utility>

QVRealtimeQueue::QVRealtimeQueue(std::shared_ptr<QVReporterCore> core,
                                 std::shared_ptr<QVRealtimeRing> ring)
    : core_(std::move(core)), ring_(std::move(ring)), payload_(std::span<char>()) {}

QVRealtimeQueue::~QVRealtimeQueue() {
  ring_->abandon();
  // The reporter's thread lets go of the memory.
  core_->bell.ring();
}

QVClientPayload* QVRealtimeQueue::begin() noexcept {
  begun_ = false;
  if (ring_->isClosed()) return drop(QVDropReason::connectionLost);
  if (core_->isReportingOff()) return drop(QVDropReason::disabled);
  const std::span<char> slot = ring_->nextSlot();
  if (slot.empty()) return drop(QVDropReason::queueFull);
  payload_.use(slot);
  begun_ = true;
  return &payload_;
}

bool QVRealtimeQueue::commit(QVClientCategory category, QVClientMessageType type) noexcept {
  if (!std::exchange(begun_, false)) return false;
  QVDropReason reason = QVDropReason::invalid;
  if (payload_.ok()) {
    if (ring_->push(payload_.entries().size(), category.word, static_cast<uint16_t>(type))) {
      return true;
    }
    reason = QVDropReason::connectionLost;
  }
  drop(reason);
  return false;
}

bool QVRealtimeQueue::isClosed() const noexcept {
  return ring_->isClosed();
}

// Nobody is woken to tell of it, which would take a system call.
std::nullptr_t QVRealtimeQueue::drop(QVDropReason reason) noexcept {
  core_->ledger.countDropSilently(reason);
  return nullptr;
}
