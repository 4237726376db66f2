#pragma once

#include "platform/QVMemoryCharge.h"
#include "platform/linux/bus/QVBusCall.h"

#include <cstddef>
#include <cstdint>
#include <utility>

// The reply to a call that waits to be carried out, and the charge for the memory that the wait
// takes: work item, reply, arguments other than the charged dictionaries. So a peer that sends
// calls faster than they are carried out is held back as one that sends large messages is.
//
// Captured by reply callbacks; move-only. Threads: as QVBusReply.
class QVBusPendingReply {
 public:
  // About what one call takes while it waits on the server queue.
  static constexpr std::size_t kCallBytes = 256;

  explicit QVBusPendingReply(const QVBusCall& call, std::size_t argumentBytes = 0)
      : reply_(call.reply), charge_(call.charge), bytes_(kCallBytes + argumentBytes) {
    if (charge_ != nullptr) charge_->add(bytes_);
  }
  ~QVBusPendingReply() {
    if (charge_ != nullptr) charge_->remove(bytes_);
  }
  QVBusPendingReply(QVBusPendingReply&& other) noexcept
      : reply_(std::move(other.reply_)),
        charge_(std::exchange(other.charge_, nullptr)),
        bytes_(other.bytes_) {}
  QVBusPendingReply(const QVBusPendingReply&) = delete;
  QVBusPendingReply& operator=(const QVBusPendingReply&) = delete;
  QVBusPendingReply& operator=(QVBusPendingReply&&) = delete;

  const QVBusReply* operator->() const noexcept { return &reply_; }
  const QVBusReply& operator*() const noexcept { return reply_; }

 private:
  QVBusReply reply_;
  QVMemoryCharge* charge_;
  std::size_t bytes_;
};
