#pragma once

#include "platform/QVDate.h"

// Wall-clock time. Waits, delays and timers count on the steady clock of their own facility
// (QVWorkQueue, QVCondition) and are not moved by a change of this one.
//
// Threads: any, at once. Never fails, never blocks.
class QVClock {
 public:
  virtual ~QVClock() = default;
  virtual QVDate currentDate() const = 0;
  // How far local time is ahead of UTC at that moment.
  virtual std::chrono::seconds offsetFromUTC(QVDate date) const = 0;
};
