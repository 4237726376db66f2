#pragma once

#include "platform/QVClock.h"

#include <time.h>

// The machine's wall clock, and its time zone.
class QVSystemClock final : public QVClock {
 public:
  QVDate currentDate() const override { return QVDate::clock::now(); }
  std::chrono::seconds offsetFromUTC(QVDate date) const override {
    const ::time_t seconds = QVDate::clock::to_time_t(date);
    ::tm local{};
    if (::localtime_r(&seconds, &local) == nullptr) return std::chrono::seconds{0};
    return std::chrono::seconds{local.tm_gmtoff};
  }
};
