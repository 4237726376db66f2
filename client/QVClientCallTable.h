#pragma once

#include "client/QVClientCall.h"

#include <cstddef>
#include <cstdint>
#include <vector>

// The calls that wait for their answers, by serial.
//
// A ring of slots: serials count up, and a call lies in the slot that its serial's low bits name. A
// serial whose slot is still taken, by a start that is not answered for hours, is passed over. A
// second answer to the same call, or a late one to a call given up, finds another serial in the
// slot, or none. The ring doubles when it is half full, so that a free slot is near.
//
// Used by QVClientConnection. Threads: one at a time.
// Limits: as many calls as the constructor says.
class QVClientCallTable {
 public:
  explicit QVClientCallTable(std::size_t maximum) : maximum_(maximum) {}

  bool isFull() const noexcept { return count_ >= maximum_; }
  std::size_t count() const noexcept { return count_; }

  // Makes room for one more call, which alone may allocate. The table must not be full.
  void prepare();
  // Keeps a call and answers its serial; prepare() must have run.
  uint32_t insert(QVClientCall&& call) noexcept;
  // A serial for a call without an answer.
  uint32_t unansweredSerial() noexcept;

  // Hands a call out; false where there is none of that serial.
  [[nodiscard]] bool take(uint32_t serial, QVClientCall& call) noexcept;
  // Nobody waits for the answer any more: the slot is free, so that a service that never answers
  // fills no table. False where there is no such call.
  bool abandon(uint32_t serial) noexcept;
  // Hands all calls out, the oldest first.
  std::vector<QVClientCall> takeAll();

 private:
  struct Slot {
    uint32_t serial = 0;  // 0 where free
    QVClientCall call;
  };

  Slot& slotOf(uint32_t serial) noexcept { return slots_[serial & (slots_.size() - 1)]; }
  uint32_t nextSerial() noexcept;

  const std::size_t maximum_;
  std::vector<Slot> slots_;  // as many as a power of 2
  std::size_t count_ = 0;
  uint32_t lastSerial_ = 0;
};
