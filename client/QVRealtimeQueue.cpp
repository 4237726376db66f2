#include "client/QVRealtimeQueue.h"

#include "client/QVRealtimeRing.h"
#include "client/QVReporterCore.h"

#include <utility>

QVRealtimeQueue::QVRealtimeQueue(std::shared_ptr<QVReporterCore> core,
                                 std::shared_ptr<QVRealtimeRing> ring)
    : core_(std::move(core)), ring_(std::move(ring)), payload_(std::span<char>()) {}

QVRealtimeQueue::~QVRealtimeQueue() {
  ring_->abandon();
}

QVClientPayload* QVRealtimeQueue::begin() noexcept {
  begun_ = false;
  if (core_->isReportingOff()) {
    ring_->countDrop(QVDropReason::disabled);
    return nullptr;
  }
  const std::span<char> slot = ring_->nextSlot();
  if (slot.empty()) {
    ring_->countDrop(QVDropReason::queueFull);
    return nullptr;
  }
  payload_.use(slot);
  begun_ = true;
  return &payload_;
}

bool QVRealtimeQueue::commit(QVClientCategory category, QVClientMessageType type) noexcept {
  if (!std::exchange(begun_, false)) return false;
  if (!payload_.ok()) {
    ring_->countDrop(QVDropReason::invalid);
    return false;
  }
  ring_->push(payload_.entries().size(), category.word, static_cast<uint16_t>(type));
  return true;
}
