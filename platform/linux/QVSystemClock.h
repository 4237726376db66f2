#pragma once

#include "platform/QVClock.h"

// The machine's wall clock.
class QVSystemClock final : public QVClock {
 public:
  QVDate currentDate() const override { return QVDate::clock::now(); }
};
