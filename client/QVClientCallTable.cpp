#include "client/QVClientCallTable.h"

#include <algorithm>
#include <utility>

namespace {

// Enough for a program that waits for its answers.
constexpr std::size_t kFirstSlots = 64;

}  // namespace

void QVClientCallTable::prepare() {
  if (2 * (count_ + 1) <= slots_.size()) return;
  // Calls that differ in the low bits differ in more of them: nothing collides in a larger ring.
  std::vector<Slot> larger(std::max(kFirstSlots, 2 * slots_.size()));
  for (Slot& slot : slots_) {
    if (slot.serial != 0) larger[slot.serial & (larger.size() - 1)] = std::move(slot);
  }
  slots_ = std::move(larger);
}

uint32_t QVClientCallTable::nextSerial() noexcept {
  // 0 is no serial.
  if (++lastSerial_ == 0) ++lastSerial_;
  return lastSerial_;
}

uint32_t QVClientCallTable::unansweredSerial() noexcept {
  return nextSerial();
}

uint32_t QVClientCallTable::insert(QVClientCall&& call) noexcept {
  uint32_t serial = nextSerial();
  while (slotOf(serial).serial != 0) serial = nextSerial();
  slotOf(serial) = {serial, std::move(call)};
  ++count_;
  return serial;
}

bool QVClientCallTable::take(uint32_t serial, QVClientCall& call) noexcept {
  if (serial == 0 || slots_.empty() || slotOf(serial).serial != serial) return false;
  Slot& slot = slotOf(serial);
  call = std::exchange(slot.call, QVClientCall());
  slot.serial = 0;
  --count_;
  return true;
}

bool QVClientCallTable::abandon(uint32_t serial) noexcept {
  QVClientCall call;
  return take(serial, call);
}

std::vector<QVClientCall> QVClientCallTable::takeAll() {
  std::vector<Slot*> taken;
  taken.reserve(count_);
  for (Slot& slot : slots_) {
    if (slot.serial != 0) taken.push_back(&slot);
  }
  // By age: serials may have begun anew.
  const uint32_t last = lastSerial_;
  std::sort(taken.begin(), taken.end(), [last](const Slot* one, const Slot* other) {
    return last - one->serial > last - other->serial;
  });
  std::vector<QVClientCall> calls;
  calls.reserve(taken.size());
  for (Slot* slot : taken) calls.push_back(std::move(slot->call));
  slots_.clear();
  count_ = 0;
  return calls;
}
