#include "client/QVRealtimeQueue.h"

#include "client/QVRealtimeRing.h"
#include "client/QVReporterCore.h"

#include <string_view>
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
  detach();
  if (!ring_->takesIn()) return drop(QVDropReason::connectionLost);
  if (core_->isReportingOff()) return drop(QVDropReason::disabled);
  const std::span<char> slot = ring_->nextSlot();
  if (slot.empty()) return drop(QVDropReason::queueFull);
  payload_.use(slot);
  slot_ = slot.data();
  return &payload_;
}

bool QVRealtimeQueue::commit(QVClientCategory category, QVClientMessageType type) noexcept {
  if (slot_ == nullptr) return false;
  const std::string_view entries = payload_.entries();
  // Another payload may have been moved into it, whose entries lie elsewhere.
  const bool isInOrder = payload_.ok() && entries.data() == slot_;
  detach();
  if (!isInOrder) {
    drop(QVDropReason::invalid);
    return false;
  }
  if (ring_->push(entries.size(), category.word, static_cast<uint16_t>(type))) return true;
  drop(QVDropReason::connectionLost);
  return false;
}

// The slot is the reporter's thread's from now on, or the next payload's.
void QVRealtimeQueue::detach() noexcept {
  payload_.use({});
  slot_ = nullptr;
}

bool QVRealtimeQueue::isClosed() const noexcept {
  return ring_->isClosed();
}

// Nobody is woken to tell of it, which would take a system call.
std::nullptr_t QVRealtimeQueue::drop(QVDropReason reason) noexcept {
  core_->ledger.countDropSilently(reason);
  return nullptr;
}
